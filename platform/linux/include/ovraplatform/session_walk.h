// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovraplatform/export.h"
#include "ovraplatform/session_store.h"

namespace OvraPlatform {

/// While it lives, the login-session library's walks in this thread visit these sessions only, and
/// cost no more among ten thousand others than alone. For who knows which ones the walk is about.
/// Not nested; destroy it in the thread that created it.
class OVRAPLATFORM_EXPORT SessionWalk {
public:
    explicit SessionWalk(SessionFilter filter);
    SessionWalk(const SessionWalk &) = delete;
    SessionWalk &operator=(const SessionWalk &) = delete;
    ~SessionWalk();

private:
    SessionFilter filter_;
};

} // namespace OvraPlatform
