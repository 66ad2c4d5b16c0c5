// SPDX-License-Identifier: Apache-2.0
#include "service/service_manager.h"

#include <systemd/sd-daemon.h>

#include <chrono>

namespace OvraService {

void tellReady(const std::string &status) {
    sd_notify(0, ("READY=1\nSTATUS=" + status).c_str());
}

void tellReloading() {
    // Of the clock that CLOCK_MONOTONIC is, as Type=notify-reload demands.
    const auto now = std::chrono::steady_clock::now().time_since_epoch();
    const auto microseconds = std::chrono::duration_cast<std::chrono::microseconds>(now).count();
    sd_notify(0, ("RELOADING=1\nMONOTONIC_USEC=" + std::to_string(microseconds)).c_str());
}

void tellStopping() {
    sd_notify(0, "STOPPING=1");
}

void tellAlive() {
    sd_notify(0, "WATCHDOG=1");
}

} // namespace OvraService
