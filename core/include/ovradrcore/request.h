// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

#include <json/value.h>

#include <string>

namespace OvraDRCore {

/// A web-API request: method, parameters and transport options.
class OVRADRCORE_EXPORT Request {
public:
    /// Default time-out for a reply, in seconds. A peer may have to probe several endpoints (10
    /// seconds each) before it answers.
    static constexpr long kDefaultResponseTimeout = 60;
    /// A day, the longest that a reply can be waited for.
    static constexpr long kMaxResponseTimeout = 86400;

    /// Empty and invalid.
    Request() = default;
    /// Rebuilds a request from the output of toJson(); anything else gives an invalid request.
    explicit Request(const Json::Value &json);
    Request(const std::string &api, int version, const std::string &method,
            const Json::Value &params);
    Request(const Request &) = default;
    Request(Request &&) = default;
    Request &operator=(const Request &) = default;
    Request &operator=(Request &&) = default;
    virtual ~Request();

    void setAPI(const std::string &api) { api_ = api; }
    void setMethod(const std::string &method) { method_ = method; }
    void setVersion(int version) { version_ = version; }
    /// Sets params[key]; a later call with the same key replaces the value.
    void addParam(const std::string &key, const Json::Value &value);
    /// Merges every member of `object` into the parameters; ignored if it is not an object.
    void addParam(const Json::Value &object);
    /// The parameters hold login material and must be sealed.
    void setEncryptRequired(bool required) { encryptRequired_ = required; }
    /// How long the transport waits for the reply.
    /// \param seconds  1 to kMaxResponseTimeout; others are logged and make the request invalid
    void setResponseTimeout(long seconds);
    /// A file to upload, and the name under which it is sent. Both or neither.
    void setUpload(const std::string &path, const std::string &name);

    const std::string &getAPI() const { return api_; }
    const std::string &getMethod() const { return method_; }
    int getVersion() const { return version_; }
    const Json::Value &getParams() const { return params_; }
    bool isEncryptRequired() const { return encryptRequired_; }
    long getResponseTimeout() const { return responseTimeout_; }
    const std::string &getUploadPath() const { return uploadPath_; }
    const std::string &getUploadName() const { return uploadName_; }

    /// API and method not empty and without a NUL, version positive, parameters an object, the
    /// time-out one that is possible.
    bool isValid() const;
    /// Members "api", "method", "version", "params" and, only when set, "encrypt".
    Json::Value toJson() const;
    /// toJson() as compact text, exact: it may hold login material.
    std::string toStr() const;

private:
    std::string api_;
    std::string method_;
    int version_ = 0;
    Json::Value params_{Json::objectValue};
    bool encryptRequired_ = false;
    long responseTimeout_ = kDefaultResponseTimeout;
    std::string uploadPath_;
    std::string uploadName_;
};

} // namespace OvraDRCore
