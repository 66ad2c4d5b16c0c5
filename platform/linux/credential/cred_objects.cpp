// SPDX-License-Identifier: Apache-2.0
#include "credential/cred_objects.h"

#include <cstring>
#include <exception>
#include <new>

namespace {

using OvraPlatform::Endpoint;

constexpr std::size_t kMaxItem = 4096;
constexpr int kTaken = 0;
constexpr int kRefused = -1;

bool isUsable(const char *text) {
    return text != nullptr && *text != '\0' && std::strlen(text) <= kMaxItem;
}

/// Assigns a usable text to an item of an object.
template <typename Object, typename Item>
int setItem(Object *object, Item Object::*item, const char *text) {
    if (object == nullptr || !isUsable(text)) {
        return kRefused;
    }
    try {
        object->*item = Item(text);
    } catch (const std::exception &) { // no memory
        return kRefused;
    }
    return kTaken;
}

bool isEndpoint(const char *protocol, const char *host, int port) {
    try {
        return Endpoint::make(protocol, host, port).has_value();
    } catch (const std::exception &) {
        return false;
    }
}

} // namespace

OVRACred *OVRACredAlloc(void) {
    return new (std::nothrow) OVRACred();
}

void OVRACredFree(OVRACred *cred) {
    delete cred;
}

OVRACredSess *OVRACredSessAlloc(void) {
    return new (std::nothrow) OVRACredSess();
}

void OVRACredSessFree(OVRACredSess *sess) {
    delete sess;
}

int OVRACredItemSetProtocol(OVRACred *cred, const char *protocol) {
    const bool known = isUsable(protocol) && isEndpoint(protocol, "localhost", 1);
    return known ? setItem(cred, &OVRACred::protocol, protocol) : kRefused;
}

int OVRACredItemSetHost(OVRACred *cred, const char *host) {
    const bool valid = isUsable(host) && isEndpoint("https", host, 1);
    return valid ? setItem(cred, &OVRACred::host, host) : kRefused;
}

int OVRACredItemSetPort(OVRACred *cred, int port) {
    if (cred == nullptr || !isEndpoint("https", "localhost", port)) {
        return kRefused;
    }
    cred->port = port;
    return kTaken;
}

int OVRACredItemSetRemoteAccount(OVRACred *cred, const char *account) {
    return setItem(cred, &OVRACred::account, account);
}

int OVRACredItemSetRemotePasswd(OVRACred *cred, const char *passwd) {
    return setItem(cred, &OVRACred::passwd, passwd);
}

int OVRACredSessItemSetAccessToken(OVRACredSess *sess, const char *token) {
    return setItem(sess, &OVRACredSess::token, token);
}
