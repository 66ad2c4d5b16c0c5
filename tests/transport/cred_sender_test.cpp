// SPDX-License-Identifier: Apache-2.0
#include "support/node_fixture.h"
#include "transport/conn_cache.h"

#include <chrono>

using namespace OvraDRNode;
using namespace OvraTest;
using OvraDRCore::Request;
using OvraDRCore::Response;

namespace {

class CredSender : public TwoNodes {
protected:
    Response send(BaseSender &sender) { return sender.process(info); }
    /// 0 if the request was carried out, else the sender's code.
    int codeOfSend(BaseSender &&sender) { return codeOf(send(sender).isSuccess(), sender); }
};

} // namespace

TEST_F(CredSender, WhatCannotBeSentIsRefusedWithoutAWordToTheRemote) {
    CredSessionSender good(conn, "s1");
    Request request("a", 1, "", Json::Value());
    request.addParam("password", "exact");
    EXPECT_FALSE(good.process(request).isValid());
    EXPECT_EQ(good.GetErrCode(), 401);
    EXPECT_EQ(good.GetErrMsg(), request.toJson());
    EXPECT_EQ(log.count("ERR", "sender", "process", "Invalid api"), 1);
    CredSessionSender noSession(conn);
    EXPECT_EQ(codeOf(noSession.init(), noSession), 401);
    EXPECT_EQ(noSession.GetErrMsg().asString(), "session");
    CredSessionSender noConn(Conn(), "s1");
    EXPECT_EQ(codeOf(noConn.init(), noConn), 401);
    EXPECT_EQ(noConn.GetErrMsg().asString(), "conn");
    EXPECT_EQ(codeOfSend(CredSessionSender(conn)), 401);
    EXPECT_EQ(codeOfSend(CredSessionSender(Conn(), "s1")), 401);
    EXPECT_EQ(codeOfSend(CredAccountSender(conn, "joe", "", "")), 401);
    EXPECT_EQ(log.count("invalid conn ["), 3);
    const auto cut = [](const std::string &text) { return text + std::string("\0x", 2); };
    const Conn cutHost = Conn::https(cut("127.0.0.1"), remote.port());
    EXPECT_EQ(codeOfSend(CredSessionSender(cutHost, "s1")), 506) << "never the text up to the NUL";
    EXPECT_EQ(codeOfSend(CredSessionSender(conn, cut("s1"))), 506);
    EXPECT_EQ(codeOfSend(CredAccountSender(conn, cut("joe"), "pw", "")), 506);
    EXPECT_EQ(codeOfSend(CredAccountSender(conn, "joe", cut("pw"), "")), 506);
    EXPECT_EQ(remote.calls(), "");
}

TEST_F(CredSender, NoFailureWritesASecretIntoTheLog) {
    const Request request = WebAPI::getDRNodeTestCredCreateAPI(conn, "joe", "canary", "canary");
    Request invalid = request;
    invalid.setMethod("");
    remote.answer("login", R"({"success":true,"data":{"sid":"canary"}})");
    for (const char *answer :
         {"", "<canary>", R"({"success":false,"error":{"code":105}})",
          R"({"success":false,"error":{"code":120,"msg":{"token":"canary"}}})"}) {
        remote.answer("test_create", answer);
        CredAccountSender account(conn, "joe", "canary", "canary");
        CredSessionSender session(conn, "canary");
        for (BaseSender *sender : std::initializer_list<BaseSender *>{&account, &session}) {
            ConnCache(conn).UpdateWithData(true);
            EXPECT_FALSE(sender->process(request).isSuccess());
            EXPECT_FALSE(sender->process(invalid).isSuccess());
            ConnCache(conn).UpdateWithData(false);
            EXPECT_FALSE(sender->process(request).isSuccess());
        }
    }
    remote.answer("login", R"({"success":false,"error":{"code":400,"msg":{"passwd":"canary"}}})");
    EXPECT_FALSE(CredAccountSender(conn, "joe", "canary", "canary").init());
    EXPECT_GT(log.count("Failed to process cred request ["), 0);
    EXPECT_GT(log.count("since error ["), 0);
    EXPECT_GT(log.count("not connectable"), 0);
    EXPECT_GT(log.count("Failed to login"), 0);
    EXPECT_EQ(log.count("canary"), 0);
}

TEST_F(CredSender, WhyACallFailedIsToldByTheRemoteOrElseByTheSender) {
    const struct {
        const char *what;
        Answer answer;
        int code;
        Json::Value message;
    } cases[] = {
        {"success", Answer::success(), 0, {}},
        {"refused", Answer::json(R"({"success":false,"error":{"code":120,"msg":"m"}})"), 120, "m"},
        {"refused, and the sender has a code for it",
         Answer::json(R"({"success":false,"error":{"code":105,"msg":"disabled"}})"), 105,
         "disabled"},
        {"no reply", Answer::html(), 524, 8},
        {"cut", Answer::truncated(R"({"success":true,"data":{}})"), 524, 9},
        {"a redirect", Answer::redirect("http://127.0.0.1:1/"), 524, 11},
        {"no reply, without a message", Answer::status(403), 525, {}},
    };
    for (const auto &each : cases) {
        remote.answer("info", each.answer);
        CredSessionSender sender(conn, "s1");
        const Response response = send(sender);
        EXPECT_EQ(response.isSuccess(), each.code == 0) << each.what;
        const OvraDRCore::ErrRecorder error = errorOf(sender, response);
        EXPECT_EQ(error.GetErrCode(), each.code) << each.what;
        EXPECT_EQ(error.GetErrMsg(), each.message) << each.what;
    }
    // A request on this appliance has no sender, or one that recorded nothing.
    EXPECT_EQ(errorOf(OvraDRCore::ErrRecorder(), Response()).GetErrCode(), 407);
}

