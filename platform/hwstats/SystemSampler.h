// Reads the system's sources on a thread of its own, so that a file of the kernel that waits for its driver (a PCM that
// is just being opened, a governor that is just at work) holds up nobody: who asks waits a bounded time and goes on
// without. Thread-safe; one sampling at a time. The thread begins with the first sampling and sleeps between them.
#pragma once

#include "platform/Clock.h"
#include "platform/hwstats/Samples.h"
#include "platform/hwstats/SystemSource.h"

#include <chrono>
#include <condition_variable>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace vela::platform::hwstats {

class SystemSampler {
public:
    static constexpr std::chrono::milliseconds kMostWait{100};

    /// `root` is "" for this machine's own. The clock outlives it.
    SystemSampler(std::string root, const Clock& clock);
    /// Waits for a reading that is under way.
    ~SystemSampler();
    SystemSampler(const SystemSampler&) = delete;
    SystemSampler& operator=(const SystemSampler&) = delete;

    /// Adds the blocks of `sources`, which outlive this, as they are at `samples.time`. False, and nothing is added,
    /// when that takes longer than `wait`, or an earlier reading still goes on by then.
    bool sample(const std::vector<SystemSource*>& sources, Samples& samples,
                std::chrono::milliseconds wait = kMostWait);

    /// Whether a reading is under way. Between samplings that is one that took too long, and whoever waits for it waits
    /// in vain, as a rule.
    bool isBusy();

private:
    struct Reading {
        std::vector<SystemSource*> sources;
        Samples samples;
        bool done = false;
    };

    void run();
    void read(Reading& reading) const;
    bool begin();

    const std::string root_;
    const Clock& clock_;

    std::mutex mutex_;
    std::condition_variable changed_;
    // Guarded by mutex_:
    std::shared_ptr<Reading> reading_; ///< asked for or under way
    bool ending_ = false;
    std::thread thread_;
};

} // namespace vela::platform::hwstats
