// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

#include <json/value.h>

#include <string>

namespace OvraDRCore {

/// The parsed reply of a web-API call, local or remote. The wire form is
/// `{"success": true, "data": {...}}` (data may be absent) or
/// `{"success": false, "error": {"code": N, "msg": ...}}` (N not 0, msg may be absent). Any other
/// reply leaves an invalid response: not a success, code 407, no message, no data.
class OVRADRCORE_EXPORT Response {
public:
    Response() = default;
    explicit Response(const Json::Value &reply) { setResp(reply); }

    /// Takes a reply document. What was held before is gone, also when the document is refused.
    void setResp(const Json::Value &reply);
    /// The same without a copy of its data; what is left of `reply` is not specified.
    void setResp(Json::Value &&reply);
    /// Parses a reply text.
    void setResp(const std::string &text);

    bool isValid() const { return valid_; }
    bool isSuccess() const { return success_; }
    /// 0 on success, the remote's code on failure, 407 when invalid.
    int getErrCode() const { return errCode_; }
    const Json::Value &getErrMsg() const { return errMsg_; }
    /// The data object of a successful reply; the empty object when it brought none.
    const Json::Value &getData() const { return data_; }
    bool hasDataField(const char *key) const;
    /// Null when absent.
    Json::Value getDataField(const char *key) const;
    /// The text of the field: a string as it is, another scalar in its JSON form, otherwise "".
    std::string getDataFieldtoStr(const char *key) const;

    /// The reply in its wire form; null for an invalid response.
    Json::Value toJson() const;

private:
    bool valid_ = false;
    bool success_ = false;
    int errCode_ = 407;
    Json::Value errMsg_;
    Json::Value data_;
};

/// Spares the second parse of a reply that is read where it arrives, to judge it, and again where
/// it is used, because only its text travels in between. While an object lives, give() on the same
/// thread hands it a reply, and setResp() of exactly that text takes it instead of parsing. Objects
/// may nest; the innermost one counts. What nobody took goes with the object.
class OVRADRCORE_EXPORT ReplyHandOver {
public:
    ReplyHandOver();
    ~ReplyHandOver();
    ReplyHandOver(const ReplyHandOver &) = delete;
    ReplyHandOver &operator=(const ReplyHandOver &) = delete;

    /// \param reply  what `text` parses to. Where no object waits, nothing happens.
    static void give(const std::string &text, Response &&reply);
    /// Takes the reply that was given with this very text. \return false when there is none.
    [[nodiscard]] static bool take(const std::string &text, Response &reply);

private:
    ReplyHandOver *outer_;
    std::string text_;
    Response reply_;
};

} // namespace OvraDRCore
