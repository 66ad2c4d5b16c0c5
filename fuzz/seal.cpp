// SPDX-License-Identifier: Apache-2.0
#include "fuzz.h"

#include <ovradrcore/json.h>
#include <ovraplatform/sealed_box.h>

#include <seal/sealing.h>

#include <optional>
#include <string>

using namespace OvraPlatform;
using OvraFuzz::require;

namespace {

constexpr UnixMillis kTime = 1'000'000;

SealKeyPair &keys() {
    static auto pair = SealKeyPair::loadOrCreate("/tmp/fuzz.seal");
    require(pair.has_value(), "a key pair in the sandbox");
    return *pair;
}

SealVerdict open(const WireCall &call, OpenedRequest &opened) {
    ReplayGuard guard({[] { return kTime; }, [] { return UnixMillis{0}; }});
    return openRequest(keys(), call, guard, opened);
}

/// Changes bytes of `text` at places that the input chooses.
std::string bend(std::string text, std::string_view changes) {
    for (std::size_t i = 0; i + 2 < changes.size() && !text.empty(); i += 3) {
        const auto at = static_cast<unsigned char>(changes[i]) * 256U +
                        static_cast<unsigned char>(changes[i + 1]);
        text[at % text.size()] = changes[i + 2];
    }
    return text;
}

} // namespace

// Nothing opens but what was sealed (base64 has several texts for some bytes). Parts of the input:
// session id, the changes; the rest is also taken as an envelope and as a reply.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::string_view input = OvraFuzz::textOf(data, size);
    OpenedRequest opened;
    WireCall visible;
    visible.api = "Some.API";
    visible.version = 1;
    visible.method = "get";
    visible.sealed = std::string(input);
    require(open(visible, opened) == SealVerdict::kUnreadable, "rubbish does not open");

    WireCall call = visible;
    call.sid = std::string(OvraFuzz::takePart(input));
    call.sealed.clear();
    call.params["text"] = "value";
    const auto sealed = sealRequest(keys().publicKey(), call, kTime);
    require(sealed.has_value(), "a call can be sealed");
    visible.sealed = bend(sealed->envelope, input);
    const SealVerdict verdict = open(visible, opened);
    require(verdict == SealVerdict::kOpened || visible.sealed != sealed->envelope,
            "what was sealed opens");
    if (verdict != SealVerdict::kOpened) {
        return 0;
    }
    require(opened.call.params == call.params, "what was sealed comes out");

    const std::string document = R"({"success":true})";
    Json::Value reply;
    require(OvraDRCore::fromString(reply, sealReply(opened.replyKey, document)), "a reply is JSON");
    require(openReply(sealed->replyKey, reply) == document, "a sealed reply opens");
    Json::Value bent = reply;
    bent["sealed_reply"] = bend(reply["sealed_reply"].asString(), input);
    const auto reopened = openReply(sealed->replyKey, bent);
    require(reopened ? reopened == document : bent != reply,
            "only the reply that was sealed opens");
    bent["sealed_reply"] = std::string(input);
    require(!openReply(sealed->replyKey, bent), "rubbish is no reply");
    return 0;
}
