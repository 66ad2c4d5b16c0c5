// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"
#include "ovradrnode/export.h"

#include <ovradrcore/request.h>

#include <string>
#include <vector>

namespace OvraDRNode {

/// The requests that nodes exchange. A builder that refuses its arguments logs one ERR line and
/// returns an invalid Request; test isValid() before sending. docs/wire.md lists them all.
namespace WebAPI {

using OvraDRCore::Request;

/// Looks up a user; refuses an empty name silently.
OVRADRNODE_EXPORT Request OvraCoreUserGetAPI(const std::string &user);

OVRADRNODE_EXPORT Request getDRNodeSessionCreateAPI(const std::string &nodeId);
OVRADRNODE_EXPORT Request getDRNodeSessionTempCreateAPI();
OVRADRNODE_EXPORT Request getDRNodeSessionDeleteAPI(const std::string &sessionId);
/// Refuses an empty id silently.
OVRADRNODE_EXPORT Request getDRNodeSessionGetAPI(const std::string &sessionId);

/// \param additional  names of further facts to answer with, e.g. "timezone"
OVRADRNODE_EXPORT Request getDRNodeInfoAPI(const std::vector<std::string> &additional);
OVRADRNODE_EXPORT Request getDRNodeTestPrivilegeAPI();
/// Invalid endpoints are left out; refused when none is left.
OVRADRNODE_EXPORT Request getDRNodeTestConnectionAPI(const std::vector<Conn> &conns);
/// \param timeout  seconds
OVRADRNODE_EXPORT Request getDRNodeTestSyncSpeedAPI(const std::string &nodeId, int retries,
                                                    int timeout);
/// \param timeout  seconds
OVRADRNODE_EXPORT Request getDRNodeTestDownloadSpeedAPI(const std::string &url, int retries,
                                                        int timeout);

// Credentials that a node holds. Those that carry a password or a session travel sealed.
OVRADRNODE_EXPORT Request getDRNodeCredCreateAPI(const Conn &conn, const std::string &session,
                                                 const std::string &credDirection);
OVRADRNODE_EXPORT Request getDRNodeCredCreateAPI(const Conn &conn, const std::string &account,
                                                 const std::string &password,
                                                 const std::string &otpcode,
                                                 const std::string &credDirection);
OVRADRNODE_EXPORT Request getDRNodeCredCreateAPI(const std::string &credId);
OVRADRNODE_EXPORT Request getDRNodeCredGetAPI(const std::string &credId);
OVRADRNODE_EXPORT Request getDRNodeCredSetAPI(const std::string &credId, const Conn &conn,
                                              const std::string &account,
                                              const std::string &password,
                                              const std::string &otpcode);
/// Has the receiver send `request` on over its credential.
OVRADRNODE_EXPORT Request getDRNodeCredRelayAPI(const std::string &credId, const Request &request);
OVRADRNODE_EXPORT Request getDRNodeCredReverseCreateAPI(const std::string &credId,
                                                        const Conn &conn);
OVRADRNODE_EXPORT Request getDRNodeTestCredReverseCreateAPI(const std::string &credId,
                                                            const Conn &conn);
OVRADRNODE_EXPORT Request getDRNodeTestCredCreateAPI(const Conn &conn, const std::string &account,
                                                     const std::string &session);
OVRADRNODE_EXPORT Request getDRNodeTestCredCreateAPI(const Conn &conn, const std::string &account,
                                                     const std::string &password,
                                                     const std::string &otpcode);
OVRADRNODE_EXPORT Request getDRNodeTestCredSetAPI(const std::string &credId, const Conn &conn,
                                                  const std::string &account,
                                                  const std::string &password,
                                                  const std::string &otpcode);
OVRADRNODE_EXPORT Request getDRNodeTempCredCreateAPI(const Conn &conn, const std::string &account,
                                                     const std::string &password,
                                                     const std::string &otpcode);
OVRADRNODE_EXPORT Request getDRNodeTempCredCreateAPI(const Conn &conn, const std::string &session);
OVRADRNODE_EXPORT Request getDRNodeTempCredReverseCreateAPI(const std::string &credId,
                                                            const Conn &conn);

/// Whether `request` is a relayed test of privilege.
OVRADRNODE_EXPORT bool isRelayTestPrivilegeAPI(const Request &request);

} // namespace WebAPI
} // namespace OvraDRNode
