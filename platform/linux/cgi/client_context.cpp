// SPDX-License-Identifier: Apache-2.0
#include "cgi/client_context.h"

#include <arpa/inet.h>
#include <netinet/in.h>

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

bool isNumericAddress(const std::string &text) {
    in6_addr parsed{};
    return inet_pton(AF_INET, text.c_str(), &parsed) == 1 ||
           inet_pton(AF_INET6, text.c_str(), &parsed) == 1;
}

std::optional<std::string> clientAddress() {
    std::string address;
    if (currentClient != nullptr) {
        address = *currentClient;
    } else if (const char *const variable = std::getenv("REMOTE_ADDR"); // NOLINT(concurrency-*)
               variable != nullptr) {
        address = variable;
    }
    return isNumericAddress(address) ? std::optional(address) : std::nullopt;
}

} // namespace OvraPlatform
