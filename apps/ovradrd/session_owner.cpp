// SPDX-License-Identifier: Apache-2.0
#include "session_owner.h"

#include <ovraplatform/appliance.h>
#include <ovraplatform/session_store.h>

#include <sys/stat.h>

#include <memory>

namespace Ovradrd {

namespace {

/// A store of this thread.
template <typename Store>
class ThreadStore {
public:
    explicit ThreadStore(const char *path)
        : path_(path) {}

    Store &get() {
        const bool usable = store_ && store_->isOpen() && store_->error().empty();
        if (!usable || !isSameFile()) {
            store_ = std::make_unique<Store>(path_);
            note();
        }
        return *store_;
    }

private:
    bool isSameFile() const {
        struct stat now {};
        return stat(path_.c_str(), &now) == 0 && now.st_ino == opened_.st_ino &&
               now.st_dev == opened_.st_dev;
    }
    void note() {
        if (stat(path_.c_str(), &opened_) != 0) {
            opened_ = {};
        }
    }

    std::string path_;
    std::unique_ptr<Store> store_;
    struct stat opened_ {};
};

} // namespace

SessionOwner findSessionOwner(const std::string &sid) {
    thread_local ThreadStore<OvraPlatform::SessionStore> keptSessions(OvraPlatform::kSessionsFile);
    thread_local ThreadStore<OvraPlatform::AccountStore> keptAccounts(OvraPlatform::kAccountsFile);

    OvraPlatform::SessionStore &sessions = keptSessions.get();
    const auto session = sessions.find(sid);
    if (!sessions.error().empty()) {
        return {SessionOwner::State::kNotKnown, {}};
    }
    if (!session) {
        return {};
    }
    OvraPlatform::AccountStore &accounts = keptAccounts.get();
    const auto account = accounts.find(session->user);
    if (!accounts.error().empty()) {
        return {SessionOwner::State::kNotKnown, {}};
    }
    return account ? SessionOwner{SessionOwner::State::kFound, *account} : SessionOwner{};
}

} // namespace Ovradrd
