// SPDX-License-Identifier: Apache-2.0
#include "fuzz.h"

#include <ovradrcore/json.h>
#include <ovradrcore/response.h>

#include <string>

using OvraDRCore::Response;
using OvraFuzz::require;

// A reply is valid as a whole or empty, and a valid one survives its wire form.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    Response reply;
    reply.setResp(std::string(OvraFuzz::textOf(data, size)));
    if (!reply.isValid()) {
        require(!reply.isSuccess() && reply.getErrCode() == 407 && reply.getData().empty(),
                "an invalid reply is empty");
        return 0;
    }
    require(reply.isSuccess() == (reply.getErrCode() == 0), "a success has no code");
    require(!reply.isSuccess() || reply.getData().isObject(), "data is an object");
    for (const std::string &name : reply.getData().getMemberNames()) {
        require(reply.hasDataField(name.c_str()) || name.find('\0') != std::string::npos,
                "a member is found");
        (void)reply.getDataField(name.c_str());
        (void)reply.getDataFieldtoStr(name.c_str());
    }
    Response again;
    again.setResp(OvraDRCore::toString(reply.toJson()));
    require(again.isValid() && again.toJson() == reply.toJson(), "a reply survives its wire form");
    return 0;
}
