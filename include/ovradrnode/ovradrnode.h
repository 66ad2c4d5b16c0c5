// SPDX-License-Identifier: Apache-2.0
#pragma once

/// All public headers of the library.
///
/// An object is for one thread at a time; different threads use different objects. A process may
/// fork at any time, with other threads at work, and the child may use the whole library, but none
/// of the objects that its parent had made (ovradrcore/no_fork.h).

#include "ovradrnode/conn.h"
#include "ovradrnode/cred_permission_cache.h"
#include "ovradrnode/cred_reverse_create.h"
#include "ovradrnode/cred_utils.h"
#include "ovradrnode/dr_node.h"
#include "ovradrnode/dr_node_attr.h"
#include "ovradrnode/node.h"
#include "ovradrnode/node_api.h"
#include "ovradrnode/node_cache.h"
#include "ovradrnode/node_candidates.h"
#include "ovradrnode/node_create.h"
#include "ovradrnode/node_db.h"
#include "ovradrnode/node_delete.h"
#include "ovradrnode/node_session.h"
#include "ovradrnode/node_set.h"
#include "ovradrnode/operation_dispatcher.h"
#include "ovradrnode/sender.h"
