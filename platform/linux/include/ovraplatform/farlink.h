// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/cred_errors.h"
#include "ovraplatform/export.h"
#include "ovraplatform/farlink_key.h"

#include <ovradrcore/response.h>

#include <chrono>
#include <string>

// The appliance's side of the relay service; docs/wire.md describes the calls.
namespace OvraPlatform {

inline constexpr char kFarlinkApi[] = "OVRA.Farlink";
inline constexpr int kFarlinkPort = 5443;
/// How long the relay service holds back a poll for callers while there are none.
inline constexpr std::chrono::seconds kFarlinkHold{20};

/// Whether the text can be an alias: 3 to 63 lower-case letters, digits and inner hyphens, like a
/// host name label (RFC 1123, 2.1).
OVRAPLATFORM_EXPORT bool isFarlinkAlias(const std::string &text);

/// The relay service that the appliance uses, and its name there.
struct FarlinkSettings {
    std::string host; ///< "": none
    int port = kFarlinkPort;
    std::string alias; ///< "": only looks others up, is not reachable itself

    bool operator==(const FarlinkSettings &other) const {
        return host == other.host && port == other.port && alias == other.alias;
    }
};

/// The lines host="...", port="..." and alias="..." of kFarlinkFile. A missing file means no relay
/// service.
/// \return the reason if the file cannot be used.
[[nodiscard]] OVRAPLATFORM_EXPORT tl::expected<FarlinkSettings, std::string> readFarlinkSettings();
/// \return false if the file cannot be written.
[[nodiscard]] OVRAPLATFORM_EXPORT bool writeFarlinkSettings(const FarlinkSettings &settings);

/// Why a call to the relay service failed.
struct FarlinkFailure {
    std::string text;                   ///< what went wrong and what to do, for people
    CredError error = CredError::kNone; ///< why no answer came
    int code = 0; ///< otherwise the web-API code with which the service refused
};

/// A successful answer, or why there is none.
using FarlinkReply = tl::expected<OvraDRCore::Response, FarlinkFailure>;

/// Where to connect to for an alias now, over HTTPS; whom to trust there is known by the alias.
struct AliasPlace {
    std::string host;
    int port = 0;
};

/// The calls of an appliance to its relay service, whose key a person has trusted.
class OVRAPLATFORM_EXPORT FarlinkClient {
public:
    explicit FarlinkClient(FarlinkSettings settings)
        : settings_(std::move(settings)) {}

    /// Where the alias is reached now.
    /// \param time  how long it may take, but 10 seconds at most
    [[nodiscard]] tl::expected<AliasPlace, FarlinkFailure>
    lookUp(const std::string &alias,
           std::chrono::milliseconds time = std::chrono::seconds(10)) const;
    /// Proves that this appliance holds the key of its alias, or claims a free alias: "port",
    /// "tunnel_port", "token" and "expires".
    [[nodiscard]] FarlinkReply enrol(const FarlinkKey &key) const;
    /// Waits for callers of the alias: "callers", possibly empty. Error 119: enrol again.
    [[nodiscard]] FarlinkReply wait(const std::string &token) const;
    /// Gives the alias up.
    [[nodiscard]] FarlinkReply release(const std::string &token) const;

private:
    FarlinkReply call(const char *method, const Json::Value &params,
                      std::chrono::milliseconds time) const;

    FarlinkSettings settings_;
};

} // namespace OvraPlatform
