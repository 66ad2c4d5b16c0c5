// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <curl/curl.h>

#include <memory>

namespace OvraPlatform {

/// Performs the transfers of one libcurl handle, one at a time, and keeps their connection.
class Transfer {
public:
    /// As curl_easy_perform(), within a NoFork section except while it waits for the peer: libcurl
    /// and the TLS library have locks of the process.
    [[nodiscard]] CURLcode perform(CURL *handle);
    /// Closes the kept connection; the handle must be gone.
    void close() { multi_.reset(); }

private:
    struct Free {
        void operator()(CURLM *multi) const { curl_multi_cleanup(multi); }
    };

    [[nodiscard]] CURLcode run(CURL *handle);

    std::unique_ptr<CURLM, Free> multi_;
};

} // namespace OvraPlatform
