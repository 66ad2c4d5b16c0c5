// SPDX-License-Identifier: Apache-2.0
#include "invite_code.h"

#include "shared/invites.h"
#include "target.h"

#include <ovrabase/encoding.h>

#include <arpa/inet.h>

#include <algorithm>
#include <optional>
#include <string_view>

namespace Ovradr {

namespace {

using Bytes = std::vector<unsigned char>;
using OvraApps::Invites;
using OvraDRNode::Conn;

constexpr std::string_view kAlphabet = "0123456789ABCDEFGHJKMNPQRSTVWXYZ";
constexpr std::size_t kGroup = 5;
constexpr unsigned kBitsOfDigit = 5;
constexpr unsigned char kVersion = 1; ///< in the upper half of the first byte
constexpr std::size_t kReferenceBytes = Invites::kReferenceLength / 2;
constexpr std::size_t kCheckBytes = 3;

// How an endpoint is written: its kind, then its port unless it is the usual one, then its address,
// a name with its length before it.
enum Kind : unsigned char { kIpv4 = 0, kIpv6 = 1, kName = 2, kAlias = 3, kWithPort = 0x80 };

/// CRC-24 (RFC 9580, 6.1): finds every mistake within three bytes, so one wrong character and two
/// that were swapped, and of others all but one in 16 million.
std::uint32_t crc24(const Bytes &bytes) {
    std::uint32_t crc = 0xB704CE;
    for (const unsigned char byte : bytes) {
        crc ^= std::uint32_t{byte} << 16;
        for (int bit = 0; bit < 8; ++bit) {
            crc <<= 1;
            crc = (crc & 0x1000000) != 0 ? crc ^ 0x1864CFB : crc;
        }
    }
    return crc;
}

void putNumber(Bytes &bytes, std::uint64_t number, std::size_t size) {
    for (std::size_t i = size; i > 0; --i) {
        bytes.push_back(static_cast<unsigned char>(number >> (8 * (i - 1))));
    }
}

void putEndpoint(Bytes &bytes, const Conn &conn) {
    unsigned char kind = conn.isFarlink() ? kAlias : kName;
    Bytes where(sizeof(in6_addr));
    if (!conn.isFarlink() && inet_pton(AF_INET, conn.addr.c_str(), where.data()) == 1) {
        kind = kIpv4;
        where.resize(sizeof(in_addr));
    } else if (!conn.isFarlink() && inet_pton(AF_INET6, conn.addr.c_str(), where.data()) == 1) {
        kind = kIpv6;
    } else {
        where.assign(1, static_cast<unsigned char>(conn.addr.size()));
        where.insert(where.end(), conn.addr.begin(), conn.addr.end());
    }
    const bool usual = conn.isFarlink() || conn.port == kDefaultHttpsPort;
    bytes.push_back(static_cast<unsigned char>(kind | (usual ? 0 : kWithPort)));
    if (!usual) {
        putNumber(bytes, static_cast<std::uint64_t>(conn.port), 2);
    }
    bytes.insert(bytes.end(), where.begin(), where.end());
}

/// Takes what was put, in the same order; once there is too little it has failed.
class CodeReader {
public:
    explicit CodeReader(const Bytes &bytes)
        : bytes_(bytes) {}

    Bytes take(std::size_t size) {
        failed_ = failed_ || size > bytes_.size() - at_;
        if (failed_) {
            return Bytes(size);
        }
        at_ += size;
        const auto end = bytes_.begin() + static_cast<std::ptrdiff_t>(at_);
        return {end - static_cast<std::ptrdiff_t>(size), end};
    }
    std::uint64_t number(std::size_t size) {
        std::uint64_t number = 0;
        for (const unsigned char byte : take(size)) {
            number = number << 8 | byte;
        }
        return number;
    }
    std::string text(std::size_t size) {
        const Bytes bytes = take(size);
        return {bytes.begin(), bytes.end()};
    }
    Conn endpoint() {
        const auto head = static_cast<unsigned char>(number(1));
        const int port = (head & kWithPort) != 0 ? static_cast<int>(number(2)) : kDefaultHttpsPort;
        switch (head & ~unsigned{kWithPort}) {
        case kIpv4:
            return Conn::https(numeric(AF_INET, sizeof(in_addr)), port);
        case kIpv6:
            return Conn::https(numeric(AF_INET6, sizeof(in6_addr)), port);
        case kName:
            return Conn::https(text(number(1)), port);
        case kAlias:
            return Conn::farlink(text(number(1)));
        default:
            failed_ = true;
            return {};
        }
    }
    bool isAtEnd() const { return !failed_ && at_ == bytes_.size(); }

private:
    std::string numeric(int family, std::size_t size) {
        std::array<char, INET6_ADDRSTRLEN> text{};
        inet_ntop(family, take(size).data(), text.data(), text.size());
        return text.data();
    }

