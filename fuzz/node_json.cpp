// SPDX-License-Identifier: Apache-2.0
#include "fuzz.h"

#include <ovradrcore/json.h>
#include <ovradrnode/conn.h>
#include <ovradrnode/dr_node.h>
#include <ovradrnode/dr_node_attr.h>

#include <json/value.h>

#include <string>

using OvraDRNode::Conn;
using OvraDRNode::DRNode;
using OvraFuzz::require;

// Any JSON gives an endpoint and a record, valid ones survive, and no session comes out of a
// record.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    Json::Value value;
    if (!OvraDRCore::fromString(value, std::string(OvraFuzz::textOf(data, size)))) {
        return 0;
    }
    const Conn conn = Conn::fromJson(value);
    if (conn.isValid()) {
        require(Conn::fromJson(conn.toJson()) == conn, "an endpoint survives its JSON");
    }
    DRNode node;
    require(node.fromJson(value), "a record takes what there is");
    require(!conn.isValid() || node.setConn(conn), "a valid endpoint is taken");
    node.session = "canary";
    require(OvraDRCore::toString(node.toJson()).find("canary") == std::string::npos ||
                node.nodeId.find("canary") != std::string::npos ||
                node.credId.find("canary") != std::string::npos ||
                conn.addr.find("canary") != std::string::npos,
            "no session in the JSON of a record");
    DRNode again;
    require(again.FromSqliteValues(node.ToSqliteRecord()), "a record survives its row");
    require(again.toJson() == node.toJson(), "a record survives its row whole");
    return 0;
}
