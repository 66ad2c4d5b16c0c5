// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "http/endpoint.h"
#include "ovracredential/cred_request.h"

#include <ovrabase/secret.h>

#include <optional>
#include <string>

struct _tag_ovra_cred_ {
    std::string protocol;
    std::string host;
    int port = 0;
    std::string account;
    OvraBase::Secret passwd;

    std::optional<OvraPlatform::Endpoint> endpoint() const {
        return OvraPlatform::Endpoint::make(protocol, host, port);
    }
};

struct _tag_ovra_cred_sess_ {
    OvraBase::Secret token;
};
