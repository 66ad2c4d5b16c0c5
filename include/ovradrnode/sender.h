// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"
#include "ovradrnode/dr_node.h"
#include "ovradrnode/export.h"

#include <ovradrcore/err_recorder.h>
#include <ovradrcore/request.h>
#include <ovradrcore/response.h>

#include <json/value.h>

#include <cstdint>
#include <string>

struct _tag_ovra_cred_;
struct _tag_ovra_cred_sess_;

namespace OVRA {
class CredRequest;
}

namespace OvraDRNode {

/// Sends a web-API request to a node. A failure is recorded in the sender (GetErrCode(),
/// GetErrMsg()) or is the remote's answer; errorOf() returns the right one. Nothing throws. A
/// sender may be used by one thread at a time.
class OVRADRNODE_EXPORT BaseSender : public OvraDRCore::ErrRecorder {
public:
    ~BaseSender() override;
    virtual bool isValid() const = 0;
    [[nodiscard]] virtual OvraDRCore::Response process(const OvraDRCore::Request &request) = 0;

    /// Runs `request` on the local appliance with the administrator's rights.
    [[nodiscard]] static OvraDRCore::Response run(const OvraDRCore::Request &request);
    /// Probes the endpoint now (at most 10 seconds) and records the verdict for all processes,
    /// except if this one has no memory, descriptor, thread or local port left.
    [[nodiscard]] static bool IsConnectable(const Conn &conn);
    /// The recorded verdict; probes only if that is older than 5 seconds.
    static bool GetCachedConnectable(const Conn &conn);
};

/// Why a call failed. If the remote refused, the reason is in its answer; if no valid answer came,
/// it is recorded in the sender. This looks in both.
///
///     NodeSender sender(nodeId);
///     const OvraDRCore::Response answer = sender.process(request);
///     if (!answer.isSuccess()) {
///         report(errorOf(sender, answer).GetErr());
///     }
///
/// \param sender  as process() left it
/// \param answer  what process() returned
/// \return the remote's code and message if `answer` is a valid refusal, even if the sender has its
///         own code for it; otherwise those of the sender; 407 if neither has one. The code is 0
///         only for a successful answer.
[[nodiscard]] OVRADRNODE_EXPORT OvraDRCore::ErrRecorder
errorOf(const OvraDRCore::ErrRecorder &sender, const OvraDRCore::Response &answer);

/// Sends to one endpoint under one credential.
class OVRADRNODE_EXPORT BaseCredSender : public BaseSender {
public:
    ~BaseCredSender() override;
    bool isValid() const override;
    /// Logs in on first use, checks the endpoint's verdict, sends. Nothing is sent to an endpoint
    /// that is considered unreachable (500).
    [[nodiscard]] OvraDRCore::Response process(const OvraDRCore::Request &request) override;
    [[nodiscard]] virtual bool initCred() = 0;
    virtual void doClear() = 0;
    virtual bool isCredValid() const = 0;

    BaseCredSender();
    explicit BaseCredSender(const Conn &conn);
    BaseCredSender(const BaseCredSender &) = delete;
    BaseCredSender &operator=(const BaseCredSender &) = delete;

    /// Sets the endpoint, translated if it is a relay endpoint; an invalid one is rejected and the
    /// old one stays.
    [[nodiscard]] bool setConn(const Conn &value);
    const Conn &getConn() const { return conn; }
    /// Copies the endpoint into the credential.
    [[nodiscard]] bool initConn() const;
    /// Makes the credential usable: allocates it, fills it, and logs in where that applies.
    [[nodiscard]] bool init();
    /// Back to the state before init().
    void clear();
    /// Records the error of the credential library; a connection failure marks the endpoint as
    /// unreachable for all processes.
    void SetCredRequestError(OVRA::CredRequest &request) const;

protected:
    _tag_ovra_cred_ *cred = nullptr;
    _tag_ovra_cred_sess_ *credSess = nullptr;
    Conn conn;
    bool inited = false;

private:
    class CallTexts;

    void SetCredRequestError(OVRA::CredRequest &request, std::int64_t begun) const;
    void freeHandles();
    [[nodiscard]] OvraDRCore::Response send(const OvraDRCore::Request &request, CallTexts &texts,
                                            const char *function) const;
};

/// Logs in with account, password and one-time code before the first request, and logs out at the
/// end.
class OVRADRNODE_EXPORT CredAccountSender : public BaseCredSender {
public:
    ~CredAccountSender() override;
    [[nodiscard]] bool initCred() override;
    void doClear() override;
    bool isCredValid() const override;

