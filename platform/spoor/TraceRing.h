// A ring on its emitter's side. One thread at a time writes to it, without a lock, a system call or an allocation, and
// never waits: the oldest events make room for new ones. Making it is work and makes system calls.
#pragma once

#include "platform/Result.h"
#include "platform/linux/FileDescriptor.h"
#include "platform/spoor/RingFormat.h"

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>

namespace vela::platform::spoor {

class TraceRing {
public:
    /// Makes a ring in `folder`, which is there. All of its memory is present afterwards, and locked while all locked
    /// rings of the process are below half of what it may lock (RLIMIT_MEMLOCK).
    static Result<std::unique_ptr<TraceRing>> create(const std::string& folder);
    /// The file stays, for its reader to come to its end.
    ~TraceRing();
    TraceRing(const TraceRing&) = delete;
    TraceRing& operator=(const TraceRing&) = delete;

    /// The calling thread is the one that writes from now on.
    void adopt();

    /// False, and the event counts as lost, when it comes in the midst of another one of the same thread: from a
    /// handler of a signal.
    bool write(std::uint64_t time, std::uint32_t code, const TraceArguments& arguments);
    /// Any thread.
    void addLost(std::uint64_t events) { std::atomic_ref(header_->lost).fetch_add(events, std::memory_order_relaxed); }

    const std::string& path() const { return path_; }
    void remove() const;

private:
    TraceRing() = default;

    std::string path_;
    FileDescriptor file_; ///< its lock tells that the emitter lives
    RingHeader* header_ = nullptr;
    bool locked_ = false;
    std::uint64_t head_ = 0;
    std::uint64_t thread_ = 0;
    volatile bool writing_ = false;
};

} // namespace vela::platform::spoor
