// SPDX-License-Identifier: Apache-2.0
#include "session_uses.h"

#include "shared/pending_releases.h"

#include <ovraplatform/session_store.h>

#include <cstddef>
#include <ctime>

namespace Ovradrd {

void SessionUses::note(const std::string &sid, const std::string &client) {
    const std::string reference = OvraApps::referenceOf(sid);
    const std::lock_guard lock(mutex_);
    if (uses_.size() >= static_cast<std::size_t>(OvraPlatform::SessionStore::kMaxSessions) &&
        uses_.count(reference) == 0) {
        uses_.clear(); // mostly ended ones; those in use are here again soon
    }
    uses_[reference] = {std::time(nullptr), client};
}

std::map<std::string, OvraApps::SessionUse> SessionUses::list() const {
    const std::lock_guard lock(mutex_);
    return {uses_.begin(), uses_.end()};
}

} // namespace Ovradrd
