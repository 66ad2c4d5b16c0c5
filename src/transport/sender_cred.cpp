// SPDX-License-Identifier: Apache-2.0
#define OVRA_LOG_FILE "sender"

// Senders over one endpoint and one credential.

#include "library_errors.h"
#include "ovradrnode/sender.h"
#include "transport/conn_cache.h"
#include "transport/request_scope.h"

#include <ovracredential/cred_request.h>
#include <ovradrcore/json.h>
#include <ovradrcore/log.h>

#include <cstring>

namespace OvraDRNode {

namespace ERR = OvraDRCore::ERR;
using OvraDRCore::LogLevel;
using OvraDRCore::Request;
using OvraDRCore::Response;

namespace {

constexpr int kSealParameters = 2;
constexpr int kSend = 0;

/// The remote's answer to a request for which the session has no right.
constexpr int kRemoteNoPermission = 105;
/// Remote log-in codes 400 to 404 become 501 to 505.
constexpr int kFirstLoginCode = 400;
constexpr int kLastLoginCode = 404;

std::string text(const Conn &conn) {
    return OvraDRCore::toString(conn.toJson());
}

int loginError(int remoteCode) {
    const bool listed = remoteCode >= kFirstLoginCode && remoteCode <= kLastLoginCode;
    return listed ? ERR::kLoginFailed + (remoteCode - kFirstLoginCode) : ERR::kLoginFailed;
}

/// Hands a text to the credential library, unless it would be cut at a NUL.
/// \return whether it was taken
template <typename Object>
bool setItem(int (*set)(Object *, const char *), Object *object, const std::string &item) {
    return item.find('\0') == std::string::npos && set(object, item.c_str()) == 0;
}

} // namespace

BaseCredSender::BaseCredSender() = default;

BaseCredSender::BaseCredSender(const Conn &conn_) {
    (void)setConn(conn_); // see isValid()
}

BaseCredSender::~BaseCredSender() {
    freeHandles();
}

bool BaseCredSender::isValid() const {
    return isCredValid() && conn.isValid();
}

bool BaseCredSender::setConn(const Conn &value) {
    const Conn direct = Conn::translateFarlink(value);
    if (!direct.isValid()) {
        return false;
    }
    conn = direct;
    return true;
}

bool BaseCredSender::initConn() const {
    if (!conn.isValid()) {
        SetErr(ERR::kBadParameter, "conn");
        return false;
    }
    if (!setItem(OVRACredItemSetProtocol, cred, conn.protocol) ||
        !setItem(OVRACredItemSetHost, cred, conn.addr) ||
        OVRACredItemSetPort(cred, conn.port) != 0) {
        SetErr(ERR::kCredItemRefused);
        return false;
    }
    return true;
}

bool BaseCredSender::init() {
    if (inited) {
        return true;
    }
    if (cred == nullptr) {
        cred = OVRACredAlloc();
    }
    if (cred != nullptr && credSess == nullptr) {
        credSess = OVRACredSessAlloc();
    }
    if (cred == nullptr || credSess == nullptr) {
        SetErr(ERR::kOutOfMemory);
        OVRA_ERR("Failed to allocate memory for cred or sess");
        return false;
    }
    if (!initConn()) {
        OVRA_ERR("Failed to init conn [%s]", text(conn).c_str());
        return false;
    }
    if (!initCred()) {
        OVRA_ERR("Failed to init cred");
        return false;
    }
    inited = true;
    return true;
}

void BaseCredSender::freeHandles() {
    if (cred != nullptr) {
        OVRACredFree(cred);
        cred = nullptr;
    }
    if (credSess != nullptr) {
        OVRACredSessFree(credSess);
        credSess = nullptr;
    }
}

void BaseCredSender::clear() {
    doClear();
    freeHandles();
    inited = false;
}

void BaseCredSender::SetCredRequestError(OVRA::CredRequest &request) const {
    SetCredRequestError(request, OvraDRCore::Cache::Now());
}

/// \param begun  when the attempt began, Cache::Now(): who was stopped in it has old news
void BaseCredSender::SetCredRequestError(OVRA::CredRequest &request, std::int64_t begun) const {
    const int error = request.GetError();
    if (error == 0) {
        return;
    }
    OVRA_NOTICE("cred error [%d]", error);
    switch (error) {
    case LibraryError::kNoPermission:
        SetErr(ERR::kNoPrivilege);
        return;
    case LibraryError::kCertificate:
        SetErr(ERR::kCertificateChanged);
        return;
    case LibraryError::kCannotConnect:
    case LibraryError::kTimedOut: {
        SetErr(ERR::kNotConnectable);
        RequestScope::noteUnreachable(conn);
        const ConnCache cache(conn);
        cache.logChange(__func__, cache.getStoredVerdict(), false);
        cache.UpdateWithFinding(false, begun);
        return;
    }
    case LibraryError::kUnanswered:
        RequestScope::noteUnreachable(conn);
        [[fallthrough]];
    default:
        SetErr(ERR::kCredLibrary, error);
    }
}

/// The texts in the log lines of one call, rendered lazily and once.
class BaseCredSender::CallTexts {
public:
    CallTexts(const Request &request, const Conn &conn)
        : request_(request)
        , conn_(conn) {}

