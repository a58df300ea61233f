// The queues that wait for a thread, most urgent first, first come first served within one urgency. A less urgent queue
// is passed over a bounded number of times, so that background work is slow at worst, never starved. Not thread-safe.
#pragma once

#include "platform/WorkQueue.h"

#include <array>
#include <cstddef>
#include <deque>
#include <memory>
#include <utility>

namespace vela::platform {

template <class Queue>
class ReadyQueues {
public:
    /// How often a waiting urgency is passed over before its turn comes.
    static constexpr unsigned kPasses = 16;

    bool empty() const { return mask_ == 0; }

    /// Bit n tells whether a queue of the n-th urgency waits.
    unsigned mask() const { return mask_; }

    void push(QualityOfService quality, std::shared_ptr<Queue> queue) {
        const auto level = static_cast<std::size_t>(quality);
        levels_[level].queues.push_back(std::move(queue));
        mask_ |= 1U << level;
    }

    /// Takes the next queue; there must be one.
    std::shared_ptr<Queue> take() {
        std::size_t chosen = kLevels;
        for (std::size_t level = 0; level < kLevels; ++level) {
            if (levels_[level].queues.empty()) {
                continue;
            }
            if (chosen == kLevels || ++levels_[level].passed > kPasses) {
                chosen = level;
            }
        }
        Level& level = levels_[chosen];
        level.passed = 0;
        std::shared_ptr<Queue> queue = std::move(level.queues.front());
        level.queues.pop_front();
        if (level.queues.empty()) {
            mask_ &= ~(1U << chosen);
        }
        return queue;
    }

private:
    static constexpr std::size_t kLevels = 4;

    struct Level {
        std::deque<std::shared_ptr<Queue>> queues;
        unsigned passed = 0;
    };

    std::array<Level, kLevels> levels_;
    unsigned mask_ = 0;
};

} // namespace vela::platform
