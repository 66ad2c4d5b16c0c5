// SPDX-License-Identifier: Apache-2.0
#include "http/transfer.h"

#include <ovradrcore/no_fork.h>

namespace OvraPlatform {

CURLcode Transfer::perform(CURL *handle) {
    const OvraDRCore::NoFork noFork;
    if (!multi_) {
        multi_.reset(curl_multi_init());
        curl_multi_setopt(multi_.get(), CURLMOPT_MAXCONNECTS, 1L);
    }
    if (!multi_ || curl_multi_add_handle(multi_.get(), handle) != CURLM_OK) {
        return CURLE_OUT_OF_MEMORY;
    }
    const CURLcode code = run(handle);
    curl_multi_remove_handle(multi_.get(), handle);
    return code;
}

CURLcode Transfer::run(CURL *handle) {
    constexpr int kMaxPollMillis = 1000; // libcurl ends the wait for its own time-outs
    int running = 1;
    while (curl_multi_perform(multi_.get(), &running) == CURLM_OK && running != 0) {
        const OvraDRCore::NoFork::Pause forksPass;
        if (curl_multi_poll(multi_.get(), nullptr, 0, kMaxPollMillis, nullptr) != CURLM_OK) {
            break;
        }
    }
    int left = 0;
    while (const CURLMsg *message = curl_multi_info_read(multi_.get(), &left)) {
        if (message->msg == CURLMSG_DONE && message->easy_handle == handle) {
            return message->data.result;
        }
    }
    return CURLE_OUT_OF_MEMORY; // the only reason for it to end otherwise
}

} // namespace OvraPlatform
