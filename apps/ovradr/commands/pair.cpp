// SPDX-License-Identifier: Apache-2.0
#include "access.h"
#include "commands/commands.h"
#include "cred_report.h"
#include "endpoint.h"
#include "invite_code.h"
#include "open_call.h"
#include "output.h"
#include "pairing.h"
#include "progress.h"
#include "provision/node_database.h"
#include "remote_login.h"
#include "shared/invites.h"
#include "shared/session_lock.h"
#include "target.h"
#include "trust.h"

#include <ovradrcore/json.h>
#include <ovradrnode/cred_reverse_create.h>
#include <ovradrnode/dr_node.h>
#include <ovradrnode/node_api.h>
#include <ovradrnode/node_create.h>
#include <ovradrnode/sender.h>
#include <ovraplatform/trust_store.h>

#include <ctime>
#include <functional>
#include <future>
#include <memory>
#include <utility>
#include <vector>

namespace Ovradr {

namespace {

using OvraApps::InviteRefusal;
using OvraDRCore::memberString;
using OvraDRCore::Response;
using OvraDRNode::Conn;
using OvraDRNode::CredReverseCreate;
using OvraDRNode::DRNode;
using OvraPlatform::CredExpected;
using OvraPlatform::PeerIdentity;
using OvraPlatform::TrustStore;

constexpr const char *kStandardInput = "-";
/// How long an endpoint of the code may take to show its key, in seconds; all are asked at once.
constexpr long kTrySeconds = 5;

struct PairOptions {
    std::vector<std::string> target; ///< a URL, or a code, perhaps with blanks in it
    bool both = false;
    std::string localAccount;
    RemoteLogin login;
    std::string fingerprint;
};

/// Steps that are taken back, the last one first, unless the whole succeeds.
class Undo {
public:
    Undo() = default;
    Undo(const Undo &) = delete;
    Undo &operator=(const Undo &) = delete;
    ~Undo() {
        while (!steps_.empty()) {
            steps_.back()();
            steps_.pop_back();
        }
    }
    void add(std::function<void()> step) { steps_.push_back(std::move(step)); }
    void keep() { steps_.clear(); }

private:
    std::vector<std::function<void()>> steps_;
};

/// What a pairing made.
struct Paired {
    DRNode record;
    std::string account;
    Json::Value back; ///< the other appliance's record of this one; null: none
    std::string localAccount;
};

/// Has the node of the credential make one back to this appliance.
Expected<Json::Value> createBack(const DRNode &record, const std::string &account,
                                 const std::vector<Conn> &conns) {
    CredReverseCreate flow;
    const bool done = flow.setCredId(record.credId) && flow.setLocalAccount(account) &&
                      flow.addLocalConns(conns) && flow.process() && flow.getCredInfo().isObject();
    return done ? Expected<Json::Value>(flow.getCredInfo()) : reverseFailure(flow);
}

/// What the way back needs; checked before anything is changed.
struct WayBack {
    std::string account; ///< "": none is wanted
    std::vector<Conn> conns;
};

Expected<WayBack> prepareBack(const PairOptions &options, bool wanted) {
    if (!wanted) {
        return WayBack{};
    }
    const Expected<std::vector<Conn>> conns = offeredConns({});
    if (!conns) {
        return Refusal(conns.error());
    }
    return localAccount(options.localAccount).map([&conns](const std::string &account) {
        return WayBack{account, *conns};
    });
}

/// Creates the credential of a flow that has proved itself, and the way back. Either both are made
/// or none.
Expected<Paired> pairBy(OvraDRNode::CredCreate &flow, const Conn &conn, const WayBack &wayBack) {
    auto done = meetNode(flow, conn).and_then([&] { return createCred(flow, conn); });
    if (!done) {
        return Refusal(done.error());
    }
    Paired paired{flow.getNode(), "", {}, wayBack.account};
    if (wayBack.account.empty()) {
        return paired;
    }
    Expected<Json::Value> back = createBack(paired.record, wayBack.account, wayBack.conns);
    if (!back) {
        const auto removed = OvraApps::deleteCredential(paired.record, false);
        back.error().hint += removed.state == OvraApps::FlowState::kDone
                                 ? " The way there was removed again."
                                 : " The way there could not be removed: run `ovradr cred delete " +
                                       paired.record.credId + "`.";
        return Refusal(back.error());
    }
    paired.back = std::move(*back);
    return paired;
}

Outcome report(const Paired &paired) {
    const DRNode &record = paired.record;
    Report report;
    report.data = credJson(record, false);
    report.data["account"] = paired.account;
    report.text =
        "This appliance reaches the other one:\n" + credText(record, false, paired.account);
    if (paired.back.isNull()) {
        report.text += "The other one has no credential for this appliance; `ovradr cred reverse " +
                       record.credId.substr(0, 8) + " --account NAME` has it make one.\n";
        return report;
    }
    report.data["back"] = OvraDRCore::maskSecrets(paired.back);
    report.data["local_account"] = paired.localAccount;
    const Conn conn = Conn::fromJson(paired.back);
    report.text += "The other one reaches this appliance:\n" +
                   listing({{"credential", memberString(paired.back, "cred_id")},
                            {"held by", record.nodeId},
                            {"endpoint", conn.isValid() ? targetText(conn) : ""},
                            {"account", paired.localAccount},
                            {"kind", "lasting"}});
    return report;
}

/// An endpoint of the code at which the appliance of the code is, and its whole fingerprint.
struct Found {
    Conn conn;
    Conn direct;
    std::string fingerprint;
};

/// Asks all endpoints of the code for their keys; the first one in the order of the code counts.
Expected<Found> findAppliance(const InviteCode &code) {
    std::vector<std::pair<Expected<Conn>, std::future<CredExpected<PeerIdentity>>>> tries;
    for (const Conn &conn : code.endpoints) {
        const Expected<Conn> direct = directEndpoint(conn);
        std::future<CredExpected<PeerIdentity>> answer;
        if (direct) {
            answer = std::async(std::launch::async, [place = *direct] {
                return OvraPlatform::peerFingerprint(place.protocol, place.addr, place.port,
                                                     kTrySeconds);
            });
        }
        tries.emplace_back(direct, std::move(answer));
    }
    std::string others;
    std::string reasons;
    for (std::size_t i = 0; i < tries.size(); ++i) {
        const Conn &conn = code.endpoints[i];
        const Expected<Conn> &direct = tries[i].first;
        if (!direct) {
            reasons += "  " + printable(direct.error().message) + "\n";
            continue;
        }
        const CredExpected<PeerIdentity> met = tries[i].second.get();
        if (met && code.isOf(met->fingerprint)) {
            return Found{conn, *direct, met->fingerprint};
        }
        if (met) {
            others += (others.empty() ? "" : ", ") + targetText(conn);
        } else {
            reasons +=
                "  " + printable(endpointFailure(*direct, met.error()).value().message) + "\n";
        }
    }
    Refusal refused =
        others.empty()
            ? failure(ExitCode::kNotReachable, "None of the endpoints of the code answers here.",
                      "Check the network between the appliances, or have the code name others "
                      "with `ovradr invite --endpoint URL`.")
            : failure(ExitCode::kCertificate,
                      "The code is for another appliance than the one at " + others +
                          ", whose key is another one.",
                      "Have the code compared and the addresses checked; somebody may be in "
                      "between.");
    refused.value().text = reasons;
    const std::int64_t late = std::time(nullptr) - code.expires;
    if (late > 0) {
        refused.value().hint +=
            " By the clock of this appliance the code ended at " + timeText(code.expires) + ".";
    }
    return refused;
}

/// Trusts the key of the code from now on, or as long as `undo` says.
Expected<void> trustFound(const Found &found, Undo &undo) {
    const std::string key =
        OvraPlatform::trustKey(found.direct.protocol, found.direct.addr, found.direct.port);
    const auto before = TrustStore().find(key);
    auto trusted = trustPeer(found.direct, found.fingerprint);
    if (trusted && (!before || before->value != found.fingerprint)) {
        undo.add([key, value = found.fingerprint, before] {
            (void)TrustStore().undoTrust(key, value, before); // the log says why not
        });
    }
    return trusted;
}

const char *refusalName(int code) {
    switch (static_cast<InviteRefusal>(code)) {
    case InviteRefusal::kUnknown:
        return "invite_unknown";
    case InviteRefusal::kUsed:
        return "invite_used";
    case InviteRefusal::kExpired:
        return "invite_expired";
    case InviteRefusal::kRevoked:
        return "invite_revoked";
    case InviteRefusal::kAccount:
        return "invite_account";
    default:
        return nullptr;
    }
}

/// Why the invitation was not granted. The sentence of the appliance says what is wrong and, behind
/// a colon, what to do.
Refusal notGranted(const Conn &conn, const Response &answer) {
    const int code = answer.getErrCode();
    const char *const name = refusalName(code);
    if (name == nullptr) {
        Refusal found = failureOf(code, answer.getErrMsg());
        found.value().message.insert(0, targetText(conn) + ": ");
        return found;
    }
    const std::string text = answer.getErrMsg().isString() ? answer.getErrMsg().asString() : name;
    const std::size_t colon = text.find(": ");
    std::string hint = colon == std::string::npos ? "" : text.substr(colon + 2) + ".";
    if (!hint.empty() && hint.front() >= 'a' && hint.front() <= 'z') {
        hint.front() = static_cast<char>(hint.front() - 'a' + 'A');
    }
    Refusal found = failure(ExitCode::kLoginRefused,
                            targetText(conn) + ": " + text.substr(0, colon) + ".", hint);
    found.value().code = code;
    found.value().name = name;
    return found;
}

/// Takes the invitation up. \return a session
Expected<Secret> redeem(const Found &found, const InviteCode &code, std::string &account) {
    Json::Value params;
    params["invite"] = code.reference;
    params["secret"] = code.secret.get();
    params["node_id"] = DRNode::getLocalNodeId();
    const Expected<Response> answer =
        callOpen(found.direct,
                 {OvraApps::kInviteApi, OvraApps::kInviteVersion, OvraApps::kRedeem, params, true});
    if (!answer) {
        return Refusal(answer.error());
    }
    std::string sid = answer->getDataFieldtoStr("sid");
    if (!answer->isSuccess() || sid.empty()) {
        return notGranted(found.conn, *answer);
    }
    account = answer->getDataFieldtoStr("account");
    return Secret::take(sid);
}

void endSession(const Conn &conn, const Secret &session) {
    OvraDRNode::CredSessionSender sender(conn, session.get());
    (void)sender.process(OvraDRNode::WebAPI::getDRNodeSessionDeleteAPI(session.get()));
}

Outcome pairByCode(const PairOptions &options, const std::string &text) {
    const Expected<InviteCode> code = readInviteCode(text);
    if (!code) {
        return Refusal(code.error());
    }
    if (code->isOf(ownFingerprint(Conn::https("localhost", kDefaultHttpsPort)))) {
        return failure(ExitCode::kUsage, "The code is one of this appliance itself.",
                       "Use it on the other one.");
    }
    const Expected<WayBack> wayBack = prepareBack(options, options.both);
    if (!wayBack) {
        return Refusal(wayBack.error());
    }
    Progress progress;
    progress.say("looking for the appliance of the code");
    const Expected<Found> found = findAppliance(*code);
    if (!found) {
        return Refusal(found.error());
    }
    // Another one of this appliance that fails must not take back the key while this one needs it.
    const OvraApps::SessionLock turn("pair " + found->fingerprint,
                                     OvraApps::SessionLock::Purpose::kRelease);
    if (turn.isBusy()) {
        return busyFailure();
    }
    Undo undo;
    if (const auto trusted = trustFound(*found, undo); !trusted) {
        return Refusal(trusted.error());
    }
    progress.say(options.both ? "pairing both ways" : "pairing");
    std::string account;
    const Expected<Secret> session = redeem(*found, *code, account);
    if (!session) {
        return Refusal(session.error());
    }
    OvraDRNode::DRNodeCredCreate flow;
    Expected<Paired> paired = flow.setCred(found->conn, session->get())
                                  ? pairBy(flow, found->conn, *wayBack)
                                  : Expected<Paired>(creationFailure(flow, found->conn));
    endSession(found->conn, *session);
    if (!paired) {
        paired.error().hint += " The code is spent: ask for a new one.";
        return Refusal(paired.error());
    }
    undo.keep();
    paired->account = account;
    return report(*paired);
}

/// Asks for what is missing on the way, where somebody can be asked.
Outcome pairByUrl(PairOptions options, const std::string &url) {
    const Expected<Conn> conn = parseTarget(url);
    if (!conn) {
        return Refusal(conn.error());
    }
    const Expected<Conn> direct = directEndpoint(*conn);
    if (!direct) {
        return Refusal(direct.error());
    }
    if (const auto answers = probeEndpoint(*direct); !answers) {
        return Refusal(answers.error());
    }
    if (const auto trusted = trustPeer(*direct, options.fingerprint); !trusted) {
        return Refusal(trusted.error());
    }
    if (options.login.account.empty()) {
        if (!isInteractive()) {
            return failure(ExitCode::kUsage,
                           "There is no terminal on which the account could be asked for.",
                           "Give it with --account, or a code in place of the URL.");
        }
        const Expected<Secret> account = askLine("Account on " + conn->addr);
        if (!account) {
            return Refusal(account.error());
        }
        options.login.account = account->get();
    }
    const bool both =
        options.both || (isInteractive() && confirm("Shall the other appliance get a credential "
                                                    "for this one as well?"));
    const Expected<WayBack> wayBack = prepareBack(options, both);
    if (!wayBack) {
        return Refusal(wayBack.error());
    }
    OvraDRNode::DRNodeCredCreate flow;
    Expected<Paired> paired = proveByAccount(flow, options.login, *conn).and_then([&] {
        return pairBy(flow, *conn, *wayBack);
    });
    if (!paired) {
        return Refusal(paired.error());
    }
    paired->account = options.login.account;
    return report(*paired);
}

/// What was given as the target, or typed, or stands in standard input.
Expected<Secret> obtainTarget(const PairOptions &options) {
    std::string joined;
    for (const std::string &part : options.target) {
        joined += part;
    }
    if (joined == kStandardInput) {
        PasswordSource source;
        source.fromStdin = true;
        return obtainPassword(source, "Code", false);
    }
    if (!joined.empty()) {
        return Secret::take(joined);
    }
    if (!isInteractive()) {
        return failure(ExitCode::kUsage, "There is neither a code nor a URL.",
                       "Give one, or \"-\" to read it from standard input.");
    }
    return askLine("Code that `ovradr invite` showed on the other appliance, or its URL");
}

Outcome pair(const PairOptions &options) {
    const Expected<Secret> target = obtainTarget(options);
    if (!target) {
        return Refusal(target.error());
    }
    if (const auto usable = checkNodeDatabase(); !usable) {
        return Refusal(usable.error());
    }
    // No code has a colon in it.
    const bool isUrl = target->get().find(':') != std::string::npos;
    if (!isUrl && !(options.login.account + options.fingerprint).empty()) {
        return failure(ExitCode::kUsage, "--account and --fingerprint are for a URL.",
                       "A code says both: leave them out.");
    }
    return isUrl ? pairByUrl(options, target->get()) : pairByCode(options, target->get());
}

} // namespace

void addPairCommand(CLI::App &app, Command &chosen) {
    CLI::App *command =
        app.add_subcommand("pair", "Pair with another appliance, by its code or its URL.");
    const auto options = std::make_shared<PairOptions>();
    command->add_option("CODE", options->target,
                        "What `ovradr invite` showed there, \"-\" to read it from standard input; "
                        "or a URL, as for cred create");
    command->add_flag("--both", options->both,
                      "The other appliance gets a credential for this one as well");
    command->add_option("--local-account", options->localAccount,
                        "Account of this appliance with whose rights the other one comes then "
                        "(pairing, which is made)");
    addRemoteLoginOptions(*command, options->login);
    addFingerprintOption(*command, options->fingerprint);
    command->footer("Without an argument the code is asked for. With a URL the key, the account, "
                    "the password\nand the one-time code are.\n"
                    "Examples:\n"
                    "  ovradr pair 22TQ8-... --both\n"
                    "  ovradr pair - < code\n"
                    "  ovradr pair https://nas2");
    command->callback(
        [&chosen, options] { chosen = forOwnUser([options] { return pair(*options); }); });
}

} // namespace Ovradr