    CredAccountSender() = default;
    CredAccountSender(const Conn &conn, const std::string &account, const std::string &passwd,
                      const std::string &otp);
    CredAccountSender(const std::string &account, const std::string &passwd,
                      const std::string &otp);

    /// False, changing nothing, if account or password is empty; `otp` may be empty.
    [[nodiscard]] bool setCred(const std::string &newAccount, const std::string &newPasswd,
                               const std::string &newOtp);
    [[nodiscard]] bool login();
    void logout();

private:
    bool loggedIn = false;
    std::string account;
    std::string passwd;
    std::string otp;
};

/// Uses a session that the remote node granted earlier.
class OVRADRNODE_EXPORT CredSessionSender : public BaseCredSender {
public:
    ~CredSessionSender() override;
    [[nodiscard]] bool initCred() override;
    void doClear() override;
    bool isCredValid() const override;

    explicit CredSessionSender(const Conn &conn);
    CredSessionSender(const Conn &conn, const std::string &session);

    /// False when empty.
    [[nodiscard]] bool setCred(const std::string &newSession);

private:
    std::string session;
};

/// Sends to a node: locally if it is the local one, otherwise over the credential that worked last,
/// then over every other credential of the node, until one succeeds. Within one process() an
/// endpoint that did not answer is not asked again. If none succeeds, the error is that of the last
/// attempt; but 500, "nothing was sent", only if no attempt can have arrived: otherwise that one's
/// 524.
class OVRADRNODE_EXPORT NodeSender : public BaseSender {
public:
    ~NodeSender() override;
    bool isValid() const override;
    [[nodiscard]] OvraDRCore::Response process(const OvraDRCore::Request &request) override;

    explicit NodeSender(const std::string &nodeId);

    /// False when empty.
    [[nodiscard]] bool setNode(const std::string &id);
    [[nodiscard]] bool setNode(const DRNode &node);
    /// Builds the request, sends it to `nodeId` and copies the answer's data into `out`.
    /// \return whether an answer came; `out` is null if it was an error, or none came.
    [[nodiscard]] static bool process(const std::string &nodeId, const std::string &api,
                                      const std::string &method, int version,
                                      const Json::Value &params, Json::Value &out);
    /// One attempt over one credential; true if the answer is valid and not a refusal for lack of
    /// permission.
    [[nodiscard]] bool processByCred(const DRNode &node, const OvraDRCore::Request &request,
                                     OvraDRCore::Response &response);
    [[nodiscard]] bool processByCredId(const std::string &credId,
                                       const OvraDRCore::Request &request,
                                       OvraDRCore::Response &response);
    /// The first node credential that has the right; "" if none has.
    std::string getValidCredId() const;
    /// The credential that worked last; searched for again after 5 seconds.
    std::string getCachedCredId() const;
    /// Whether the node answers over any of its node credentials, probed now.
    [[nodiscard]] bool isConnectable() const;

private:
    std::string nodeId;
};

/// Sends over exactly one stored credential and keeps the verdict on its right up to date.
class OVRADRNODE_EXPORT CredNodeSender : public BaseSender {
public:
    ~CredNodeSender() override;
    bool isValid() const override;
    [[nodiscard]] OvraDRCore::Response process(const OvraDRCore::Request &request) override;

    explicit CredNodeSender(const DRNode &node);
    explicit CredNodeSender(const std::string &credId);

    [[nodiscard]] bool setCred(const DRNode &value);
    [[nodiscard]] bool setCred(const std::string &credId);
    const DRNode &getNode() const { return node; }
    /// Whether the credential has the right on its node; asks the node if the verdict is older than
    /// 3 seconds.
    [[nodiscard]] bool testPrivilege();

    using BaseSender::GetCachedConnectable;
    using BaseSender::IsConnectable;
    /// The same for the record's endpoint; the local node is always connectable.
    [[nodiscard]] static bool IsConnectable(const DRNode &node);
    static bool GetCachedConnectable(const DRNode &node);

private:
    DRNode node;
};

} // namespace OvraDRNode
