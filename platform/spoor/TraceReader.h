// Collects what emitters write, for all sessions of a service: holds the control page, the kernel's instance where
// there may be one, the rings, and a thread that reads both every 5 ms. At rest the thread sleeps. Thread-safe.
#pragma once

#include "platform/Result.h"
#include "platform/spoor/FtraceInstance.h"
#include "platform/spoor/RingFolder.h"
#include "platform/spoor/TraceBacklog.h"
#include "platform/spoor/TraceCollection.h"
#include "platform/spoor/TraceControl.h"
#include "platform/spoor/TraceMerge.h"

#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <sys/types.h>
#include <thread>
#include <vector>

namespace vela::platform::spoor {

struct TraceReaderOptions {
    std::string runtimeFolder;
    FtraceOptions ftrace; ///< without trace folders there are rings only
    std::optional<gid_t> emitterGroup;
};

class TraceReader {
public:
    /// Ends at once what a service before this one left active.
    explicit TraceReader(TraceReaderOptions options);
    /// Every collection has ended or was removed.
    ~TraceReader();
    TraceReader(const TraceReader&) = delete;
    TraceReader& operator=(const TraceReader&) = delete;

    /// Collects for `collection`: all that is emitted after this has returned. An error's number.
    int start(std::shared_ptr<TraceCollection> collection);
    /// Delivers what was emitted before, then completes it. Returns at once.
    void end(const TraceCollection& collection);
    /// The collection's queue is not used any more when this returns. Nothing happens when it had completed.
    void remove(const TraceCollection& collection);

    /// What all of its collections share.
    const std::shared_ptr<TraceBacklog>& backlog() const { return backlog_; }

    /// Whether the kernel collects, too. Once a collection has begun.
    bool usesFtrace();

private:
    struct Running {
        std::shared_ptr<TraceCollection> collection;
        std::optional<std::size_t> slot; ///< of the control page; none where nothing is asked for
        std::uint64_t begin = 0;
        std::optional<std::uint64_t> end; ///< when it was ended
    };

    // With the lock held.
    int openControl();
    int beginSources();
    void openFtrace();
    void endSources();
    bool startThread();
    void cycle();
    void deactivate(Running& running);
    std::vector<Running>::iterator find(const TraceCollection& collection);
    bool isAnyEnded() const;

    void run();
    void rest(std::unique_lock<std::mutex>& lock);

    const TraceReaderOptions options_;
    const std::shared_ptr<TraceBacklog> backlog_ = std::make_shared<TraceBacklog>();
    std::mutex mutex_; ///< guards all below; the thread gives it up while it waits
    std::condition_variable wake_;
    std::unique_ptr<TraceControl> control_;
    std::unique_ptr<FtraceInstance> ftrace_;
    bool triedFtrace_ = false;
    bool warm_ = false; ///< the kernel's buffer has its memory though nothing is collected
    RingFolder rings_;
    TraceMerge merge_;
    std::vector<Running> running_;
    bool stopping_ = false;
    std::thread thread_;
};

} // namespace vela::platform::spoor
