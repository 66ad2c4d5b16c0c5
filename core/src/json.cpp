// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/json.h"

#include "json_reader.h"
#include "json_writer.h"

#include <array>
#include <exception>
#include <string_view>
#include <utility>

namespace OvraDRCore {

namespace {

constexpr const char *kMask = "***";

/// Members whose values are login material, at any depth.
constexpr std::array<std::string_view, 14> kSecretMembers = {
    "password", "passwd",       "otpcode", "otp_code",     "session",   "_sid",   "sid",
    "token",    "access_token", "sealed",  "sealed_reply", "reply_key", "secret", "device_token",
};

bool isSecret(std::string_view name) {
    for (std::string_view secret : kSecretMembers) {
        if (name == secret) {
            return true;
        }
    }
    return false;
}

/// \param secret  whether the value is under a secret name, alone or in an array; an object there
///                is not login material itself, but may hold some
void mask(Json::Value &value, bool secret) {
    if (value.isArray()) {
        for (Json::Value &item : value) {
            mask(item, secret);
        }
    } else if (value.isObject()) {
        for (const std::string &name : value.getMemberNames()) {
            mask(value[name], isSecret(name));
        }
    } else if (secret && !value.isNull()) {
        value = kMask;
    }
}

} // namespace

std::string toString(const Json::Value &value) {
    std::string text;
    writeJson(value, text);
    return text;
}

Json::Value maskSecrets(const Json::Value &value) {
    Json::Value masked = value;
    mask(masked, false);
    return masked;
}

std::string toLogString(const Json::Value &value) {
    return toString(maskSecrets(value));
}

JsonFault parseJson(Json::Value &value, std::string_view text, const JsonLimits &limits,
                    JsonLimits *left) {
    try {
        Json::Value parsed;
        JsonLimits rest = limits;
        const JsonFault fault = readJson(text, rest, parsed);
        if (fault == JsonFault::kNone) {
            value = std::move(parsed);
        }
        if (left != nullptr) {
            *left = rest;
        }
        return fault;
    } catch (const std::exception &) { // out of memory
        return JsonFault::kTooMuchMemory;
    }
}

const char *describe(JsonFault fault) {
    switch (fault) {
    case JsonFault::kTooDeep:
        return "nests arrays and objects too deeply";
    case JsonFault::kTooManyValues:
        return "holds too many values";
    case JsonFault::kTooMuchMemory:
        return "would take too much memory";
    default:
        return "is not JSON text";
    }
}

bool fromString(Json::Value &value, const std::string &text) {
    return parseJson(value, text) == JsonFault::kNone;
}

std::string memberString(const Json::Value &value, const char *key) {
    if (!value.isObject() || !value.isMember(key) || !value[key].isString()) {
        return {};
    }
    return value[key].asString();
}

} // namespace OvraDRCore
