// SPDX-License-Identifier: Apache-2.0
#pragma once

/// Marks what the daemon and the command line use of libovradrplatform.so beside the platform
/// interfaces themselves.
#define OVRAPLATFORM_EXPORT __attribute__((visibility("default")))
