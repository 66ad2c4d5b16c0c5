// SPDX-License-Identifier: Apache-2.0
#pragma once

/// Names used by more than one family of calls.
namespace Ovradrd {

inline constexpr char kNodeApi[] = "OVRA.DR.Node";
inline constexpr char kCredentialApi[] = "OVRA.DR.Node.Credential";
inline constexpr char kRelay[] = "relay";

} // namespace Ovradrd