TEST_F(CredSender, AConnectionThatFailsMarksTheEndpointForEverybody) {
    ConnCache(conn).UpdateWithData(true);
    remote.die();
    EXPECT_EQ(codeOfSend(CredSessionSender(conn, "s1")), 500);
    EXPECT_EQ(log.count("NOTICE", "sender", "SetCredRequestError",
                        "Update conn cache [" + OvraDRCore::toString(conn.toJson()) +
                            "] from [true] to [false]"),
              1);
    EXPECT_FALSE(BaseSender::GetCachedConnectable(conn));
    CredSessionSender next(conn, "s2");
    EXPECT_EQ(codeOf(send(next).isValid(), next), 500);
    EXPECT_EQ(next.GetErrMsg(), conn.toJson()) << "stopped by the verdict";
    EXPECT_EQ(log.count("cred error"), 1);
}

TEST_F(CredSender, TheRemotesOwnErrorsAreTheCallersExceptNoPermission) {
    CredSessionSender sender(conn, "s1");
    remote.answer("info", R"({"success":false,"error":{"code":119}})");
    EXPECT_EQ(send(sender).getErrCode(), 119);
    EXPECT_EQ(sender.GetErrCode(), 0);
    remote.answer("info", R"({"success":false,"error":{"code":105}})");
    EXPECT_EQ(send(sender).getErrCode(), 105);
    EXPECT_EQ(sender.GetErrCode(), 525);
    remote.answer("info", R"({"success":true,"data":{"hostname":"b"}})");
    EXPECT_EQ(send(sender).getDataFieldtoStr("hostname"), "b");
    EXPECT_EQ(sender.GetErrCode(), 0) << "an old error does not stay";
    EXPECT_EQ(remote.calls(), "probe, s1 info, s1 info, s1 info");
}

TEST_F(CredSender, ARequestThatTakesTooLongIsCutAndMayHaveBeenCarriedOut) {
    remote.answer("info", Answer::silence());
    Request request = WebAPI::getDRNodeInfoAPI({});
    request.setResponseTimeout(1);
    CredSessionSender sender(conn, "s1");
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(codeOf(sender.process(request).isValid(), sender), 524);
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(5));
    EXPECT_EQ(sender.GetErrMsg(), 15);
    EXPECT_TRUE(ConnCache(conn).getStoredVerdict()) << "it is slow, but it was reached";
}

TEST_F(CredSender, AChangedCertificateIsNeverASilentSuccess) {
    EXPECT_EQ(codeOfSend(CredSessionSender(conn, "s1")), 0);
    remote.server.closeConnections();
    remote.server.changeCertificate();
    remote.forgetCalls();
    EXPECT_EQ(codeOfSend(CredSessionSender(conn, "s1")), 526);
    EXPECT_EQ(remote.calls().find("s1"), std::string::npos) << "the session never left";
    EXPECT_TRUE(ConnCache(conn).getStoredVerdict()) << "the endpoint does answer";
}

TEST_F(CredSender, AnAccountLogsInOnceAndOutOnceAtTheEnd) {
    remote.answer("login", R"({"success":true,"data":{"sid":"granted"}})");
    {
        CredAccountSender sender(conn, "joe", "pass-word", "123456");
        EXPECT_TRUE(send(sender).isSuccess());
        EXPECT_TRUE(send(sender).isSuccess());
        EXPECT_EQ(remote.calls(), " login, probe, granted info, granted info");
        remote.forgetCalls();
        sender.clear();
        sender.clear();
        EXPECT_EQ(remote.calls(), "granted logout");
        EXPECT_TRUE(send(sender).isSuccess()) << "logs in again";
        EXPECT_FALSE(sender.setCred("", "new", "") || sender.setCred("ann", "", ""));
        remote.answer("login", R"({"success":true,"data":{"sid":"second"}})");
        EXPECT_TRUE(sender.setCred("ann", "new", ""));
        remote.forgetCalls();
        EXPECT_TRUE(send(sender).isSuccess());
        EXPECT_EQ(remote.calls(), "granted info") << "another account begins with a clear()";
        sender.clear();
        EXPECT_TRUE(send(sender).isSuccess());
        EXPECT_EQ(remote.calls(), "granted info, granted logout,  login, second info");
        EXPECT_NE(remote.params("login").find("ann"), std::string::npos);
        remote.forgetCalls();
    }
    EXPECT_EQ(remote.calls(), "second logout");
    EXPECT_EQ(log.count("pass-word") + log.count("123456") + log.count("granted"), 0);
    CredSessionSender session(conn, "s1");
    EXPECT_FALSE(session.setCred(""));
    EXPECT_TRUE(session.isCredValid()) << "what was refused changed nothing";
}

TEST_F(CredSender, RemoteLogInCodesBecomeOurs) {
    for (const auto &[code, ours] : {std::pair(400, 501),
                                     {401, 502},
                                     {402, 503},
                                     {403, 504},
                                     {404, 505},
                                     {407, 501},
                                     {105, 501}}) {
        remote.answer("login",
                      R"({"success":false,"error":{"code":)" + std::to_string(code) + "}}");
        CredAccountSender sender(conn, "joe", "pw", "");
        EXPECT_EQ(codeOf(send(sender).isValid(), sender), ours) << code;
        EXPECT_TRUE(sender.GetErrMsg().isNull());
    }
    EXPECT_EQ(remote.calls().find("logout"), std::string::npos) << "who is not in does not log out";
    remote.die();
    EXPECT_EQ(codeOfSend(CredAccountSender(conn, "joe", "pw", "")), 501);
}
