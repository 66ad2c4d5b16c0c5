// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"

#include <ovradrcore/cache.h>

namespace OvraDRNode {

/// One whole request of this thread, with all the attempts and refreshes that it takes: an endpoint
/// that was found unreachable in it is not asked again, so that the credentials of a node, however
/// many there are, cost one time-out an endpoint and not one each. It bounds the waits for other
/// processes as well. A scope within another one is part of it.
class RequestScope {
public:
    RequestScope();
    RequestScope(const RequestScope &) = delete;
    RequestScope &operator=(const RequestScope &) = delete;
    ~RequestScope();

    /// Does nothing outside a scope.
    static void noteUnreachable(const Conn &conn);
    static bool isUnreachable(const Conn &conn);

private:
    OvraDRCore::CacheWaitScope waits_;
    bool outermost_;
};

} // namespace OvraDRNode
