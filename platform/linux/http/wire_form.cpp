// SPDX-License-Identifier: Apache-2.0
#include "ovraplatform/wire_form.h"

#include "http/form_fields.h"

#include <ovrabase/number.h>
#include <ovrabase/secret.h>
#include <ovradrcore/json.h>

#include <algorithm>
#include <array>
#include <set>

namespace OvraPlatform {

namespace {

constexpr char kApi[] = "api";
constexpr char kVersion[] = "version";
constexpr char kMethod[] = "method";
constexpr char kSid[] = "_sid";
constexpr char kSealed[] = "sealed";
constexpr std::array<std::string_view, 5> kReserved = {kApi, kVersion, kMethod, kSid, kSealed};
constexpr std::size_t kMaxFields = 1000;
constexpr char kHexDigits[] = "0123456789ABCDEF";

bool isReserved(std::string_view name) {
    return std::find(kReserved.begin(), kReserved.end(), name) != kReserved.end();
}

/// The characters that stand for themselves: "unreserved" of RFC 3986.
bool isUnreserved(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' ||
           c == '.' || c == '_' || c == '~';
}

void appendEscaped(std::string &body, std::string_view text) {
    for (const char c : text) {
        if (isUnreserved(c)) {
            body += c;
            continue;
        }
        const auto byte = static_cast<unsigned char>(c);
        body += '%';
        body += kHexDigits[byte >> 4U];
        body += kHexDigits[byte & 0x0FU];
    }
}

int hexDigit(char c) {
    if (c >= '0' && c <= '9') {
        return c - '0';
    }
    if (c >= 'a' && c <= 'f') {
        return c - 'a' + 10;
    }
    return c >= 'A' && c <= 'F' ? c - 'A' + 10 : -1;
}

std::optional<std::string> unescape(std::string_view text) {
    std::string plain;
    plain.reserve(text.size());
    for (std::size_t i = 0; i < text.size(); ++i) {
        if (text[i] == '+') {
            plain += ' ';
            continue;
        }
        if (text[i] != '%') {
            plain += text[i];
            continue;
        }
        const int high = i + 2 < text.size() ? hexDigit(text[i + 1]) : -1;
        const int low = i + 2 < text.size() ? hexDigit(text[i + 2]) : -1;
        if (high < 0 || low < 0) {
            return std::nullopt;
        }
        plain += static_cast<char>(high * 16 + low);
        i += 2;
    }
    return plain;
}

std::optional<FormFields> splitForm(std::string_view body) {
    FormFields fields;
    while (!body.empty()) {
        const std::size_t end = std::min(body.find('&'), body.size());
        const std::string_view field = body.substr(0, end);
        body.remove_prefix(std::min(end + 1, body.size()));
        if (field.empty()) {
            continue;
        }
        const std::size_t equals = field.find('=');
        if (equals == std::string_view::npos || fields.size() == kMaxFields) {
            return std::nullopt;
        }
        std::optional<std::string> name = unescape(field.substr(0, equals));
        std::optional<std::string> value = unescape(field.substr(equals + 1));
        if (!name || !value) {
            return std::nullopt;
        }
        fields.emplace_back(std::move(*name), std::move(*value));
    }
    return fields;
}

/// Puts one field where it belongs, or says why it does not belong anywhere.
tl::expected<void, std::string> takeField(ReceivedCall &call, std::string &name,
                                          std::string &value) {
    if (name == kApi) {
        call.api = std::move(value);
    } else if (name == kMethod) {
        call.method = std::move(value);
    } else if (name == kSid) {
        call.sid = std::move(value);
    } else if (name == kSealed) {
        call.sealed = std::move(value);
    } else if (name == kVersion) {
        call.version = OvraBase::parseNumber(value, 1).value_or(0);
        if (call.version <= 0) {
            return tl::unexpected(std::string("version is not a positive number"));
        }
    } else {
        call.texts.emplace_back(std::move(name), std::move(value));
    }
    return {};
}

} // namespace

std::optional<FormFields> toFormFields(const WireCall &call) {
    FormFields fields{
        {kApi, call.api}, {kVersion, std::to_string(call.version)}, {kMethod, call.method}};
    if (!call.sid.empty()) {
        fields.emplace_back(kSid, call.sid);
    }
    if (!call.sealed.empty()) {
        fields.emplace_back(kSealed, call.sealed);
        return fields;
    }
    if (call.params.isNull()) {
        return fields;
    }
    for (auto param = call.params.begin(); param != call.params.end(); ++param) {
        const std::string name = param.name();
        if (isReserved(name)) {
            return std::nullopt;
        }
        fields.emplace_back(name, OvraDRCore::toString(*param));
    }
    return fields;
}

std::string encodeForm(const FormFields &fields) {
    std::size_t size = 0;
    for (const auto &[name, value] : fields) {
        size += 3 * (name.size() + value.size()) + 2;
    }
    std::string body;
    body.reserve(size); // a text that moves would leave copies of what is secret
    for (const auto &[name, value] : fields) {
        if (!body.empty()) {
            body += '&';
        }
        appendEscaped(body, name);
        body += '=';
        appendEscaped(body, value);
    }
    return body;
}

std::optional<std::string> encodeForm(const WireCall &call) {
    const std::optional<FormFields> fields = toFormFields(call);
    return fields ? std::optional(encodeForm(*fields)) : std::nullopt;
}

tl::expected<ReceivedCall, std::string> decodeForm(std::string_view body) {
    const auto refused = [](const char *why) { return tl::unexpected(std::string(why)); };
    std::optional<FormFields> fields = splitForm(body);
    if (!fields) {
        return refused("the body is not a form, or has too many fields");
    }
    std::set<std::string_view> seen;
    for (const auto &[name, value] : *fields) {
        if (!seen.insert(name).second) {
            return refused("a field stands twice");
        }
    }
    ReceivedCall call;
    for (auto &[name, value] : *fields) {
        if (const auto taken = takeField(call, name, value); !taken) {
            return tl::unexpected(taken.error());
        }
    }
    if (call.api.empty() || call.method.empty() || call.version == 0) {
        return refused("api, version and method are needed");
    }
    if (!call.sealed.empty() && (!call.texts.empty() || !call.sid.empty())) {
        return refused("a sealed request carries nothing beside the envelope");
    }
    return call;
}

OvraDRCore::JsonFault parseParams(ReceivedCall &call, const OvraDRCore::JsonLimits &limits) {
    OvraDRCore::JsonLimits left = limits;
    OvraDRCore::JsonFault fault = OvraDRCore::JsonFault::kNone;
    for (auto &[name, text] : call.texts) {
        if (fault == OvraDRCore::JsonFault::kNone) {
            fault = OvraDRCore::parseJson(call.params[name], text, left, &left);
        }
        OvraBase::wipe(text);
    }
    call.texts.clear();
    return fault;
}

} // namespace OvraPlatform
