// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovrabase/expected.h"

#include <string>

namespace OvraBase {

/// Whether only the superuser and our own user can change what an absolute path leads to. Every
/// folder from the root on, every link and what is at the end belong to one of them, and neither
/// everybody nor a group other than ours and the superuser's may write there; a sticky folder, such
/// as /tmp, may be open to all. What is missing is nobody's. In a user namespace that does not know
/// all users (user_namespaces(7)) an unknown owner passes.
/// \return an error that names the place
[[nodiscard]] Expected<void> checkPathToRun(const std::string &path);

} // namespace OvraBase
