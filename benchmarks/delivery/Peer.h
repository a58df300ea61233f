// What delivery_benchmark measures: one road of a message from this process to where it is kept. Each measurement
// starts its server anew (the journal's alone is the machine's), sends messages of ipc/BenchMessage.h one after another
// and waits until the last is kept.
#pragma once

#include "benchmarks/ipc/Subject.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <vector>

namespace vela::deliverybench {

using ipcbench::require;

/// Of one round.
struct Cost {
    double server = 0; ///< processor seconds per message, with what it still does when the last one is kept
    double client = 0; ///< likewise, of the thread that sends
    double rate = 0;   ///< messages a second, from the first call until the last is kept
    double bytes = 0;  ///< on the disk per message
};

struct Peer {
    std::string name;
    std::string keeps;  ///< when a message counts as kept
    std::string absent; ///< why it cannot be measured; empty where it can
    std::function<Cost(std::size_t messages)> measure;
};

/// `latencies`: where a program that reads the store meanwhile puts how long each of its reads took, in seconds; null
/// for no such program.
Peer servicePeer(std::vector<double>* latencies);
Peer journalPeer();
Peer redisPeer();
Peer writerPeer();

/// Processor seconds per message of the reporting queue, all bridges included, where nobody consumes an event; the
/// median of several rounds.
double reportingQueueShare();

using Clock = std::chrono::steady_clock;

/// A measurement of the calling thread and a server, from its construction on.
class Watch {
public:
    explicit Watch(pid_t server);

    /// The last message is kept. Without this call it counts as kept when the server came to rest.
    void kept() { kept_ = Clock::now(); }
    /// Waits until the server has rested for 300 ms. The size is the caller's to add.
    Cost costOf(std::size_t messages) const;

private:
    const pid_t server_;
    const double serverBefore_;
    const double clientBefore_;
    const Clock::time_point begin_;
    Clock::time_point kept_;
};

/// Sizes of the files in and below a folder, as the disk has them.
std::uintmax_t bytesBelow(const std::string& folder);

/// Moves the log of a store that SQLite keeps into its file, and answers the file's size.
std::uintmax_t sizeOfDatabase(const std::string& file);

/// Sends everything; a socket that is full is waited for.
void sendWhole(int socket, std::string_view bytes);

} // namespace vela::deliverybench
