// SPDX-License-Identifier: Apache-2.0
#include "transport/request_scope.h"

#include <algorithm>
#include <optional>
#include <vector>

namespace OvraDRNode {

namespace {

thread_local std::optional<std::vector<Conn>> unreachable;

} // namespace

RequestScope::RequestScope()
    : outermost_(!unreachable) {
    if (outermost_) {
        unreachable.emplace();
    }
}

RequestScope::~RequestScope() {
    if (outermost_) {
        unreachable.reset();
    }
}

void RequestScope::noteUnreachable(const Conn &conn) {
    if (unreachable && !isUnreachable(conn)) {
        unreachable->push_back(conn);
    }
}

bool RequestScope::isUnreachable(const Conn &conn) {
    return unreachable &&
           std::find(unreachable->begin(), unreachable->end(), conn) != unreachable->end();
}

} // namespace OvraDRNode
