// SPDX-License-Identifier: Apache-2.0
#pragma once

#include "service/http_server.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <thread>

namespace Ovradrd {

/// Keeps the appliance reachable under its alias as long as the settings name one: its own thread
/// polls the relay service for callers and connects to it once for each. Changed settings take
/// effect within 20 seconds.
class FarlinkAgent {
public:
    struct Status {
        bool connected = false;
        int port = 0; ///< where callers of the alias connect
        std::int64_t expires = 0;
        std::string problem; ///< why it is not connected; "" while it is
    };

    /// \param take  receives every caller, in the agent's thread
    explicit FarlinkAgent(std::function<void(OvraService::ConnectedClient)> take);
    FarlinkAgent(const FarlinkAgent &) = delete;
    FarlinkAgent &operator=(const FarlinkAgent &) = delete;
    /// The thread may outlive the object; it then touches only its own state.
    ~FarlinkAgent();

    /// Begins.
    void start();
    Status status() const;
    /// Takes no more callers. \return whether the thread is gone by `deadline`, or never began
    bool stop(std::chrono::steady_clock::time_point deadline);

private:
    struct State;
    static void run(const std::shared_ptr<State> &state);
    static void runToTheEnd(const std::shared_ptr<State> &state);

    std::shared_ptr<State> state_;
    std::thread thread_;
};

} // namespace Ovradrd
