// The reply that a start owes its client: due when what the start set in motion has reached its outcome.
//
//     begun, set-up queued --outcome--> ended      a block stored before the outcome is called at it,
//     begun, nothing queued ----------> ended      one stored afterwards at once
//
// Every start has its own transaction: the outcome of an earlier start does not answer a later one. Whatever is called
// is called once, with no error and true, outside the lock. Thread-safe.
#pragma once

#include "platform/Ipc.h"
#include "platform/Mutex.h"

#include <cstdint>
#include <optional>
#include <utility>

namespace vela {

class VelaReportingStartTransaction {
public:
    using Block = platform::IpcReply<bool>;

    /// A start begins; `setupQueued`: whether its outcome is still to come. Answers the start's number.
    std::uint64_t begin(bool setupQueued) {
        const MutexLock lock(mutex_);
        ended_ = !setupQueued;
        return ++startNumber_;
    }

    /// The outcome of the start numbered `startNumber`.
    void end(std::uint64_t startNumber) {
        if (Block due = endIfCurrent(startNumber)) {
            due(std::nullopt, true);
        }
    }

    /// Stores `block`, in the place of what is stored, or calls it at once when the outcome is known.
    void setBlock(Block block) {
        if (Block due = storeUnlessEnded(block)) {
            due(std::nullopt, true);
        }
    }

    /// Calls and clears the block that is stored. Whether there was one.
    bool callBlock() {
        Block due = take();
        if (!due) {
            return false;
        }
        due(std::nullopt, true);
        return true;
    }

private:
    // Test and taking under one lock: between two, a later start could store its block.
    Block endIfCurrent(std::uint64_t startNumber) {
        const MutexLock lock(mutex_);
        if (startNumber != startNumber_) {
            return {};
        }
        ended_ = true;
        return std::exchange(block_, Block());
    }
    Block storeUnlessEnded(Block& block) {
        const MutexLock lock(mutex_);
        if (ended_) {
            return std::move(block);
        }
        std::swap(block_, block);
        return {};
    }
    Block take() {
        const MutexLock lock(mutex_);
        return std::exchange(block_, Block());
    }

    Mutex mutex_;
    std::uint64_t startNumber_ VELA_GUARDED_BY(mutex_) = 0;
    bool ended_ VELA_GUARDED_BY(mutex_) = true;
    Block block_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela
