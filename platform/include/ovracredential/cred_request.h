// SPDX-License-Identifier: Apache-2.0
#pragma once

// Credential request library: authenticated web-API requests to a remote appliance.

#include <json/value.h>

#include <memory>
#include <string>

/// A credential: endpoint, account and password. Opaque.
struct _tag_ovra_cred_;
/// The result of a login: the access token (session id). Opaque.
struct _tag_ovra_cred_sess_;
using OVRACred = _tag_ovra_cred_;
using OVRACredSess = _tag_ovra_cred_sess_;

#define OVRA_PLATFORM_EXPORT __attribute__((visibility("default")))

extern "C" {
/// A new empty object, owned by the caller; null if out of memory. Free accepts null.
OVRA_PLATFORM_EXPORT OVRACred *OVRACredAlloc(void);
OVRA_PLATFORM_EXPORT void OVRACredFree(OVRACred *cred);
OVRA_PLATFORM_EXPORT OVRACredSess *OVRACredSessAlloc(void);
OVRA_PLATFORM_EXPORT void OVRACredSessFree(OVRACredSess *sess);

// Items: 0 if the item was accepted; otherwise it is rejected and the object is unchanged.
OVRA_PLATFORM_EXPORT int OVRACredItemSetProtocol(OVRACred *cred, const char *protocol);
OVRA_PLATFORM_EXPORT int OVRACredItemSetHost(OVRACred *cred, const char *host);
OVRA_PLATFORM_EXPORT int OVRACredItemSetPort(OVRACred *cred, int port);
OVRA_PLATFORM_EXPORT int OVRACredItemSetRemoteAccount(OVRACred *cred, const char *account);
OVRA_PLATFORM_EXPORT int OVRACredItemSetRemotePasswd(OVRACred *cred, const char *passwd);
OVRA_PLATFORM_EXPORT int OVRACredSessItemSetAccessToken(OVRACredSess *sess, const char *token);
}

namespace OVRA {

/// One request. Operations that return int return non-zero on success; otherwise GetError() says
/// why. Nothing throws. An object is for one thread at a time; different objects can be used
/// concurrently.
class OVRA_PLATFORM_EXPORT CredRequest {
public:
    CredRequest();
    ~CredRequest();
    CredRequest(const CredRequest &) = delete;
    CredRequest &operator=(const CredRequest &) = delete;

    /// \param protocol  "http", "https", or "flk" for a relay alias, which is looked up when the
    ///                  request is sent
    /// \param address   a host name in ASCII, an IPv4 or an IPv6 address, or the alias
    /// \param path      relative to the root of the host: letters, digits and "-._/"
    int SetURL(const std::string &protocol, const std::string &address, int port,
               const std::string &path);
    /// \param seconds  time-out for the whole exchange, connecting included; 1 to 86,400. 60 unless
    ///                 set
    int SetDefaultTimeout(long seconds);
    /// \param seconds  time-out for the whole exchange of this request; replaces the default
    int SetResponseTimeout(long seconds);
    /// Mode 2 seals parameters and session to the receiving appliance; 0 does so over http only and
    /// relies on TLS over https.
    int SetEncryptMode(int mode);
    /// A regular file to upload, read when the request is sent; over https only.
    /// \param name  the name under which it is sent
    int SetUploadFile(const std::string &path, const std::string &name);
    /// Makes `req` the call of `api` to the credential's endpoint under the session.
    /// \param sess    may be null or hold no token: a call without a session
    /// \param params  an object or null; both are copied
    static int CreateWebAPIRequest(CredRequest &req, OVRACred *cred, OVRACredSess *sess,
                                   const std::string &api, int version, const std::string &method,
                                   const Json::Value &params);
    /// Sends and waits for the answer. A certificate that the system's store does not accept is
    /// trusted on first use and must keep the same key (docs/wire.md).
    /// \param reuse  may reuse an idle connection
    /// \param mode   0: a request, the certificate is verified; 2: a probe, any answer of the entry
    ///               point with an HTTP status below 500 other than 404 counts, the certificate is
    ///               not verified, no secret is sent
    int Process(bool reuse, int mode);
    /// The response document of the last request, unsealed if it was sealed; "" if there was none.
    std::string GetResponse() const;
    /// The library's error number; 0 if there was none. 2: this process has no memory, descriptor
    /// or thread left; 4: not permitted (HTTP 401, 403); 5: cannot connect; 6: the endpoint's key
    /// is not the one trusted for it; 9: the connection ended before the reply; 10: timed out
    /// before the request was sent; 15: sent, and no answer in time. After 9 and 15 it may have
    /// been carried out.
    int GetError() const;

private:
    struct Impl;
    std::unique_ptr<Impl> impl_;
};

class OVRA_PLATFORM_EXPORT CredRequestUtil {
public:
    /// Logs in with the credential's account and password.
    /// \param otp   one-time code, or ""
    /// \param sess  receives the granted access token
    /// \param out   receives the response document, also if the login was refused; if the call
    ///              failed, one with error 100 and the message {"cred_error", "text"}
    /// \return non-zero if the call got an answer, whatever it says.
    /// Waits 60 seconds at most.
    static int LoginWithOTP(OVRACred *cred, const std::string &otp, OVRACredSess *sess,
                            Json::Value *out);
    /// Ends the session obtained by LoginWithOTP(); the token is cleared in any case. Waits 5
    /// seconds at most. \return non-zero if the remote confirmed it.
    static int Logout(OVRACred *cred, OVRACredSess *sess);
};

class OVRA_PLATFORM_EXPORT CredRequestFarlink {
public:
    /// Names the endpoint of an alias of the relay. Nobody is asked: where the alias is reached is
    /// looked up when a request connects, and its key is known by the alias.
    /// \param info     receives an object with "host", "protocol" and "port"
    /// \param options  reserved, null
    /// \return non-zero on success.
    static int GetConnInfo(const std::string &alias, Json::Value &info, const void *options);
};

} // namespace OVRA
