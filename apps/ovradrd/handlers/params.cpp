// SPDX-License-Identifier: Apache-2.0
#include "handlers/params.h"

#include <ovraplatform/api_errors.h>

#include <algorithm>

namespace Ovradrd {

using OvraDRNode::Conn;

namespace {

constexpr std::size_t kMaxAddress = 255;

bool isControl(char c) {
    return (c >= '\0' && c < ' ') || c == '\x7f';
}

/// An absent parameter, or one that says nothing.
bool isUnset(const Json::Value &value) {
    return value.isNull() || (value.isString() && value.asString().empty());
}

bool hasControl(const std::string &text) {
    return std::any_of(text.begin(), text.end(), isControl);
}

} // namespace

void Params::refuse(const std::string &name, const std::string &text) {
    if (ok()) {
        error_ = OvraPlatform::apiBadParameter(name, text);
    }
}

std::string Params::bytes(const char *name, std::size_t longest, bool control) {
    const Json::Value &value = params_[name];
    std::string text = value.isString() ? value.asString() : std::string();
    const bool usable = control ? text.find('\0') == std::string::npos : !hasControl(text);
    if (text.empty() || text.size() > longest || !usable) {
        refuse(name, std::string(name) + " has to be a text of 1 to " + std::to_string(longest) +
                         " bytes" + (control ? "" : " without control characters"));
        return {};
    }
    return text;
}

std::string Params::text(const char *name, std::size_t longest) {
    return bytes(name, longest, false);
}

std::string Params::optionalText(const char *name, std::size_t longest) {
    const Json::Value &value = params_[name];
    return isUnset(value) ? std::string() : bytes(name, longest, false);
}

OvraBase::Secret Params::secret(const char *name, std::size_t longest) {
    std::string text = bytes(name, longest, true);
    return OvraBase::Secret::take(text);
}

std::string Params::optionalSecret(const char *name, std::size_t longest) {
    const Json::Value &value = params_[name];
    return isUnset(value) ? std::string() : bytes(name, longest, true);
}

int Params::number(const char *name) {
    const Json::Value &value = params_[name];
    if (!value.isInt() || value.asInt() < 0) {
        refuse(name, std::string(name) + " has to be a whole number, not below 0");
        return 0;
    }
    return value.asInt();
}

std::string Params::word(const char *name, const std::vector<std::string> &words) {
    const Json::Value &value = params_[name];
    std::string text = value.isString() ? value.asString() : std::string();
    if (std::find(words.begin(), words.end(), text) != words.end()) {
        return text;
    }
    std::string choice;
    for (const std::string &word : words) {
        choice += (choice.empty() ? "" : ", ") + word;
    }
    refuse(name, std::string(name) + " has to be one of: " + choice);
    return {};
}

std::vector<std::string> Params::optionalTexts(const char *name, std::size_t most,
                                               std::size_t longest) {
    const Json::Value &value = params_[name];
    std::vector<std::string> texts;
    if (value.isNull()) {
        return texts;
    }
    bool usable = value.isArray() && value.size() <= most;
    for (Json::ArrayIndex i = 0; usable && i < value.size(); ++i) {
        usable = value[i].isString() && value[i].asString().size() <= longest;
        if (usable) {
            texts.push_back(value[i].asString());
        }
    }
    if (!usable) {
        refuse(name, std::string(name) + " has to be an array of at most " + std::to_string(most) +
                         " texts of at most " + std::to_string(longest) + " bytes");
        return {};
    }
    return texts;
}

Conn Params::endpoint(const Json::Value &value, const std::string &name) {
    Conn conn;
    if (value.isObject() && value["addr"].isString() && value["protocol"].isString() &&
        value["port"].isInt()) {
        conn = Conn::fromJson(value);
    }
    if (!conn.isValid() || conn.addr.size() > kMaxAddress || hasControl(conn.addr)) {
        refuse(name, name +
                         " has to hold \"addr\" (a host name or an address), \"protocol\" (http, "
                         "https or flk) and \"port\" (1 to 65535)");
        return {};
    }
    return conn;
}

Conn Params::conn(const char *name) {
    return endpoint(params_[name], name);
}

Conn Params::connHere() {
    return endpoint(params_, "addr, protocol, port");
}

std::vector<Conn> Params::conns(const char *name, std::size_t most) {
    const Json::Value &value = params_[name];
    if (!value.isArray() || value.empty() || value.size() > most) {
        refuse(name, std::string(name) + " has to be an array of 1 to " + std::to_string(most) +
                         " endpoints");
        return {};
    }
    std::vector<Conn> conns;
    for (const Json::Value &entry : value) {
        conns.push_back(endpoint(entry, name));
    }
    return ok() ? conns : std::vector<Conn>();
}

Json::Value Params::object(const char *name) {
    const Json::Value &value = params_[name];
    if (!value.isObject()) {
        refuse(name, std::string(name) + " has to be an object");
    }
    return value;
}

} // namespace Ovradrd
