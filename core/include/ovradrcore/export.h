// SPDX-License-Identifier: Apache-2.0
#pragma once

/// Marks what libovradrcore.so exports; everything else is hidden.
#define OVRADRCORE_EXPORT __attribute__((visibility("default")))
