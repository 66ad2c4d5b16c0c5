// SPDX-License-Identifier: Apache-2.0
#pragma once

namespace Ovradrd {

/// The project's version, set by the build.
inline constexpr char kVersion[] = OVRADRD_VERSION;

} // namespace Ovradrd
