// SPDX-License-Identifier: Apache-2.0
#pragma once

/// Marks what libovradrnode.so exports; everything else is hidden.
#define OVRADRNODE_EXPORT __attribute__((visibility("default")))
