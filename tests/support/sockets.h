// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/address.h>
#include <ovrabase/unique_fd.h>

#include <gtest/gtest.h>
#include <sys/socket.h>

#include <cerrno>
#include <string>

// Plain connections to a server on 127.0.0.1.
namespace OvraTest {

/// \param from  the address that connects, of 127.0.0.0/8
inline OvraBase::UniqueFd dial(int port, const char *from = "127.0.0.1") {
    OvraBase::UniqueFd fd(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const auto own = OvraBase::parseAddress(from, 0);
    EXPECT_EQ(bind(fd.get(), own->get(), own->size), 0);
    const auto address = OvraBase::parseAddress("127.0.0.1", port);
    const timeval patience{20, 0};
    setsockopt(fd.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
    EXPECT_EQ(connect(fd.get(), address->get(), address->size), 0);
    return fd;
}

inline void say(const OvraBase::UniqueFd &fd, const std::string &text) {
    (void)!send(fd.get(), text.data(), text.size(), MSG_NOSIGNAL); // waits until all is taken
}

inline std::string hear(const OvraBase::UniqueFd &fd) {
    std::string text(100, '\0');
    const ssize_t size = recv(fd.get(), text.data(), text.size(), 0);
    return size < 0 ? "timeout" : text.substr(0, static_cast<std::size_t>(size));
}

/// Whether the other end has neither closed nor sent anything.
inline bool isOpen(const OvraBase::UniqueFd &fd) {
    char byte = 0;
    return recv(fd.get(), &byte, 1, MSG_PEEK | MSG_DONTWAIT) < 0 && errno == EAGAIN;
}

/// Reads until the other end closes, or 20 seconds pass without a byte ("timeout").
inline std::string hearAll(const OvraBase::UniqueFd &fd) {
    std::string all;
    std::string buffer(1 << 16, '\0');
    for (;;) {
        const ssize_t size = recv(fd.get(), buffer.data(), buffer.size(), 0);
        if (size <= 0) {
            return size < 0 && errno == EAGAIN ? "timeout" : all;
        }
        all.append(buffer, 0, static_cast<std::size_t>(size));
    }
}

} // namespace OvraTest