    const char *request() {
        if (requestText_.empty()) {
            requestText_ = OvraDRCore::toLogString(request_.toJson());
        }
        return requestText_.c_str();
    }
    const char *conn() {
        if (connText_.empty()) {
            connText_ = text(conn_);
        }
        return connText_.c_str();
    }

private:
    const Request &request_;
    const Conn &conn_;
    std::string requestText_;
    std::string connText_;
};

/// Sends the request after all checks; logs as process().
Response BaseCredSender::send(const Request &request, CallTexts &texts,
                              const char *function) const {
    Response response;
    OVRA::CredRequest credRequest;
    if (OVRA::CredRequest::CreateWebAPIRequest(credRequest, cred, credSess, request.getAPI(),
                                               request.getVersion(), request.getMethod(),
                                               request.getParams()) == 0) {
        OVRA_LOG_IN(LogLevel::kDebug, "CreateOvraWebAPIRequest",
                    "Failed to create cred request for request[%s]", texts.request());
        SetCredRequestError(credRequest);
        OVRA_LOG_IN(LogLevel::kNotice, function, "Failed to create cred request [%s]",
                    texts.request());
        return response;
    }
    credRequest.SetResponseTimeout(request.getResponseTimeout());
    if (request.isEncryptRequired()) {
        credRequest.SetEncryptMode(kSealParameters);
    }
    if (!request.getUploadPath().empty() && !request.getUploadName().empty()) {
        credRequest.SetUploadFile(request.getUploadPath(), request.getUploadName());
    }
    const OvraDRCore::ReplyHandOver replyHandOver; // the credential library parses the reply first
    const std::int64_t begun = OvraDRCore::Cache::Now();
    if (credRequest.Process(true, kSend) == 0) {
        SetCredRequestError(credRequest, begun);
        OVRA_LOG_IN(LogLevel::kNotice, function, "Failed to process cred request [%s]",
                    texts.request());
        return response;
    }
    response.setResp(credRequest.GetResponse());
    if (response.isValid() && !response.isSuccess() &&
        response.getErrCode() == kRemoteNoPermission) {
        SetErr(ERR::kNoPrivilege);
    }
    return response;
}

Response BaseCredSender::process(const Request &request) {
    SetErr(ERR::kNone);
    Response response;
    CallTexts texts(request, conn);
    if (!request.isValid()) {
        SetErr(ERR::kBadParameter, request.toJson());
        OVRA_ERR("Invalid api");
    } else if (!isValid()) {
        SetErr(ERR::kBadParameter);
        OVRA_ERR("invalid conn [%s] or cred", texts.conn());
    } else if (!inited && !init()) {
        OVRA_ERR("Failed to init cred for conn [%s]", texts.conn());
    } else if (!GetCachedConnectable(conn)) {
        SetErr(ERR::kNotConnectable, conn.toJson());
        OVRA_NOTICE("Failed to send req [%s] since cache [%s] not connectable", texts.request(),
                    texts.conn());
    } else {
        response = send(request, texts, __func__);
    }
    if (GetErrCode() != ERR::kNone) {
        OVRA_DEBUG("Failed to process request[%s] to conn [%s] since error [%s]", texts.request(),
                   texts.conn(), OvraDRCore::toLogString(GetErr()).c_str());
    }
    return response;
}

CredAccountSender::CredAccountSender(const Conn &conn_, const std::string &account_,
                                     const std::string &passwd_, const std::string &otp_)
    : BaseCredSender(conn_)
    , account(account_)
    , passwd(passwd_)
    , otp(otp_) {}

CredAccountSender::CredAccountSender(const std::string &account_, const std::string &passwd_,
                                     const std::string &otp_)
    : account(account_)
    , passwd(passwd_)
    , otp(otp_) {}

CredAccountSender::~CredAccountSender() {
    logout();
    explicit_bzero(passwd.data(), passwd.size());
    explicit_bzero(otp.data(), otp.size());
}

bool CredAccountSender::setCred(const std::string &newAccount, const std::string &newPasswd,
                                const std::string &newOtp) {
    if (newAccount.empty() || newPasswd.empty()) {
        return false;
    }
    account = newAccount;
    passwd = newPasswd;
    otp = newOtp;
    return true;
}

bool CredAccountSender::isCredValid() const {
    return !account.empty() && !passwd.empty();
}

bool CredAccountSender::initCred() {
    if (cred == nullptr) {
        SetErr(ERR::kNullSender);
        OVRA_ERR("NULL Credential");
        return false;
    }
    if (!isCredValid()) {
        SetErr(ERR::kBadParameter);
        OVRA_ERR("Bad parameter of credHost [%s]", conn.addr.c_str());
        return false;
    }
    if (!setItem(OVRACredItemSetRemoteAccount, cred, account) ||
        !setItem(OVRACredItemSetRemotePasswd, cred, passwd)) {
        SetErr(ERR::kCredItemRefused);
        OVRA_ERR("Failed to set the credential infomation of host [%s]", account.c_str());
        return false;
    }
    return login();
}

bool CredAccountSender::login() {
    if (loggedIn) {
        return true;
    }
    Json::Value reply;
    if (OVRA::CredRequestUtil::LoginWithOTP(cred, otp, credSess, &reply) == 0) {
        SetErr(ERR::kLoginCallFailed);
    }
    const Response response(reply);
    if (response.isSuccess()) {
        loggedIn = true;
        return true;
    }
    const int error = loginError(response.getErrCode());
    SetErr(error);
    OVRA_ERR("Failed to login of server with resp[%s] for user[%s]/err[%s]",
             OvraDRCore::toLogString(reply).c_str(), account.c_str(), ERR::ToString(error).c_str());
    return false;
}

void CredAccountSender::logout() {
    if (loggedIn) {
        OVRA::CredRequestUtil::Logout(cred, credSess);
        loggedIn = false;
    }
}

void CredAccountSender::doClear() {
    logout();
}

CredSessionSender::CredSessionSender(const Conn &conn_)
    : BaseCredSender(conn_) {}

CredSessionSender::CredSessionSender(const Conn &conn_, const std::string &session_)
    : BaseCredSender(conn_)
    , session(session_) {}

CredSessionSender::~CredSessionSender() = default;

bool CredSessionSender::setCred(const std::string &newSession) {
    if (newSession.empty()) {
        return false;
    }
    session = newSession;
    return true;
}

bool CredSessionSender::isCredValid() const {
    return !session.empty();
}

bool CredSessionSender::initCred() {
    if (session.empty()) {
        SetErr(ERR::kBadParameter, "session");
        OVRA_ERR("Bad parameter [%s]", session.c_str());
        return false;
    }
    if (!setItem(OVRACredSessItemSetAccessToken, credSess, session)) {
        SetErr(ERR::kCredItemRefused);
        OVRA_ERR("Failed to set the credential session of host [%s]", conn.addr.c_str());
        return false;
    }
    return true;
}

void CredSessionSender::doClear() {}

} // namespace OvraDRNode
