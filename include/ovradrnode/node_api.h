// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrnode/conn.h"
#include "ovradrnode/export.h"

#include <ovradrcore/request.h>

#include <string>
#include <vector>

namespace OvraDRNode {

/// The requests that nodes exchange. A builder that rejects its arguments logs one ERR line and
/// returns an invalid Request; check isValid() before sending. docs/ovradrd.md lists them all.
namespace WebAPI {

using OvraDRCore::Request;

/// Looks up a user; rejects an empty name silently.
OVRADRNODE_EXPORT Request OvraCoreUserGetAPI(const std::string &user);

OVRADRNODE_EXPORT Request getDRNodeSessionCreateAPI(const std::string &nodeId);
OVRADRNODE_EXPORT Request getDRNodeSessionTempCreateAPI();
OVRADRNODE_EXPORT Request getDRNodeSessionDeleteAPI(const std::string &sessionId);
/// Rejects an empty id silently.
OVRADRNODE_EXPORT Request getDRNodeSessionGetAPI(const std::string &sessionId);

/// \param additional  names of additional facts to include, e.g. "timezone"
OVRADRNODE_EXPORT Request getDRNodeInfoAPI(const std::vector<std::string> &additional);
OVRADRNODE_EXPORT Request getDRNodeTestPrivilegeAPI();
/// Invalid endpoints are left out; rejected if none is left.
OVRADRNODE_EXPORT Request getDRNodeTestConnectionAPI(const std::vector<Conn> &conns);
/// \param timeout  seconds
OVRADRNODE_EXPORT Request getDRNodeTestSyncSpeedAPI(const std::string &nodeId, int retries,
                                                    int timeout);
/// \param timeout  seconds
OVRADRNODE_EXPORT Request getDRNodeTestDownloadSpeedAPI(const std::string &url, int retries,
                                                        int timeout);

// Requests about credentials that a node holds. Those that carry a password or a session are
// sealed.
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
/// Has the receiver forward `request` over its credential.
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

/// Whether `request` is a relayed privilege test.
OVRADRNODE_EXPORT bool isRelayTestPrivilegeAPI(const Request &request);

} // namespace WebAPI
} // namespace OvraDRNode
