// SPDX-License-Identifier: Apache-2.0
#include "measure.h"

#include <ovradrnode/node_api.h>
#include <ovradrnode/node_db.h>
#include <ovradrnode/node_session.h>
#include <ovradrnode/sender.h>

#include <curl/curl.h>

#include <cstdio>
#include <cstdlib>

namespace OvraBench {

namespace {

constexpr const char *kNode = "bench-remote";
constexpr int kPort = 5001;

/// A credential for this appliance's own daemon under another node id, so that the library uses the
/// network.
std::string addCredential() {
    OvraDRNode::NodeSession sessions;
    std::string session = sessions.CreateNodeSession(kNode, "bench");
    const OvraDRNode::Conn conn = OvraDRNode::Conn::https("127.0.0.1", kPort);
    OvraDRNode::DRNode node(kNode, conn, session);
    const bool complete = !session.empty() && node.setCredId("bench-cred");
    OvraDRCore::InsertCommand command;
    command.SetTable(OvraDRNode::NodeCredSqliteTable());
    command.SetFieldValues(node.ToSqliteRecord());
    if (!complete || !OvraDRNode::NodeDBHandler::GetHandler().InsertRecord(command)) {
        std::fprintf(stderr,
                     "cannot make a credential: is ovradrd running, with the user bench?\n");
        std::exit(1);
    }
    return session;
}

std::size_t append(char *data, std::size_t size, std::size_t count, void *out) {
    static_cast<std::string *>(out)->append(data, size * count);
    return size * count;
}

} // namespace

bool benchSend() {
    const std::string session = addCredential();
    const Work ours = [] {
        OvraDRNode::NodeSender sender(kNode);
        const auto answer = sender.process(OvraDRNode::WebAPI::getDRNodeInfoAPI({}));
        if (!answer.isSuccess()) {
            std::fprintf(stderr, "failed, code %d\n",
                         OvraDRNode::errorOf(sender, answer).GetErrCode());
            std::exit(1);
        }
    };
    CURL *curl = curl_easy_init();
    const std::string url = "https://127.0.0.1:" + std::to_string(kPort) + "/webapi/query.cgi";
    const std::string body = "api=OVRA.DR.Node&version=1&method=info&_sid=" + session;
    curl_easy_setopt(curl, CURLOPT_URL, url.c_str());
    curl_easy_setopt(curl, CURLOPT_POSTFIELDS, body.c_str());
    curl_easy_setopt(curl, CURLOPT_SSL_VERIFYPEER, 0L);
    curl_easy_setopt(curl, CURLOPT_SSL_VERIFYHOST, 0L);
    curl_easy_setopt(curl, CURLOPT_WRITEFUNCTION, append);
    std::string answer;
    curl_easy_setopt(curl, CURLOPT_WRITEDATA, &answer);
    const Work floor = [&] {
        answer.clear();
        if (curl_easy_perform(curl) != CURLE_OK ||
            answer.find("\"success\":true") == std::string::npos) {
            std::fprintf(stderr, "bare request failed: %s\n", answer.c_str());
            std::exit(1);
        }
    };
    constexpr int kCalls = 500;
    constexpr int kRounds = 15;
    const bool good = report("`NodeSender::process`, remembered credential, HTTPS / bare libcurl "
                             "POST on a kept connection",
                             compare(kCalls, kRounds, ours, floor), 2);
    curl_easy_cleanup(curl);
    return good;
}

} // namespace OvraBench
