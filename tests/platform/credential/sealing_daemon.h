// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "credential/sealed_box.h"
#include "credential/wire_form.h"
#include "support/misbehaving_server.h"
#include "webapi/api_errors.h"

#include <ovradrcore/json.h>

#include <functional>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

namespace OvraTest {

/// The receiving side of the sealed envelope, as a daemon has it, behind a MisbehavingServer.
class SealingDaemon {
public:
    using Handler = std::function<Json::Value(const OvraPlatform::WireCall &)>;

    SealingDaemon(const std::string &keyFile, Handler handler,
                  OvraPlatform::ReplayGuard::Clocks clocks)
        : handler_(std::move(handler))
        , guard_(std::move(clocks)) {
        newKey(keyFile);
    }

    /// Has another key from now on.
    void newKey(const std::string &keyFile) {
        std::string why;
        const std::lock_guard<std::mutex> lock(mutex_);
        keys_ = OvraPlatform::SealKeyPair::loadOrCreate(keyFile, why);
    }

    std::string fingerprint() {
        const std::lock_guard<std::mutex> lock(mutex_);
        return OvraPlatform::fingerprintOf(keys_->publicKey());
    }

    Answer answer(const Received &request) {
        using namespace OvraPlatform;
        const std::lock_guard<std::mutex> lock(mutex_);
        std::string why;
        const auto visible = decodeForm(request.body, why);
        if (!visible) {
            return document(apiError(APIError::kBadRequest, why));
        }
        if (visible->method == "getinfo") {
            Json::Value data;
            data["public_key"] = publicKeyText(keys_->publicKey());
            return document(apiSuccess(data));
        }
        if (visible->sealed.empty()) {
            return document(handler_(*visible));
        }
        OpenedRequest opened;
        const SealVerdict verdict = openRequest(*keys_, *visible, guard_, opened);
        if (verdict == SealVerdict::kUnreadable) {
            return document(sealRefusal(verdict, guard_.now()));
        }
        const Json::Value reply = verdict == SealVerdict::kOpened
                                      ? handler_(opened.call)
                                      : sealRefusal(verdict, guard_.now());
        return Answer::json(sealReply(opened.replyKey, OvraDRCore::toString(reply)));
    }

private:
    static Answer document(const Json::Value &reply) {
        return Answer::json(OvraDRCore::toString(reply));
    }

    std::mutex mutex_;
    Handler handler_;
    std::optional<OvraPlatform::SealKeyPair> keys_;
    OvraPlatform::ReplayGuard guard_;
};

} // namespace OvraTest
