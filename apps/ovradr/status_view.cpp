// SPDX-License-Identifier: Apache-2.0
#include "status_view.h"

#include "node_view.h"
#include "output.h"
#include "target.h"

#include <ovrabase/utf8.h>
#include <ovradrcore/json.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <utility>
#include <vector>

namespace Ovradr {

namespace {

using OvraDRCore::memberString;
using OvraDRNode::Conn;
using Rows = std::vector<std::vector<std::string>>;

/// The overview, by whom it was made, is well-formed; what is absent reads as null.
const Json::Value &member(const Json::Value &object, const char *name) {
    return object.isObject() ? object[name] : Json::Value::nullSingleton();
}

std::int64_t timeIn(const Json::Value &object, const char *name) {
    const Json::Value &time = member(object, name);
    return time.isInt64() ? time.asInt64() : 0;
}

std::string agoText(std::int64_t then, std::int64_t now) {
    return ageText(static_cast<double>(std::max<std::int64_t>(now - then, 0))) + " ago";
}

std::string dayText(std::int64_t time) {
    return time > 0 ? timeText(time).substr(0, sizeof("2026-01-31") - 1) : "";
}

Conn connIn(const Json::Value &object) {
    const Json::Value &port = member(object, "port");
    return {memberString(object, "addr"), memberString(object, "protocol"),
            port.isInt() ? port.asInt() : 0};
}

/// With one digit behind the point.
std::string numberText(double number) {
    std::array<char, 64> text{};
    std::snprintf(text.data(), text.size(), "%.1f", number);
    return text.data();
}

std::string count(const Json::Value &number, const char *one, const char *many) {
    const Json::UInt64 n = number.isUInt64() ? number.asUInt64() : 0;
    return std::to_string(n) + " " + (n == 1 ? one : many);
}

std::string nameIn(const Json::Value &object) {
    const std::string name = memberString(object, "name");
    return name.empty() ? memberString(object, "node_id") : name;
}

/// "yes, since 2 h", "no, last seen 5 min ago", "was yes, 3 h ago", "unknown".
std::string answersText(const Json::Value &reach, std::int64_t now) {
    constexpr std::int64_t kFresh = 120; // seconds
    const Json::Value &answers = member(reach, "answers");
    if (reach.isNull()) {
        return "no credential";
    }
    if (!answers.isBool()) {
        return "unknown";
    }
    const std::int64_t asked = timeIn(reach, "asked");
    const std::int64_t since = timeIn(reach, "since");
    const std::int64_t seen = timeIn(reach, "last_seen");
    if (!answers.asBool()) {
        return seen > 0    ? "NO, last seen " + agoText(seen, now)
               : since > 0 ? "NO, since " + ageText(static_cast<double>(now - since))
                           : "NO, " + agoText(asked, now);
    }
    if (asked + kFresh < now) {
        return "was yes, " + agoText(asked, now);
    }
    return since > 0 ? "yes, since " + ageText(static_cast<double>(now - since))
                     : "yes, " + agoText(asked, now);
}

/// The way in use, else the first one.
const Json::Value &mainWay(const Json::Value &reach) {
    const Json::Value &ways = member(reach, "ways");
    for (const Json::Value &way : ways) {
        if (memberString(way, "use") == "next") {
            return way;
        }
    }
    return ways.isArray() && !ways.empty() ? ways[0] : Json::Value::nullSingleton();
}

/// "1", or "1 of 2" where one does not answer.
std::string spareText(const Json::Value &reach) {
    const Json::Value &ways = member(reach, "ways");
    if (!ways.isArray() || ways.empty()) {
        return "";
    }
    const std::size_t spare = ways.size() - 1;
    const Json::Value &used = mainWay(reach);
    const auto usable = std::count_if(ways.begin(), ways.end(), [&used](const Json::Value &way) {
        const Json::Value &answers = member(way, "answers");
        return &way != &used && !(answers.isBool() && !answers.asBool()) &&
               memberString(way, "use") != "invalid";
    });
    const std::string good = std::to_string(usable);
    return static_cast<std::size_t>(usable) == spare ? good : good + " of " + std::to_string(spare);
}

std::string reachedByText(const Json::Value &sessions, std::int64_t now) {
    if (!sessions.isArray() || sessions.empty()) {
        return "no session";
    }
    // The one that was used last speaks for all.
    const auto last =
        std::max_element(sessions.begin(), sessions.end(), [](const auto &left, const auto &right) {
            return timeIn(left, "last_used") < timeIn(right, "last_used");
        });
    const std::int64_t used = timeIn(*last, "last_used");
    return memberString(*last, "account") + ", " +
           (used > 0 ? "used " + agoText(used, now)
                     : "granted " + agoText(timeIn(*last, "since"), now)) +
           (sessions.size() > 1 ? " (" + std::to_string(sessions.size()) + " sessions)" : "");
}

std::string clockText(const Json::Value &peer) {
    const Json::Value &ahead = member(peer, "clock_ahead");
    return ahead.isNumeric()
               ? (ahead.asDouble() < 0 ? "" : "+") + numberText(ahead.asDouble()) + " s"
               : "";
}

std::vector<std::string> peerRow(const Json::Value &peer, std::int64_t now) {
    const Json::Value &reach = member(peer, "reach");
    const Json::Value &way = mainWay(reach);
    const Json::Value &latency = member(reach, "latency");
    return {memberString(peer, "name"),
            shortId(memberString(peer, "node_id")),
            answersText(reach, now),
            way.isNull() ? "" : targetText(connIn(way)),
            spareText(reach),
            latency.isNumeric() ? numberText(latency.asDouble()) + " ms" : "",
            reachedByText(member(peer, "reached_by"), now),
            dayText(timeIn(way, "trusted_since")),
            memberString(peer, "version"),
            clockText(peer)};
}

std::string ownText(const Json::Value &overview, std::int64_t now) {
    const Json::Value &node = member(overview, "node");
    const std::int64_t since = timeIn(node, "daemon_since");
    std::string text = listing({{"name", memberString(node, "name")},
                                {"node", memberString(node, "node_id")},
                                {"comment", memberString(node, "comment")},
                                {"version", memberString(node, "version")},
                                {"daemon", since > 0 ? "since " + timeText(since) + ", " +
                                                           ageText(static_cast<double>(now - since))
                                                     : ""}});
    Rows rows;
    for (const Json::Value &endpoint : member(node, "endpoints")) {
        rows.push_back({targetText(connIn(endpoint)), memberString(endpoint, "fingerprint")});
    }
    return text + (rows.empty() ? "" : table({"ENDPOINT", "FINGERPRINT"}, rows));
}

std::string problemText(const Json::Value &overview) {
    const Json::Value &problems = member(overview, "problems");
    if (!problems.isArray() || problems.empty()) {
        return "Nothing is wrong.\n";
    }
    std::string text = count(member(overview, "problem_count"), "problem", "problems") + ":\n";
    for (const Json::Value &problem : problems) {
        text += "  " + printable(memberString(problem, "message")) + " " +
                printable(memberString(problem, "hint")) + "\n";
        const std::string command = memberString(problem, "command");
        text += command.empty() ? "" : "      " + printable(command) + "\n";
    }
    const Json::Value &all = member(overview, "problem_count");
    if (all.isUInt64() && all.asUInt64() > problems.size()) {
        text += "  and " + std::to_string(all.asUInt64() - problems.size()) + " more.\n";
    }
    return text;
}

std::string peerText(const Json::Value &overview, std::int64_t now) {
    Rows rows;
    for (const Json::Value &peer : member(overview, "peers")) {
        rows.push_back(peerRow(peer, now));
    }
    if (rows.empty()) {
        return "No nodes are paired; `ovradr cred create URL --account NAME` pairs with one.\n";
    }
    std::string text = count(member(overview, "peer_count"), "node", "nodes") + ", of which " +
                       count(member(overview, "answering_count"), "answers", "answer") + ":\n" +
                       table({"NAME", "NODE", "ANSWERS", "OVER", "SPARE", "LATENCY", "REACHES US",
                              "KEY SINCE", "VERSION", "CLOCK"},
                             rows);
    const Json::Value &all = member(overview, "peer_count");
    return all.isUInt64() && all.asUInt64() > rows.size()
               ? text + "and " + std::to_string(all.asUInt64() - rows.size()) +
                     " more; --all shows them.\n"
               : text;
}

/// What ends, or waits.
std::string restText(const Json::Value &overview, std::int64_t now) {
    Rows temporary;
    for (const Json::Value &cred : member(overview, "temporary")) {
        const std::int64_t ends = timeIn(cred, "ends");
        temporary.push_back({nameIn(cred), shortId(memberString(cred, "cred_id")),
                             targetText(connIn(cred)),
                             ends == 0     ? "unknown"
                             : ends <= now ? "ended"
                                           : "in " + ageText(static_cast<double>(ends - now))});
    }
    Rows pending;
    for (const Json::Value &release : member(overview, "pending_releases")) {
        const Json::Value &attempts = member(release, "attempts");
        pending.push_back({nameIn(release), memberString(release, "reference"),
                           targetText(connIn(release)), agoText(timeIn(release, "since"), now),
                           attempts.isInt() ? std::to_string(attempts.asInt()) : ""});
    }
    return (temporary.empty() ? ""
                              : "\nTemporary credentials:\n" +
                                    table({"NODE", "CREDENTIAL", "ENDPOINT", "ENDS"}, temporary)) +
           (pending.empty()
                ? ""
                : "\nSessions that wait for their release, which ovradrd retries by itself:\n" +
                      table({"NODE", "SESSION", "ENDPOINT", "NOTED", "TRIES"}, pending));
}

} // namespace

std::string statusText(const Json::Value &overview) {
    const std::int64_t now = timeIn(overview, "time");
    return problemText(overview) + "\n" + peerText(overview, now) + restText(overview, now) + "\n" +
           ownText(overview, now);
}

std::string screenful(const std::string &text, std::size_t columns, std::size_t rows) {
    std::string screen;
    std::size_t line = 0;
    for (std::size_t begin = 0; begin < text.size() && line < rows; ++line) {
        const std::size_t end = std::min(text.find('\n', begin), text.size());
        std::string_view rest(text.data() + begin, end - begin);
        std::size_t used = 0;
        while (!rest.empty()) {
            const std::size_t size = std::max<std::size_t>(OvraBase::firstUtf8(rest).size, 1);
            const std::string character(rest.substr(0, size));
            used += displayWidth(character);
            if (used > columns) {
                break;
            }
            screen += character;
            rest.remove_prefix(size);
        }
        screen += '\n';
        begin = end + 1;
    }
    return screen;
}

} // namespace Ovradr
