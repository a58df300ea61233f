// One measurement of one subject: many clients at once, each on a thread of its own.
#pragma once

#include "benchmarks/ipc/Subject.h"

#include <chrono>
#include <cstddef>
#include <cstdint>

namespace vela::ipcbench {

enum class Phase : std::uint8_t {
    Waiting,         ///< each client waits for each reply
    WaitingTogether, ///< the same, clients and server on one processor
    WaitingApart,    ///< the same, clients and server on different processors
    InFlight,        ///< kInFlight calls under way, of all clients together
    OneWay,          ///< without replies; the last call has one
};

inline constexpr unsigned kInFlight = 256;

struct Measurement {
    double p50 = 0;        ///< seconds a client waited for a reply; only in the waiting phases
    double p99 = 0;        ///< likewise
    double rate = 0;       ///< messages a second, of all clients together
    double clientTime = 0; ///< processor seconds per message
    double serverTime = 0; ///< likewise, with all that the server still does when the replies are out
    double lost = 0;       ///< share of the deliveries that the server gave up, none of which it should
    bool measured = false;
};

/// Starts a server, sends it about `messages` from `clients` clients, and ends it.
Measurement measure(const Subject& subject, unsigned clients, Phase phase, std::size_t messages);

/// Processor time that a process has used.
double processorSeconds(pid_t process);

/// Waits until a process uses no more processor time: nothing for 0.3 seconds, which is longer
/// than its store keeps a delivery uncommitted. Answers what it has used then.
double processorSecondsWhenIdle(pid_t process);

} // namespace vela::ipcbench
