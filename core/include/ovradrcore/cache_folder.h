// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "ovradrcore/export.h"

#include <string>

namespace OvraDRCore {

/// Makes the folder of cache files, mode 0700, and moves away one that others could have put there,
/// as the first write to a cache would.
/// \return "", or why this process goes without caches: the end of a sentence about the folder
OVRADRCORE_EXPORT std::string prepareCacheFolder(const std::string &directory);

/// From now on this process makes no folder for cache files, and goes without where there is none:
/// for a program that others than the user of the appliance may run, whom the folder would belong
/// to. Other processes are not affected.
OVRADRCORE_EXPORT void makeNoCacheFolder();

} // namespace OvraDRCore
