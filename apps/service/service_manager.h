// SPDX-License-Identifier: Apache-2.0
#pragma once

#include <string>

/// How a daemon is, for the service manager that started it (sd_notify(3)). Without one each of
/// these does nothing.
namespace OvraService {

/// It serves. \param status  one line for `systemctl status`
void tellReady(const std::string &status);
/// It begins to read its settings again; tellReady() ends that.
void tellReloading();
void tellStopping();
/// It is not stuck: to be called at least twice in the unit's WatchdogSec=.
void tellAlive();

} // namespace OvraService
