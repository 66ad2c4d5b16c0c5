// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

#include <json/value.h>

#include <string>

namespace OvraDRCore {

/// The parsed reply of a web-API call, local or remote. The wire form is
/// `{"success": true, "data": {...}}` (data may be absent) or
/// `{"success": false, "error": {"code": N, "msg": ...}}` (N not 0, msg may be absent). Any other
/// reply gives an invalid response: not a success, code 407, no message, no data.
class OVRADRCORE_EXPORT Response {
public:
    Response() = default;
    explicit Response(const Json::Value &reply) { setResp(reply); }

    /// Sets the reply document. The previous content is lost, even if the document is rejected.
    void setResp(const Json::Value &reply);
    /// The same without copying its data; `reply` is left in an unspecified state.
    void setResp(Json::Value &&reply);
    /// Parses a reply text.
    void setResp(const std::string &text);

    bool isValid() const { return valid_; }
    bool isSuccess() const { return success_; }
    /// 0 on success, the remote's code on failure, 407 when invalid.
    int getErrCode() const { return errCode_; }
    const Json::Value &getErrMsg() const { return errMsg_; }
    /// The data object of a successful reply; the empty object if it has none.
    const Json::Value &getData() const { return data_; }
    bool hasDataField(const char *key) const;
    /// Null if absent.
    Json::Value getDataField(const char *key) const;
    /// The text of the field: a string as is, any other scalar in its JSON form, otherwise "".
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

/// Avoids parsing a reply twice: it is parsed on arrival, to check it, and again where it is used,
/// because only its text is passed in between. While an object exists, give() on the same thread
/// stores a reply in it, and setResp() of exactly that text takes the stored reply instead of
/// parsing. Objects may nest; the innermost one counts. A reply that is not taken is destroyed with
/// the object.
class OVRADRCORE_EXPORT ReplyHandOver {
public:
    ReplyHandOver();
    ~ReplyHandOver();
    ReplyHandOver(const ReplyHandOver &) = delete;
    ReplyHandOver &operator=(const ReplyHandOver &) = delete;

    /// \param reply  the parsed `text`. Without a waiting object, nothing happens.
    static void give(const std::string &text, Response &&reply);
    /// Takes the reply that was given with exactly this text. \return false if there is none.
    [[nodiscard]] static bool take(const std::string &text, Response &reply);

private:
    ReplyHandOver *outer_;
    std::string text_;
    Response reply_;
};

} // namespace OvraDRCore
