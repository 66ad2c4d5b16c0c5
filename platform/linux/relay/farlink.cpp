// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/farlink.h"

#include "http/web_call.h"
#include "ovracore/ovracore.h"
#include "ovracredential/cred_request.h"
#include "relay/alias_place.h"

#include <ovrabase/address.h>
#include <ovrabase/number.h>
#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

#include <algorithm>
#include <array>
#include <exception>

namespace OvraPlatform {

namespace {

constexpr std::size_t kMinAlias = 3;
constexpr std::size_t kMaxAlias = 63;
constexpr std::chrono::seconds kAnswerTime{10};
constexpr const char *kNoRelay = "no relay service is set up on this appliance; run ovradr farlink "
                                 "enable, or use a direct endpoint";

/// "" if the file has no such line.
std::string setting(const char *key) {
    std::array<char, 300> value{};
    const int length =
        OLIBCFileGetKeyValue(kFarlinkFile, key, value.data(), static_cast<int>(value.size()), 0);
    return length > 0 ? std::string(value.data(), static_cast<std::size_t>(length)) : std::string();
}

/// Whether it is reached directly.
bool isServer(const FarlinkSettings &settings) {
    const auto endpoint = Endpoint::make("https", settings.host, settings.port);
    return endpoint && endpoint->alias().empty();
}

tl::unexpected<FarlinkFailure> noAnswer(CredError error) {
    return tl::unexpected(FarlinkFailure{credErrorText(static_cast<int>(error)), error, 0});
}

/// An answer that is no success is why there is none.
FarlinkReply verdictOn(WebReply reply) {
    if (reply.response.isSuccess()) {
        return std::move(reply.response);
    }
    const int code = reply.response.getErrCode();
    const Json::Value message = reply.response.getErrMsg();
    const std::string text =
        message.isString() ? message.asString() : OvraDRCore::memberString(message, "text");
    return tl::unexpected(FarlinkFailure{text.empty() ? "error " + std::to_string(code) : text,
                                         CredError::kNone, code});
}

/// What the answer to a look-up says; never another alias.
tl::expected<AliasPlace, FarlinkFailure> placeIn(const OvraDRCore::Response &reply,
                                                 const FarlinkSettings &settings) {
    const Json::Value port = reply.getDataField("port");
    const std::string host = reply.getDataFieldtoStr("host");
    const AliasPlace place{host.empty() ? settings.host : host, port.isInt() ? port.asInt() : 0};
    const auto endpoint = Endpoint::make("https", place.host, place.port);
    if (!endpoint || !endpoint->alias().empty()) {
        return tl::unexpected(FarlinkFailure{"the answer of the relay service names no place where "
                                             "the alias is reached: update the service",
                                             CredError::kNone, 0});
    }
    return place;
}

} // namespace

bool isFarlinkAlias(const std::string &text) {
    return text.size() >= kMinAlias && text.size() <= kMaxAlias && text.front() != '-' &&
           text.back() != '-' && std::all_of(text.begin(), text.end(), [](char c) {
               return (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '-';
           });
}

tl::expected<FarlinkSettings, std::string> readFarlinkSettings() {
    FarlinkSettings settings;
    settings.host = setting(FarlinkSetting::kHost);
    settings.alias = setting(FarlinkSetting::kAlias);
    const std::string port = setting(FarlinkSetting::kPort);
    settings.port = port.empty() ? kFarlinkPort : OvraBase::parsePort(port).value_or(0);
    const bool usable = settings.port != 0 && (settings.host.empty() || isServer(settings)) &&
                        (settings.alias.empty() || isFarlinkAlias(settings.alias));
    if (!usable) {
        return tl::unexpected(
            std::string(kFarlinkFile) +
            " names no relay service that could be used: run ovradr farlink enable");
    }
    return settings;
}

bool writeFarlinkSettings(const FarlinkSettings &settings) {
    const auto put = [](const char *key, const std::string &value) {
        return OLIBCFileSetKeyValue(kFarlinkFile, key, value.c_str(), "%s=\"%s\"\n") >= 0;
    };
    // The alias is removed first and written last: a half-written file never offers this appliance
    // at another service.
    return put(FarlinkSetting::kAlias, "") && put(FarlinkSetting::kHost, settings.host) &&
           put(FarlinkSetting::kPort, std::to_string(settings.port)) &&
           (settings.alias.empty() || put(FarlinkSetting::kAlias, settings.alias));
}

FarlinkReply FarlinkClient::call(const char *method, const Json::Value &params,
                                 std::chrono::milliseconds time) const {
    const auto endpoint = Endpoint::make("https", settings_.host, settings_.port);
    if (!endpoint) {
        return noAnswer(CredError::kBadArgument);
    }
    WireCall wire;
    wire.api = kFarlinkApi;
    wire.version = 1;
    wire.method = method;
    wire.params = params;
    auto reply = callWebAPI(*endpoint, wire, {std::chrono::steady_clock::now() + time});
    return reply ? verdictOn(std::move(*reply)) : noAnswer(reply.error());
}

tl::expected<AliasPlace, FarlinkFailure>
FarlinkClient::lookUp(const std::string &alias, std::chrono::milliseconds time) const {
    Json::Value params(Json::objectValue);
    params["alias"] = OvraBase::toLower(alias);
    return call("lookup", params, std::min<std::chrono::milliseconds>(time, kAnswerTime))
        .and_then([this](const OvraDRCore::Response &reply) { return placeIn(reply, settings_); });
}

FarlinkReply FarlinkClient::enrol(const FarlinkKey &key) const {
    Json::Value params(Json::objectValue);
    params["alias"] = settings_.alias;
    params["key"] = key.publicText();
    return call("challenge", params, kAnswerTime).and_then([&](const OvraDRCore::Response &asked) {
        const std::string challenge = asked.getDataFieldtoStr("challenge");
        params["challenge"] = challenge;
        params["signature"] = key.sign(settings_.alias, challenge);
        return call("enrol", params, kAnswerTime);
    });
}

FarlinkReply FarlinkClient::wait(const std::string &token) const {
    Json::Value params(Json::objectValue);
    params["alias"] = settings_.alias;
    params["token"] = token;
    return call("wait", params, kFarlinkHold + kAnswerTime);
}

FarlinkReply FarlinkClient::release(const std::string &token) const {
    Json::Value params(Json::objectValue);
    params["alias"] = settings_.alias;
    params["token"] = token;
    return call("release", params, kAnswerTime);
}

CredExpected<Endpoint> findAlias(const std::string &alias, OvraBase::Deadline deadline) {
    const auto settings = readFarlinkSettings();
    if (!settings || settings->host.empty()) {
        OVRA_NOTICE("[%s] cannot be looked up: %s", alias.c_str(),
                    settings ? kNoRelay : settings.error().c_str());
        return tl::unexpected(CredError::kCannotConnect);
    }
    const auto time =
        std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
    const auto place = FarlinkClient(*settings).lookUp(alias, time);
    if (place) {
        return *Endpoint::make("https", place->host, place->port);
    }
    OVRA_NOTICE("The relay service [%s] does not tell where [%s] is reached: [%s]",
                settings->host.c_str(), alias.c_str(), place.error().text.c_str());
    const CredError error = withoutRequest(place.error().error);
    const bool told = error == CredError::kTimedOut || error == CredError::kOutOfMemory;
    return tl::unexpected(told ? error : CredError::kCannotConnect);
}

} // namespace OvraPlatform

namespace OVRA {

int CredRequestFarlink::GetConnInfo(const std::string &alias, Json::Value &info, const void *) {
    info = Json::Value();
    try {
        const auto endpoint = OvraPlatform::Endpoint::of("flk", alias, 0);
        const auto settings = OvraPlatform::readFarlinkSettings();
        if (!endpoint || !settings || settings->host.empty()) {
            OVRA_NOTICE("[%s] cannot be reached: %s", alias.c_str(),
                        !endpoint  ? "it is no alias"
                        : settings ? OvraPlatform::kNoRelay
                                   : settings.error().c_str());
            return 0;
        }
        info["host"] = endpoint->host();
        info["protocol"] = "https";
        info["port"] = endpoint->port();
        return 1;
    } catch (const std::exception &error) {
        OVRA_ERR("[%s] cannot be reached: [%s]", alias.c_str(), error.what());
        info = Json::Value();
        return 0;
    }
}

} // namespace OVRA
