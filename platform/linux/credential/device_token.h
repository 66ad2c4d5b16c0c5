// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "http/endpoint.h"

#include <ovrabase/secret.h>

#include <string>

namespace OvraPlatform {

/// What this machine shows at every log-in, so that the other end knows it again: other callers'
/// wrong guesses do not keep it out. 43 characters, the same ones for the same endpoint and
/// account; no other endpoint can use them. It opens nothing by itself.
///
/// It is made from a key that is created on first use. Empty if there is none: the state folder is
/// missing, or the file cannot be used, which the log says. Wipes its copies.
OvraBase::Secret deviceToken(const Endpoint &endpoint, const std::string &account);

} // namespace OvraPlatform
