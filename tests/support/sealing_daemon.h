// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "support/misbehaving_server.h"

#include <ovradrcore/json.h>
#include <ovraplatform/api_errors.h>
#include <ovraplatform/sealed_box.h>
#include <ovraplatform/wire_form.h>

#include <functional>
#include <mutex>
#include <string>
#include <utility>
#include <variant>

namespace OvraTest {

/// The receiving side of the sealed envelope, as in a daemon, behind a MisbehavingServer.
class SealingDaemon {
public:
    /// A document, sealed if the call was, or bytes that are sent unchanged.
    using Reply = std::variant<std::string, Answer>;
    using Handler = std::function<Reply(const OvraPlatform::WireCall &)>;

    /// \param clocks  none, or those of its ReplayGuard
    template <typename... Clocks>
    SealingDaemon(const std::string &keyFile, Handler handler, Clocks... clocks)
        : handler_(std::move(handler))
        , guard_(std::move(clocks)...) {
        newKey(keyFile);
    }

    /// Uses another key from now on.
    void newKey(const std::string &keyFile) {
        const std::lock_guard<std::mutex> lock(mutex_);
        keys_ = OvraPlatform::SealKeyPair::loadOrCreate(keyFile).value();
    }

    std::string fingerprint() {
        const std::lock_guard<std::mutex> lock(mutex_);
        return OvraPlatform::fingerprintOf(keys_->publicKey());
    }

    Answer answer(const Received &request) {
        using namespace OvraPlatform;
        auto visible = decodeForm(request.body);
        if (!visible || parseParams(*visible) != OvraDRCore::JsonFault::kNone) {
            return document(apiError(APIError::kBadRequest, "not a call"));
        }
        OpenedRequest opened;
        SealVerdict verdict = SealVerdict::kOpened;
        {
            const std::lock_guard<std::mutex> lock(mutex_);
            if (visible->method == "getinfo") {
                Json::Value data;
                data["public_key"] = publicKeyText(keys_->publicKey());
                data["time"] = Json::Int64{guard_.now()};
                return document(apiSuccess(data));
            }
            if (!visible->sealed.empty()) {
                verdict = openRequest(*keys_, *visible, guard_, opened);
            }
        }
        const bool sealed = !visible->sealed.empty() && verdict != SealVerdict::kUnreadable;
        const Reply reply = verdict == SealVerdict::kOpened
                                ? handler_(visible->sealed.empty() ? *visible : opened.call)
                                : OvraDRCore::toString(sealRefusal(verdict, guard_.now()));
        if (const Answer *bytes = std::get_if<Answer>(&reply)) {
            return *bytes;
        }
        const auto &text = std::get<std::string>(reply);
        return Answer::json(sealed ? sealReply(opened.replyKey, text) : text);
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
