// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "failure.h"
#include "remote_login.h"

#include <ovradrnode/conn.h>
#include <ovradrnode/cred_reverse_create.h>
#include <ovradrnode/node_create.h>

#include <string>
#include <vector>

// The steps of a pairing, as the commands combine them.
namespace Ovradr {

/// The account of this appliance with whose rights invited nodes come, unless another is named.
inline constexpr char kPairingAccount[] = "pairing";

/// Why a creation at `conn` failed.
Refusal creationFailure(const OvraDRNode::CredCreate &flow, const OvraDRNode::Conn &conn);

/// Proves the flow by account and password; see logIn().
[[nodiscard]] Expected<void> proveByAccount(OvraDRNode::CredCreate &flow, const RemoteLogin &login,
                                            const OvraDRNode::Conn &conn);

/// Asks the other end, of a flow that has proved itself, which node it is. This appliance itself is
/// refused.
[[nodiscard]] Expected<void> meetNode(OvraDRNode::CredCreate &flow, const OvraDRNode::Conn &conn);

/// Creates the credential with the node that was met.
[[nodiscard]] Expected<void> createCred(OvraDRNode::CredCreate &flow, const OvraDRNode::Conn &conn);

/// Makes sure that the daemon of this appliance runs and that the account may pair.
/// \param account  "": kPairingAccount, which is made with the role pairing if it is missing, with
///                 a password that nobody knows
/// \return its name
[[nodiscard]] Expected<std::string> localAccount(const std::string &account);

/// The endpoints to offer: the named ones, or all of this appliance.
[[nodiscard]] Expected<std::vector<OvraDRNode::Conn>>
offeredConns(const std::vector<std::string> &endpoints);

/// Why no credential was made back to this appliance.
Refusal reverseFailure(const OvraDRNode::CredReverseCreate &flow);

} // namespace Ovradr
