// SPDX-License-Identifier: Apache-2.0
#pragma once

namespace Ovradrd {

/// Of the whole project; the build says it.
inline constexpr char kVersion[] = OVRADRD_VERSION;

} // namespace Ovradrd
