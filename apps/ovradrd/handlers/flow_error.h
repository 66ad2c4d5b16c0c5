// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <ovradrcore/err_recorder.h>

#include <json/value.h>

namespace Ovradrd {

/// The error reply of an operation of the library that failed: its code, and its message or else
/// the name of the code.
///
/// \param otherwise  the code when the operation recorded none
///
/// A remote node's own refusals 105 and 119 concern the credential that was used there. They come
/// back as kNoPrivilege, so that the caller does not take them for refusals of its own session.
Json::Value flowError(const OvraDRCore::ErrRecorder &flow, int otherwise);

} // namespace Ovradrd
