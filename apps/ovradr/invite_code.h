// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"

#include <ovrabase/secret.h>
#include <ovradrnode/conn.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace Ovradr {

/// What the code of an invitation says: where the appliance is reached, by which key it is known,
/// and the grant. docs/ovradr.md describes the code.
struct InviteCode {
    static constexpr std::size_t kKeyBytes = 16;
    static constexpr std::size_t kMaxEndpoints = 8;

    std::vector<OvraDRNode::Conn> endpoints; ///< https or flk, 1 to kMaxEndpoints
    /// The beginning of the SHA-256 of the key. Nobody finds another key with these 128 bits.
    std::array<unsigned char, kKeyBytes> key{};
    std::string reference; ///< of the invitation, 8 hexadecimal digits
    OvraBase::Secret secret;
    std::int64_t expires = 0; ///< seconds since 1970

    /// \param fingerprint  as OvraBase::fingerprintOf() gives it
    bool isOf(const std::string &fingerprint) const;
};

/// The first bytes of a fingerprint; zeros if it is none.
std::array<unsigned char, InviteCode::kKeyBytes> keyOf(const std::string &fingerprint);

/// Groups of five characters of Crockford's base32: no I, L, O or U, so that it can be read aloud
/// and typed.
std::string writeInviteCode(const InviteCode &code);

/// Upper or lower case, with or without hyphens and blanks; O counts as 0, I and L as 1.
/// \return what is wrong with it, which never repeats it.
[[nodiscard]] Expected<InviteCode> readInviteCode(const std::string &text);

} // namespace Ovradr
