// SPDX-License-Identifier: Apache-2.0
#include "ovradrcore/response.h"

#include "ovradrcore/err_recorder.h"
#include "ovradrcore/json.h"

#include <utility>

namespace OvraDRCore {

namespace {

thread_local ReplyHandOver *innermost = nullptr;

} // namespace

void Response::setResp(const Json::Value &reply) {
    setResp(Json::Value(reply));
}

void Response::setResp(Json::Value &&reply) {
    *this = Response();
    const Json::Value &document = reply; // a non-const operator[] would add a missing member
    if (!document.isObject() || !document["success"].isBool()) {
        return;
    }
    if (document["success"].asBool()) {
        const Json::Value &data = document["data"];
        if (!data.isNull() && !data.isObject()) {
            return;
        }
        valid_ = true;
        success_ = true;
        errCode_ = ERR::kNone;
        data_ = data.isNull() ? Json::Value(Json::objectValue) : std::move(reply["data"]);
        return;
    }
    const Json::Value &error = document["error"];
    if (!error.isObject() || !error["code"].isInt() || error["code"].asInt() == ERR::kNone) {
        return;
    }
    valid_ = true;
    errCode_ = error["code"].asInt();
    errMsg_ = error["msg"];
}

void Response::setResp(const std::string &text) {
    if (ReplyHandOver::take(text, *this)) {
        return;
    }
    Json::Value reply;
    if (fromString(reply, text)) {
        setResp(std::move(reply));
    } else {
        *this = Response();
    }
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

ReplyHandOver::ReplyHandOver()
    : outer_(std::exchange(innermost, this)) {}

ReplyHandOver::~ReplyHandOver() {
    innermost = outer_;
}

void ReplyHandOver::give(const std::string &text, Response &&reply) {
    if (innermost != nullptr) {
        innermost->text_ = text;
        innermost->reply_ = std::move(reply);
    }
}

bool ReplyHandOver::take(const std::string &text, Response &reply) {
    if (innermost == nullptr || !innermost->reply_.isValid() || innermost->text_ != text) {
        return false;
    }
    reply = std::exchange(innermost->reply_, Response());
    innermost->text_.clear();
    return true;
}

} // namespace OvraDRCore
