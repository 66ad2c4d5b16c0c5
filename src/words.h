// SPDX-License-Identifier: Apache-2.0
#pragma once

/// Names in the protocol, the records and the database.
namespace OvraDRNode::Word {

// Record members and columns.
inline constexpr const char *kAddr = "addr";
inline constexpr const char *kProtocol = "protocol";
inline constexpr const char *kPort = "port";
inline constexpr const char *kCredId = "cred_id";
inline constexpr const char *kNodeId = "node_id";
inline constexpr const char *kSession = "session";
inline constexpr const char *kApp = "app";
inline constexpr const char *kAttr = "attr";
inline constexpr const char *kValue = "value";

// Protocols of an endpoint.
inline constexpr const char *kHttp = "http";
inline constexpr const char *kHttps = "https";
inline constexpr const char *kFarlink = "flk";

// Tables.
inline constexpr const char *kNodeCredTable = "node_cred";
inline constexpr const char *kTempCredTable = "temp_cred";
inline constexpr const char *kNodeAttrTable = "node_attr";
inline constexpr const char *kInfoTable = "ovradrcore_db_info";

// Web APIs.
inline constexpr const char *kNodeApi = "OVRA.DR.Node";
inline constexpr const char *kCredentialApi = "OVRA.DR.Node.Credential";
inline constexpr const char *kSessionApi = "OVRA.DR.Node.Session";
inline constexpr const char *kUserApi = "OVRA.Core.User";
inline constexpr const char *kFarlinkApi = "OVRA.Core.Farlink";

// Members of requests and answers.
inline constexpr const char *kConn = "conn";
inline constexpr const char *kAccount = "account";
inline constexpr const char *kSerial = "serial";
inline constexpr const char *kHostName = "hostname";
inline constexpr const char *kAdditional = "additional";
inline constexpr const char *kTimeZone = "timezone";
inline constexpr const char *kName = "name";
inline constexpr const char *kSpeed = "speed";
inline constexpr const char *kWebApi = "webapi";

/// The user whose rights local calls have.
inline constexpr const char *kLocalUser = "admin";

} // namespace OvraDRNode::Word
