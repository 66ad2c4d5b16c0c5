// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/response.h"

#include "ovradrcore/err_recorder.h"
#include "ovradrcore/json.h"

namespace OvraDRCore {

void Response::setResp(const Json::Value &reply) {
    *this = Response();
    if (!reply.isObject() || !reply["success"].isBool()) {
        return;
    }
    if (reply["success"].asBool()) {
        const Json::Value &data = reply["data"];
        if (!data.isNull() && !data.isObject()) {
            return;
        }
        valid_ = true;
        success_ = true;
        errCode_ = ERR::kNone;
        data_ = data.isNull() ? Json::Value(Json::objectValue) : data;
        return;
    }
    const Json::Value &error = reply["error"];
    if (!error.isObject() || !error["code"].isInt() || error["code"].asInt() == ERR::kNone) {
        return;
    }
    valid_ = true;
    errCode_ = error["code"].asInt();
    errMsg_ = error["msg"];
}

void Response::setResp(const std::string &text) {
    Json::Value reply;
    fromString(reply, text);
    setResp(reply);
}

bool Response::hasDataField(const char *key) const {
    return data_.isObject() && data_.isMember(key);
}

Json::Value Response::getDataField(const char *key) const {
    return hasDataField(key) ? data_[key] : Json::Value();
}

std::string Response::getDataFieldtoStr(const char *key) const {
    const Json::Value field = getDataField(key);
    if (field.isNull() || field.isObject() || field.isArray()) {
        return {};
    }
    return field.isString() ? field.asString() : toString(field);
}

Json::Value Response::toJson() const {
    if (!valid_) {
        return {};
    }
    Json::Value reply(Json::objectValue);
    reply["success"] = success_;
    if (success_) {
        reply["data"] = data_;
        return reply;
    }
    reply["error"]["code"] = errCode_;
    if (!errMsg_.isNull()) {
        reply["error"]["msg"] = errMsg_;
    }
    return reply;
}

} // namespace OvraDRCore
