// SPDX-License-Identifier: Apache-2.0
#include "commands/commands.h"
#include "node_ref.h"
#include "output.h"
#include "provision/node_database.h"
#include "service/certificate.h"
#include "shared/overview.h"
#include "status_view.h"

#include <ovradrcore/json.h>
#include <ovradrnode/sender.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/appliance.h>
#include <ovraplatform/sealed_box.h>

#include <poll.h>
#include <sys/ioctl.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <csignal>
#include <cstdio>
#include <ctime>
#include <memory>
#include <optional>
#include <utility>

namespace Ovradr {

namespace {

using OvraApps::OverviewRequest;
using OvraDRCore::Request;
using OvraDRCore::Response;

struct StatusOptions {
    bool all = false;
    double watch = 0; ///< seconds; 0: once
};

Response askDaemon(std::size_t offset, std::size_t limit) {
    Request request;
    request.setAPI("OVRA.DR.Status");
    request.setMethod("overview");
    request.setVersion(1);
    request.addParam("offset", Json::UInt64{offset});
    request.addParam("limit", Json::UInt64{limit});
    return OvraDRNode::BaseSender::run(request);
}

/// What this process can tell by itself.
Json::Value withoutDaemon(std::size_t offset, std::size_t limit) {
    OverviewRequest request;
    request.httpsKey = OvraService::certificateFingerprint(OvraPlatform::kTlsCertificateFile);
    const auto keys = OvraPlatform::SealKeyPair::load(OvraPlatform::kSealKeyFile);
    request.httpKey = keys ? OvraPlatform::fingerprintOf(keys->publicKey()) : "";
    request.version = OVRADR_VERSION;
    request.offset = offset;
    request.limit = limit;
    return OvraApps::makeOverview(request);
}

Json::Value daemonProblem(const Response &answer) {
    const bool silent = answer.getErrCode() == OvraPlatform::APIError::kInternal;
    Json::Value problem(Json::objectValue);
    problem["kind"] = "daemon";
    problem["exit"] = static_cast<int>(ExitCode::kNotReachable);
    problem["message"] = silent ? "The daemon of this appliance does not answer."
                                : "The daemon of this appliance does not know this command.";
    problem["hint"] = silent ? "Start ovradrd, and read what it says in the system log."
                             : "It is of another version than the command: start it again.";
    problem["command"] = "ovradrd";
    return problem;
}

bool isOverview(const Json::Value &document) {
    return document.isObject() && document["peers"].isArray() && document["problems"].isArray() &&
           document["problem_count"].isUInt64();
}

/// Everything that is known, page by page; if nobody else says it, first of all that.
Json::Value overviewNow(const StatusOptions &options) {
    const std::size_t limit = options.all ? OverviewRequest::kMaxPeers : OverviewRequest().limit;
    const Response answer = askDaemon(0, limit);
    const bool asked = answer.isSuccess() && isOverview(answer.getData());
    Json::Value overview = asked ? answer.getData() : withoutDaemon(0, limit);
    while (options.all && overview["next"].isUInt64()) {
        const std::size_t offset = overview["next"].asUInt64();
        const Json::Value page =
            asked ? askDaemon(offset, limit).getData() : withoutDaemon(offset, limit);
        overview.removeMember("next");
        if (!isOverview(page)) {
            break;
        }
        for (const Json::Value &peer : page["peers"]) {
            overview["peers"].append(peer);
        }
        if (page.isMember("next")) {
            overview["next"] = page["next"];
        }
    }
    if (!asked) {
        Json::Value problems(Json::arrayValue);
        problems.append(daemonProblem(answer));
        for (const Json::Value &other : overview["problems"]) {
            problems.append(other);
        }
        overview["problems"] = std::move(problems);
        overview["problem_count"] = overview["problem_count"].asUInt64() + 1;
    }
    return overview;
}

/// The exit code is that of the first problem.
Outcome outcomeOf(const Json::Value &overview) {
    Report report{overview, statusText(overview)};
    const Json::Value &problems = overview["problems"];
    if (!problems.isArray() || problems.empty()) {
        return report;
    }
    const Json::Value &exit = problems[0]["exit"];
    const Json::UInt64 count = overview["problem_count"].asUInt64();
    Refusal found = failure(exit.isInt() ? static_cast<ExitCode>(exit.asInt()) : ExitCode::kFailed,
                            count == 1 ? "There is a problem."
                                       : "There are " + std::to_string(count) + " problems.",
                            "");
    found.value().data = std::move(report.data);
    found.value().text = report.text;
    return found;
}

/// Waits for the end of the pause. \return false if the person has had enough
bool pauseFor(double seconds, int signals) {
    pollfd waiting{signals, POLLIN, 0};
    return poll(&waiting, 1, static_cast<int>(seconds * 1000)) == 0;
}

/// A terminal whose whole screen is drawn anew again and again, in one write each time and without
/// clearing it first, so that it never flickers. What was on it before is there again at the end.
class WatchScreen {
public:
    WatchScreen()
        : isTerminal_(isatty(STDOUT_FILENO) != 0) {
        put("\x1b[?1049h\x1b[?25l"); // xterm's other screen; no cursor
    }
    WatchScreen(const WatchScreen &) = delete;
    WatchScreen &operator=(const WatchScreen &) = delete;
    ~WatchScreen() { put("\x1b[?25h\x1b[?1049l"); }

