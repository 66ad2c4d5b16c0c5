// SPDX-License-Identifier: Apache-2.0
#include "commands/commands.h"
#include "output.h"
#include "qr.h"

#include <ovradrnode/dr_node.h>
#include <ovraplatform/account_store.h>
#include <ovraplatform/session_store.h>
#include <ovraplatform/totp.h>

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <cstdio>
#include <ctime>
#include <memory>
#include <vector>

namespace Ovradr {

namespace {

using OvraPlatform::Account;
using OvraPlatform::AccountStore;
using OvraPlatform::Role;
using OvraPlatform::SessionRecord;
using OvraPlatform::SessionStore;

struct UserOptions {
    std::string name;
    bool administrator = false;
    std::string role;
    bool off = false;
    bool show = false;
    bool yes = false;
    bool dryRun = false;
    PasswordSource password;
};

Expected<void> checkOpen(const AccountStore &store) {
    return store.isOpen() ? Expected<void>() : storeFailure(ExitCode::kNotSetUp, store.error());
}

/// The account, or why it is not available.
Expected<Account> findAccount(AccountStore &store, const std::string &name) {
    if (const auto open = checkOpen(store); !open) {
        return Refusal(open.error());
    }
    const auto account = store.find(name);
    if (account) {
        return *account;
    }
    if (!store.error().empty()) {
        return storeFailure(ExitCode::kNotSetUp, store.error());
    }
    return failure(ExitCode::kNotFound, "There is no account \"" + name + "\".",
                   "`ovradr user list` shows all.");
}

Json::Value toJson(const Account &account) {
    Json::Value json;
    json["name"] = account.name;
    json["role"] = OvraPlatform::roleWord(account.role);
    json["administrator"] = account.isAdministrator();
    json["disabled"] = account.disabled;
    json["remote_login"] = account.remoteLogin;
    json["one_time_code"] = account.oneTimeCode;
    json["created"] = Json::Int64(account.created);
    return json;
}

/// The report of a changed account.
Outcome changed(AccountStore &store, const std::string &name, const std::string &sentence) {
    return findAccount(store, name).map([&sentence](const Account &account) {
        Report report;
        report.data["user"] = toJson(account);
        report.text = printable(sentence) + "\n";
        return report;
    });
}

/// Ends every session of the account, including those granted to nodes: their holders could still
/// act as the user.
Expected<int> endSessions(const std::string &user) {
    SessionStore sessions;
    int ended = 0;
    const bool done =
        sessions.isOpen() && sessions.removeIf([&user, &ended](const SessionRecord &session) {
            ended += session.user == user ? 1 : 0;
            return session.user == user;
        });
    return done ? Expected<int>(ended) : storeFailure(ExitCode::kNotSetUp, sessions.error());
}

constexpr std::array kRoles = {Role::kUser, Role::kPairing, Role::kAdministrator};

/// For the command line: "" if it is a role, otherwise what is wrong.
std::string checkRole(const std::string &word) {
    const bool known = std::any_of(kRoles.begin(), kRoles.end(), [&word](Role role) {
        return word == OvraPlatform::roleWord(role);
    });
    return known ? "" : "a role is user, pairing or administrator";
}

Role chosenRole(const UserOptions &options) {
    const auto *const named = std::find_if(kRoles.begin(), kRoles.end(), [&options](Role role) {
        return options.role == OvraPlatform::roleWord(role);
    });
    if (named != kRoles.end()) {
        return *named;
    }
    return options.administrator ? Role::kAdministrator : Role::kUser;
}

Expected<int> countSessions(const std::string &user) {
    SessionStore store;
    std::vector<SessionRecord> sessions;
    if (!store.isOpen() || !store.list(sessions)) {
        return storeFailure(ExitCode::kNotSetUp, store.error());
    }
    return static_cast<int>(
        std::count_if(sessions.begin(), sessions.end(),
                      [&user](const SessionRecord &session) { return session.user == user; }));
}

Outcome add(const UserOptions &options) {
    AccountStore store;
    if (const auto open = checkOpen(store); !open) {
        return Refusal(open.error());
    }
    if (!AccountStore::isName(options.name)) {
        return failure(ExitCode::kUsage, "\"" + options.name + "\" is not an account name.",
                       "Use 1 to 64 letters, digits, \".\", \"_\", \"-\" or \"@\", the first one a "
                       "letter, a digit or \"_\".");
    }
    if (store.exists(options.name)) {
        return failure(ExitCode::kFailed, "There is an account \"" + options.name + "\" already.",
                       "Choose another name, or set its password with `ovradr user passwd`.");
    }
    const Expected<Secret> password =
        obtainPassword(options.password, "Password of " + options.name, true);
    if (!password) {
        return Refusal(password.error());
    }
    if (!store.add(options.name, password->get(), chosenRole(options))) {
        return storeFailure(ExitCode::kFailed, store.error());
    }
    return changed(store, options.name,
                   "The account " + options.name + " was added, with the role " +
                       OvraPlatform::roleWord(chosenRole(options)) + ".");
}

Outcome list() {
    AccountStore store;
    if (const auto open = checkOpen(store); !open) {
        return Refusal(open.error());
    }
    std::vector<Account> accounts;
    if (!store.list(accounts)) {
        return storeFailure(ExitCode::kNotSetUp, store.error());
    }
    Report report;
    report.data["users"] = Json::Value(Json::arrayValue);
    std::vector<std::vector<std::string>> rows;
    for (const Account &account : accounts) {
        report.data["users"].append(toJson(account));
        const char *login = !account.remoteLogin ? "not over the network" : "yes";
        rows.push_back({account.name, OvraPlatform::roleWord(account.role),
                        account.disabled ? "disabled" : login, account.oneTimeCode ? "yes" : "no",
                        whenText(account.created)});
    }
    report.text = rows.empty()
                      ? "There are no accounts; `ovradr user add NAME` makes one.\n"
                      : table({"NAME", "ROLE", "LOG-IN", "ONE-TIME CODE", "CREATED"}, rows);
    return report;
}

Outcome setPassword(AccountStore &store, const Account &account, const UserOptions &options) {
    const Expected<Secret> password =
        obtainPassword(options.password, "New password of " + account.name, true);
    if (!password) {
        return Refusal(password.error());
    }
    if (!store.setPassword(account.name, password->get())) {
        return storeFailure(ExitCode::kFailed, store.error());
    }
    return changed(store, account.name, "The password of " + account.name + " was set.");
}

Outcome switchTotpOff(AccountStore &store, const std::string &name) {
    if (!store.clearTotp(name)) {
        return storeFailure(ExitCode::kFailed, store.error());
    }
    return changed(store, name, "The account " + name + " needs no one-time code any more.");
}

/// Whether somebody can read the secret here and type a code.
bool isAtTerminal() {
    return isInteractive() && isatty(STDOUT_FILENO) == 1;
}

/// Shows the secret to a person, and has a code of the authenticator typed: an account must not
/// depend on one that did not get it.
Expected<void> confirmTotp(const std::string &uri, const std::string &secret) {
    constexpr int kTries = 3;
    std::fprintf(stderr, "%s%sGive this to the authenticator; it is not shown again.\n",
                 qrForTerminal(uri).c_str(), listing({{"URI", uri}, {"secret", secret}}).c_str());
    for (int i = 0; i < kTries; ++i) {
        const Expected<Secret> code = askLine("The code that it shows now");
        if (!code) {
            return Refusal(code.error());
        }
        if (OvraPlatform::matchTotp(secret, code->get(), std::time(nullptr))) {
            return {};
        }
        std::fprintf(stderr, "That is not the code for %s by the clock of this appliance.\n",
                     timeText(std::time(nullptr)).c_str());
    }
    return failure(ExitCode::kOneTimeCode, "No code was right: log-ins need none, as before.",
                   "Remove the entry from the authenticator, set the clocks, and try again.");
}

Outcome switchTotpOn(AccountStore &store, const std::string &name) {
    std::string secret = OvraPlatform::newTotpSecret();
    const OvraBase::WipeAtEnd wiped(secret);
    if (secret.empty()) {
        return storeFailure(ExitCode::kFailed, "The system gives no random numbers.");
    }
    const std::string uri =
        OvraPlatform::totpUri(OvraDRNode::DRNode::getLocalHostName(), name, secret);
    const bool confirms = isAtTerminal();
    if (const auto confirmed = confirms ? confirmTotp(uri, secret) : Expected<void>(); !confirmed) {
        return Refusal(confirmed.error());
    }
    if (!store.setTotp(name, secret)) {
        return storeFailure(ExitCode::kFailed, store.error());
    }
    Report report;
    report.data["account"] = name;
    report.data["uri"] = uri;
    report.data["secret"] = secret;
    report.text = "The account " + printable(name) + " needs a one-time code from now on." +
                  (confirms ? "\n"
                            : " Give this to its authenticator; it is not shown again.\n" +
                                  listing({{"URI", uri}, {"secret", secret}}));
    return report;
}

Outcome setTotp(AccountStore &store, const Account &account, const UserOptions &options) {
    if (options.off) {
        return switchTotpOff(store, account.name);
    }
    if (account.oneTimeCode) {
        return failure(ExitCode::kFailed,
                       "The account \"" + account.name + "\" needs a one-time code already.",
                       "For a new secret run `ovradr user totp " + account.name + " --off` first.");
    }
    if (!options.show && isatty(STDOUT_FILENO) != 1) {
        return failure(ExitCode::kUsage,
                       "The secret is shown once, and the output is not a terminal.",
                       "Add --show if the output goes where it is safe.");
    }
    return switchTotpOn(store, account.name);
}

Outcome setDisabled(AccountStore &store, const Account &account, const UserOptions &options) {
    if (!store.setDisabled(account.name, !options.off)) {
        return storeFailure(ExitCode::kFailed, store.error());
    }
    return changed(store, account.name,
                   "The account " + account.name +
                       (options.off
                            ? " can log in again."
                            : " is disabled; its sessions rest until it is enabled again."));
}

Expected<void> confirmRemoval(const std::string &name, int sessions) {
    if (!isInteractive()) {
        return failure(ExitCode::kUsage, "There is no terminal on which this could be confirmed.",
                       "Add --yes if you mean it; --dry-run tells what would end.");
    }
    return confirm(printable("The account " + name + " has " +
                             counted(static_cast<std::size_t>(sessions), "session") +
                             ", which would end; nodes that use them have to pair again. Remove "
                             "it?"))
               ? Expected<void>()
               : failure(ExitCode::kFailed, "The account stays.", "");
}

Report removalReport(const std::string &name, int sessions, bool foreseen) {
    Report report;
    report.data["name"] = name;
    report.data[foreseen ? "would_end_sessions" : "ended_sessions"] = sessions;
    const std::string ends =
        sessions == 0 ? "."
                      : ", and " + counted(static_cast<std::size_t>(sessions), "session") +
                            (foreseen ? " of it would end." : " of it ended.");
    report.text = printable("The account " + name +
                            (foreseen ? " would be removed" : " was removed") + ends) +
                  "\n";
    return report;
}

/// Disabled first: nothing is granted to it meanwhile, and an interrupted removal can be repeated.
Outcome remove(AccountStore &store, const Account &account, const UserOptions &options) {
    const Expected<int> present = countSessions(account.name);
    if (!present) {
        return Refusal(present.error());
    }
    if (options.dryRun) {
        return removalReport(account.name, *present, true);
    }
    if (*present > 0 && !options.yes) {
        if (const auto confirmed = confirmRemoval(account.name, *present); !confirmed) {
            return Refusal(confirmed.error());
        }
    }
    if (!store.setDisabled(account.name, true)) {
        return storeFailure(ExitCode::kFailed, store.error());
    }
    const Expected<int> ended = endSessions(account.name);
    if (!ended) {
        return Refusal(ended.error());
    }
    if (!store.remove(account.name)) {
        return storeFailure(ExitCode::kFailed, store.error());
    }
    return removalReport(account.name, *ended, false);
}

/// Performs an operation on the named account.
template <Outcome (*kAction)(AccountStore &, const Account &, const UserOptions &)>
Outcome onAccount(const UserOptions &options) {
    AccountStore store;
    return findAccount(store, options.name).and_then([&](const Account &account) {
        return kAction(store, account, options);
    });
}

using UserAction = Outcome (*)(const UserOptions &);

/// A command of the family for one account.
CLI::App *addUserCommand(CLI::App &family, const char *name, const char *description,
                         const std::shared_ptr<UserOptions> &options, Command &chosen,
                         UserAction action) {
    CLI::App *command = family.add_subcommand(name, description);
    command->add_option("NAME", options->name, "The account")->required();
    command->callback(
        [&chosen, options, action] { chosen = [options, action] { return action(*options); }; });
    return command;
}

} // namespace

void addPasswordOptions(CLI::App &command, PasswordSource &source) {
    CLI::Option *file = command.add_option("--password-file", source.file,
                                           "A file whose first line is the password");
    command.add_flag("--password-stdin", source.fromStdin, "Read the password from standard input")
        ->excludes(file);
}

void addUserCommands(CLI::App &app, Command &chosen) {
    CLI::App *family = app.add_subcommand("user", "The accounts of this appliance.");
    family->require_subcommand(1);
    const auto options = std::make_shared<UserOptions>();

    CLI::App *adding = addUserCommand(*family, "add", "Add an account.", options, chosen, add);
    CLI::Option *admin =
        adding->add_flag("--admin", options->administrator, "Short for --role administrator");
    adding
        ->add_option("--role", options->role,
                     "user (the default), pairing (may pair, and send requests of the node web "
                     "API) or administrator")
        ->check(checkRole)
        ->excludes(admin);
    addPasswordOptions(*adding, options->password);
    adding->footer("Without an option the password is asked for.\n"
                   "Examples:\n"
                   "  ovradr user add repl --role pairing\n"
                   "  ovradr user add repl --admin --password-file /root/repl.password");

    CLI::App *listing = family->add_subcommand("list", "List the accounts.");
    listing->footer("Example:\n  ovradr user list --json");
    listing->callback([&chosen] { chosen = list; });

    CLI::App *passwd = addUserCommand(*family, "passwd", "Set the password of an account.", options,
                                      chosen, onAccount<setPassword>);
    addPasswordOptions(*passwd, options->password);
    passwd->footer("Example:\n  ovradr user passwd repl");

    CLI::App *totp = addUserCommand(*family, "totp", "Have log-ins ask for a one-time code.",
                                    options, chosen, onAccount<setTotp>);
    CLI::Option *off = totp->add_flag("--off", options->off, "Do not ask any more");
    totp->add_flag("--show", options->show, "Show the secret although this is not a terminal")
        ->excludes(off);
    totp->footer("Example:\n  ovradr user totp repl");

    CLI::App *disable =
        addUserCommand(*family, "disable", "Disable an account and rest its sessions.", options,
                       chosen, onAccount<setDisabled>);
    disable->add_flag("--off", options->off, "Enable it again");
    disable->footer("Example:\n  ovradr user disable repl");

    CLI::App *removal = addUserCommand(*family, "remove", "Remove an account and end its sessions.",
                                       options, chosen, onAccount<remove>);
    removal->add_flag("--yes", options->yes, "Do not ask, also when it has sessions");
    removal->add_flag("--dry-run", options->dryRun, "Only tell what would end");
    removal->footer("Examples:\n"
                    "  ovradr user remove repl --dry-run\n"
                    "  ovradr user remove repl");
}

} // namespace Ovradr