    const Bytes &bytes_;
    std::size_t at_ = 0;
    bool failed_ = false;
};

std::optional<Bytes> fromBase32(const std::string &text) {
    Bytes bytes;
    unsigned buffer = 0;
    unsigned bits = 0;
    for (const char given : text) {
        char c = given >= 'a' && given <= 'z' ? static_cast<char>(given - 'a' + 'A') : given;
        if (c == '-' || c == ' ' || c == '\t' || c == '\r' || c == '\n') {
            continue;
        }
        c = c == 'O' ? '0' : c;
        c = c == 'I' || c == 'L' ? '1' : c;
        const std::size_t digit = kAlphabet.find(c);
        if (digit == std::string_view::npos) {
            return std::nullopt;
        }
        buffer = buffer << kBitsOfDigit | static_cast<unsigned>(digit);
        bits += kBitsOfDigit;
        if (bits >= 8) {
            bits -= 8;
            bytes.push_back(static_cast<unsigned char>(buffer >> bits));
            buffer &= (1U << bits) - 1;
        }
    }
    return buffer == 0 && bits < kBitsOfDigit ? std::optional(bytes) : std::nullopt;
}

Refusal unreadable(const std::string &why) {
    return failure(ExitCode::kUsage, "That is no code of an invitation: " + why + ".",
                   "Compare it with what `ovradr invite` shows; another appliance's URL begins "
                   "with https://.");
}

} // namespace

std::array<unsigned char, InviteCode::kKeyBytes> keyOf(const std::string &fingerprint) {
    std::array<unsigned char, InviteCode::kKeyBytes> key{};
    if (OvraBase::isFingerprint(fingerprint)) {
        std::string text = fingerprint.substr(fingerprint.find(':') + 1);
        std::replace(text.begin(), text.end(), '+', '-');
        std::replace(text.begin(), text.end(), '/', '_');
        const auto bytes = OvraBase::fromBase64Url(text);
        if (bytes && bytes->size() >= key.size()) {
            std::copy_n(bytes->begin(), key.size(), key.begin());
        }
    }
    return key;
}

bool InviteCode::isOf(const std::string &fingerprint) const {
    return OvraBase::isFingerprint(fingerprint) && keyOf(fingerprint) == key;
}

std::string writeInviteCode(const InviteCode &code) {
    Bytes bytes;
    bytes.push_back(static_cast<unsigned char>(kVersion << 4 | code.endpoints.size()));
    putNumber(bytes, static_cast<std::uint64_t>(code.expires), 4);
    putNumber(bytes, std::stoul(code.reference, nullptr, 16), kReferenceBytes);
    const Bytes secret = OvraBase::fromBase64Url(code.secret.get()).value_or(Bytes());
    bytes.insert(bytes.end(), secret.begin(), secret.end());
    bytes.insert(bytes.end(), code.key.begin(), code.key.end());
    for (const Conn &conn : code.endpoints) {
        putEndpoint(bytes, conn);
    }
    putNumber(bytes, crc24(bytes), kCheckBytes);

    std::string text;
    std::size_t digits = 0;
    unsigned buffer = 0;
    unsigned bits = 0;
    const auto put = [&](unsigned digit) {
        text += digits > 0 && digits % kGroup == 0 ? "-" : "";
        text += kAlphabet[digit];
        ++digits;
    };
    for (const unsigned char byte : bytes) {
        buffer = buffer << 8 | byte;
        bits += 8;
        while (bits >= kBitsOfDigit) {
            bits -= kBitsOfDigit;
            put(buffer >> bits);
            buffer &= (1U << bits) - 1;
        }
    }
    if (bits > 0) {
        put(buffer << (kBitsOfDigit - bits));
    }
    return text;
}

Expected<InviteCode> readInviteCode(const std::string &text) {
    std::optional<Bytes> bytes = fromBase32(text);
    if (!bytes) {
        return unreadable("it has a character that is in none, or lacks some");
    }
    if (bytes->size() <= kCheckBytes) {
        return unreadable("it is too short");
    }
    // With its check behind them the remainder of the division is 0.
    if (crc24(*bytes) != 0) {
        return unreadable("it is mistyped or not complete");
    }
    bytes->resize(bytes->size() - kCheckBytes);
    CodeReader in(*bytes);
    const std::uint64_t head = in.number(1);
    if (head >> 4 != kVersion) {
        return failure(ExitCode::kUsage, "The code is of a newer version.",
                       "Update this appliance, or pair by URL.");
    }
    InviteCode code;
    code.expires = static_cast<std::int64_t>(in.number(4));
    for (const unsigned char byte : in.take(kReferenceBytes)) {
        constexpr std::string_view kHex = "0123456789abcdef";
        code.reference += {kHex[byte >> 4], kHex[byte & 15]};
    }
    const Bytes secret = in.take(Invites::kSecretBytes);
    std::string secretText = OvraBase::toBase64Url(secret.data(), secret.size());
    code.secret = OvraBase::Secret::take(secretText);
    const Bytes key = in.take(InviteCode::kKeyBytes);
    std::copy(key.begin(), key.end(), code.key.begin());
    for (std::uint64_t left = head & 15; left > 0; --left) {
        code.endpoints.push_back(in.endpoint());
    }
    const bool usable =
        !code.endpoints.empty() && std::all_of(code.endpoints.begin(), code.endpoints.end(),
                                               [](const Conn &conn) { return conn.isValid(); });
    return in.isAtEnd() && usable ? Expected<InviteCode>(std::move(code))
                                  : unreadable("what it says makes no sense");
}

} // namespace Ovradr
