// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovrabase/secret.h>
#include <ovradrnode/conn.h>

#include <json/value.h>

#include <cstddef>
#include <string>
#include <vector>

namespace Ovradrd {

/// Reads the parameters of a call, each by type and length. The first missing or unusable one is
/// remembered, and everything read after it is ignored:
///
///     Params in(params);
///     const std::string node = in.text("node_id", kMaxId);
///     if (!in.ok()) {
///         return in.error();
///     }
class Params {
public:
    static constexpr std::size_t kMaxId = 127; ///< of a node or credential id
    static constexpr std::size_t kMaxSession = 255;
    static constexpr std::size_t kMaxAccount = 255;
    static constexpr std::size_t kMaxPassword = 1024;
    static constexpr std::size_t kMaxCode = 64;   ///< of a one-time code
    static constexpr std::size_t kMaxDevice = 64; ///< of a device token

    /// \param params  an object; must outlive this
    explicit Params(const Json::Value &params)
        : params_(params) {}

    bool has(const char *name) const { return params_.isMember(name); }

    /// 1 to `longest` bytes without control characters.
    std::string text(const char *name, std::size_t longest);
    /// As text(), or "" if it is absent or empty.
    std::string optionalText(const char *name, std::size_t longest);
    /// A whole number from 0.
    int number(const char *name);
    /// One of `words`.
    std::string word(const char *name, const std::vector<std::string> &words);
    /// 1 to `longest` bytes, none of them NUL; error texts never repeat it.
    OvraBase::Secret secret(const char *name, std::size_t longest);
    /// As secret(), or "" if it is absent or empty.
    std::string optionalSecret(const char *name, std::size_t longest);
    /// An array of at most `most` texts; empty if it is absent.
    std::vector<std::string> optionalTexts(const char *name, std::size_t most, std::size_t longest);
    /// An endpoint: an object with "addr", "protocol" and "port".
    OvraDRNode::Conn conn(const char *name);
    /// An endpoint whose members are parameters themselves.
    OvraDRNode::Conn connHere();
    /// An array of 1 to `most` endpoints.
    std::vector<OvraDRNode::Conn> conns(const char *name, std::size_t most);
    /// An object.
    Json::Value object(const char *name);

    /// Records that a parameter already read is unusable after all.
    /// \param text  what it must be; never contains its value
    void refuse(const std::string &name, const std::string &text);

    bool ok() const { return error_.isNull(); }
    /// The reply that names the parameter; null if there is no error.
    const Json::Value &error() const { return error_; }

private:
    std::string bytes(const char *name, std::size_t longest, bool control);
    OvraDRNode::Conn endpoint(const Json::Value &value, const std::string &name);

    const Json::Value &params_;
    Json::Value error_;
};

} // namespace Ovradrd
