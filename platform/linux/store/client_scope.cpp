// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/client_scope.h"

#include "store/client_context.h"

#include <ovrabase/address.h>

#include <cstdlib>
#include <utility>

namespace OvraPlatform {

namespace {

thread_local const std::string *currentClient = nullptr;

} // namespace

ClientScope::ClientScope(std::string address)
    : address_(std::move(address))
    , previous_(std::exchange(currentClient, &address_)) {}

ClientScope::~ClientScope() {
    currentClient = previous_;
}

std::optional<std::string> clientAddress() {
    std::string address;
    if (currentClient != nullptr) {
        address = *currentClient;
    } else if (const char *const variable = std::getenv("REMOTE_ADDR"); // NOLINT(concurrency-*)
               variable != nullptr) {
        address = variable;
    }
    return OvraBase::isNumericAddress(address) ? std::optional(address) : std::nullopt;
}

} // namespace OvraPlatform
