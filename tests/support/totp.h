// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <liboath/oath.h>

#include <cstdlib>
#include <ctime>
#include <string>

namespace OvraTest {

/// What an authenticator with this secret shows.
inline std::string totp(const std::string &secret, std::time_t time) {
    char *key = nullptr;
    std::size_t size = 0;
    char code[7] = "";
    if (oath_base32_decode(secret.data(), secret.size(), &key, &size) == OATH_OK) {
        oath_totp_generate(key, size, time, 30, 0, 6, code);
    }
    std::free(key);
    return code;
}

} // namespace OvraTest
