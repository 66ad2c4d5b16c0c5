// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovradrcore/err_recorder.h>

#include <json/value.h>

namespace Ovradrd {

/// The error reply for a failed library operation: its code, and its message or the name of the
/// code.
///
/// \param otherwise  the code if the operation recorded none
///
/// A remote node's own refusals 105 and 119 concern the credential that was used there. They come
/// back as kNoPrivilege, so that the caller does not mistake them for refusals of its own session.
Json::Value flowError(const OvraDRCore::ErrRecorder &flow, int otherwise);

} // namespace Ovradrd
