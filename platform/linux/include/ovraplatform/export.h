// SPDX-License-Identifier: Apache-2.0
#pragma once

/// Marks what the daemon and the command line use from libovradrplatform.so besides the platform
/// interfaces.
#define OVRAPLATFORM_EXPORT __attribute__((visibility("default")))
