// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/json.h"

#include <json/reader.h>
#include <json/writer.h>

#include <array>
#include <memory>
#include <string_view>

namespace OvraDRCore {

namespace {

constexpr int kMaxDepth = 200;
constexpr const char *kMask = "***";

/// Members whose values are login material, at any depth.
constexpr std::array<std::string_view, 13> kSecretMembers = {
    "password", "passwd",       "otpcode", "otp_code",     "session",   "_sid",   "sid",
    "token",    "access_token", "sealed",  "sealed_reply", "reply_key", "secret",
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

const Json::StreamWriter::Factory &writerFactory() {
    static const Json::StreamWriterBuilder builder = [] {
        Json::StreamWriterBuilder made;
        made["indentation"] = "";
        made["commentStyle"] = "None";
        return made;
    }();
    return builder;
}

const Json::CharReaderBuilder &readerFactory() {
    static const Json::CharReaderBuilder builder = [] {
        Json::CharReaderBuilder made;
        made["allowComments"] = false;
        made["allowTrailingCommas"] = false;
        made["collectComments"] = false;
        made["failIfExtra"] = true;
        made["rejectDupKeys"] = true;
        made["stackLimit"] = kMaxDepth;
        return made;
    }();
    return builder;
}

} // namespace

std::string toString(const Json::Value &value) {
    // The boolean caches write and read these literals on every request.
    if (value.isBool()) {
        return value.asBool() ? "true" : "false";
    }
    return Json::writeString(writerFactory(), value);
}

Json::Value maskSecrets(const Json::Value &value) {
    Json::Value masked = value;
    mask(masked, false);
    return masked;
}

std::string toLogString(const Json::Value &value) {
    return toString(maskSecrets(value));
}

bool fromString(Json::Value &value, const std::string &text) {
    if (text == "true" || text == "false") {
        value = text == "true";
        return true;
    }
    // The reader treats a NUL as the end and would ignore what follows.
    if (text.find('\0') != std::string::npos) {
        return false;
    }
    try {
        const std::unique_ptr<Json::CharReader> reader(readerFactory().newCharReader());
        Json::Value parsed;
        std::string errors;
        if (!reader->parse(text.data(), text.data() + text.size(), &parsed, &errors)) {
            return false;
        }
        value = std::move(parsed);
        return true;
    } catch (const std::exception &) { // too deep, or out of memory
        return false;
    }
}

std::string memberString(const Json::Value &value, const char *key) {
    if (!value.isObject() || !value.isMember(key) || !value[key].isString()) {
        return {};
    }
    return value[key].asString();
}

} // namespace OvraDRCore
