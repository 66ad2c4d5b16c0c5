// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

#include <json/value.h>

#include <string>

namespace OvraDRCore {

/// The error codes that every layer records; callers and peers compare the numbers.
namespace ERR {

enum Code : int {
    kNone = 0,
    kBadParameter = 401,       ///< an empty or invalid argument; the message may name it
    kOutOfMemory = 402,        ///< a credential or session object could not be allocated
    kNullSender = 403,         ///< no sender, or a sender without a credential object
    kCredNotFound = 404,       ///< the credential is not in the node database
    kFailed = 407,             ///< default failure, stored on entry of an operation
    kNotConnectable = 500,     ///< the remote endpoint is not connectable
    kLoginFailed = 501,        ///< remote login code 400, or any unlisted one
    kLoginDisabled = 502,      ///< remote login code 401: the account is disabled
    kLoginNotPermitted = 503,  ///< remote login code 402
    kLoginOtpRequired = 504,   ///< remote login code 403: a one-time code is required
    kLoginOtpWrong = 505,      ///< remote login code 404: the one-time code is wrong
    kCredItemRefused = 506,    ///< the credential library refused an item
    kUnknownNode = 507,        ///< the node is not known to the node database
    kCredIncomplete = 509,     ///< a credential could not be created or updated
    kSessionNotCreated = 511,  ///< a login session for a node could not be created
    kSessionNotRemoved = 512,  ///< node login sessions could not be removed
    kCredInvalid = 516,        ///< the stored credential record is not valid
    kOtherNode = 518,          ///< the credential or the answering node is another node's
    kNodeInfoFailed = 519,     ///< node information not obtained or malformed
    kCredCheckFailed = 520,    ///< the check before a creation or update failed
    kRemoteConnInvalid = 522,  ///< the endpoint that the remote node chose is not valid
    kLoginCallFailed = 523,    ///< the login call itself failed
    kCredLibrary = 524,        ///< another credential library error; the message is its number
    kNoPrivilege = 525,        ///< the credential has no privilege on the remote node
    kCertificateChanged = 526, ///< the endpoint's certificate is not the trusted one
    kNoSuchUser = 527,         ///< the user of a session to create does not exist
    kSessionUserUnknown = 528, ///< the user record of a session could not be read
};

/// The readable name of one of the codes above, for log lines; "unknown error" for another number.
OVRADRCORE_EXPORT std::string ToString(int code);

} // namespace ERR

/// The outcome of the last operation of a stateful class: a code and, optionally, a JSON message.
/// Setting is const, because const operations can fail too.
class OVRADRCORE_EXPORT ErrRecorder {
public:
    /// The error as an object: "err_code", then "err_code_str" and "err_msg" where there is one.
    virtual Json::Value GetErr() const;
    /// A text for `code`; the base has none ("").
    virtual std::string GetErrCodeStr(int code) const;
    virtual ~ErrRecorder();

    ErrRecorder() = default;
    ErrRecorder(const ErrRecorder &) = default;
    ErrRecorder &operator=(const ErrRecorder &) = default;

    /// Stores both; without a message, the previous one is cleared.
    void SetErr(int code, const Json::Value &message = Json::Value()) const;
    /// Copies code and message of `other`; null changes nothing and is logged.
    void SetErr(const ErrRecorder *other) const;

    int GetErrCode() const { return errCode_; }
    const Json::Value &GetErrMsg() const { return errMsg_; }

private:
    mutable int errCode_ = ERR::kNone;
    mutable Json::Value errMsg_;
};

} // namespace OvraDRCore
