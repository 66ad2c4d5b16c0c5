// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/request.h"

#include "ovradrcore/json.h"
#include "ovradrcore/log.h"

namespace OvraDRCore {

namespace {

constexpr const char *kApi = "api";
constexpr const char *kMethod = "method";
constexpr const char *kVersion = "version";
constexpr const char *kParams = "params";
constexpr const char *kEncrypt = "encrypt";

Json::Value objectOrAsIs(const Json::Value &params) {
    return params.isNull() ? Json::Value(Json::objectValue) : params;
}

/// The platform's interfaces take names as C strings.
bool isName(const std::string &text) {
    return !text.empty() && text.find('\0') == std::string::npos;
}

bool isTimeout(long seconds) {
    return seconds >= 1 && seconds <= Request::kMaxResponseTimeout;
}

} // namespace

Request::Request(const Json::Value &json) {
    if (!json.isObject() || !json[kVersion].isInt()) {
        return;
    }
    const Json::Value &encrypt = json[kEncrypt];
    if (!encrypt.isNull() && !encrypt.isBool()) {
        return;
    }
    api_ = memberString(json, kApi);
    method_ = memberString(json, kMethod);
    version_ = json[kVersion].asInt();
    params_ = objectOrAsIs(json[kParams]);
    encryptRequired_ = encrypt.isBool() && encrypt.asBool();
}

Request::Request(const std::string &api, int version, const std::string &method,
                 const Json::Value &params)
    : api_(api)
    , method_(method)
    , version_(version)
    , params_(objectOrAsIs(params)) {}

Request::~Request() = default;

void Request::addParam(const std::string &key, const Json::Value &value) {
    if (params_.isObject()) {
        params_[key] = value;
    }
}

void Request::addParam(const Json::Value &object) {
    if (!object.isObject()) {
        return;
    }
    for (const std::string &key : object.getMemberNames()) {
        addParam(key, object[key]);
    }
}

void Request::setResponseTimeout(long seconds) {
    responseTimeout_ = seconds;
    if (!isTimeout(seconds)) {
        OVRA_ERR("A response time-out of [%ld] seconds is not possible: set 1 to %ld", seconds,
                 kMaxResponseTimeout);
    }
}

void Request::setUpload(const std::string &path, const std::string &name) {
    uploadPath_ = path;
    uploadName_ = name;
}

bool Request::isValid() const {
    return isName(api_) && isName(method_) && version_ > 0 && params_.isObject() &&
           isTimeout(responseTimeout_);
}

Json::Value Request::toJson() const {
    Json::Value json(Json::objectValue);
    json[kApi] = api_;
    json[kMethod] = method_;
    json[kVersion] = version_;
    json[kParams] = params_;
    if (encryptRequired_) {
        json[kEncrypt] = true;
    }
    return json;
}

std::string Request::toStr() const {
    return toString(toJson());
}

} // namespace OvraDRCore