    void draw(const std::string &text) {
        winsize size{};
        const bool known = ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0;
        const std::size_t columns = known ? size.ws_col : 80U;
        const std::size_t rows = known && size.ws_row > 1 ? size.ws_row - 1U : 23U;
        const std::string fitted = screenful(text, columns, rows);
        std::string frame = "\x1b[H"; // ECMA-48: CUP, then EL behind each line and ED at the end
        for (const char c : fitted) {
            frame += c == '\n' ? std::string("\x1b[K\r\n") : std::string(1, c);
        }
        put(frame + "\x1b[J");
    }
    bool isTerminal() const { return isTerminal_; }

private:
    void put(const std::string &text) const {
        if (isTerminal_) {
            std::fwrite(text.data(), 1, text.size(), stdout);
            std::fflush(stdout);
        }
    }

    bool isTerminal_;
};

Expected<void> mayLook() {
    const Expected<std::string> local = localNode();
    if (!local) {
        return Refusal(local.error());
    }
    return checkNodeDatabase();
}

/// Draws until a signal; the last look, on the screen that was there before, is the outcome.
Outcome watch(const StatusOptions &options, bool json) {
    if (!json && isatty(STDOUT_FILENO) == 0) {
        return failure(ExitCode::kUsage, "There is no terminal to draw on.",
                       "Leave --watch out, or add --json for one document a line.");
    }
    sigset_t ends;
    sigemptyset(&ends);
    for (const int signal : {SIGINT, SIGTERM, SIGHUP}) {
        sigaddset(&ends, signal);
    }
    sigprocmask(SIG_BLOCK, &ends, nullptr);
    const int signals = signalfd(-1, &ends, SFD_CLOEXEC);
    {
        std::optional<WatchScreen> screen;
        if (!json) {
            screen.emplace();
        }
        do {
            const Outcome last = outcomeOf(overviewNow(options));
            if (json) {
                (void)tell(last, true);
            } else {
                screen->draw((last ? last->text : last.error().text) + "\nEvery " +
                             std::to_string(static_cast<int>(options.watch)) +
                             " s; Ctrl-C ends it.\n");
            }
        } while (std::ferror(stdout) == 0 && pauseFor(options.watch, signals));
    }
    close(signals);
    return outcomeOf(overviewNow(options));
}

} // namespace

void addStatusCommand(CLI::App &app, Command &chosen) {
    CLI::App *command =
        app.add_subcommand("status", "Show this node, its peers in both directions, and what is "
                                     "wrong, on one screen.");
    const auto options = std::make_shared<StatusOptions>();
    command->add_flag("--all", options->all, "More than 1000 nodes, where there are more");
    command
        ->add_option("--watch", options->watch,
                     "Draw it again every SECONDS (2 without a number) until Ctrl-C")
        ->expected(0, 1)
        ->default_str("2")
        ->check(CLI::Range(1.0, 3600.0))
        ->type_name("SECONDS");
    command->footer("The exit code is 0 if nothing is wrong, else that of the first problem: 3 no "
                    "answer,\n4 session lost, 6 key changed, 8 not permitted, 12 wrong node, 13 "
                    "clock.\n"
                    "Examples:\n"
                    "  ovradr status\n"
                    "  ovradr status --watch");
    command->callback([&chosen, &app, options] {
        chosen = [&app, options]() -> Outcome {
            if (const auto ready = mayLook(); !ready) {
                return Refusal(ready.error());
            }
            return options->watch > 0 ? watch(*options, app.get_option("--json")->count() > 0)
                                      : outcomeOf(overviewNow(*options));
        };
    });
}

} // namespace Ovradr
