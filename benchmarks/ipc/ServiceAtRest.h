// What the service costs before and between messages: its first reply after a start on demand, and what it uses while
// nobody asks anything of it.
#pragma once

#include <cstdint>
#include <vector>

namespace vela::ipcbench {

/// Seconds from a client's connect to the first reply of a service that this connection starts, `times` times, sorted.
/// Empty where systemd-socket-activate is not there.
std::vector<double> firstReplies(unsigned times);

struct AtRest {
    double residentBytes = 0;
    std::uint64_t wakeUps = 0; ///< voluntary context switches of all threads
    std::uint64_t preempted = 0;
};

/// Of a service without clients, or with one whose session is started and has sent a hundred messages; over `seconds`.
AtRest serviceAtRest(bool withSession, unsigned seconds);

} // namespace vela::ipcbench
