// One session's collection: what it asked for, and its side of the delivery. The session fills it in before the start;
// then the reader hands events over, which items of the session's queue pass to the handlers. Those items keep it
// alive. Thread-safe from the start on.
#pragma once

#include "platform/Spoor.h"
#include "platform/WorkQueue.h"
#include "platform/spoor/TraceBacklog.h"
#include "platform/spoor/TraceRecord.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <span>
#include <thread>
#include <utility>
#include <vector>

namespace vela::platform::spoor {

class TraceCollection : public std::enable_shared_from_this<TraceCollection> {
public:
    /// Events that wait on the session's queue; what comes beyond them, or beyond the backlog's room, is lost.
    static constexpr std::uint64_t kMostWaiting = std::uint64_t{1} << 20U;

    explicit TraceCollection(std::shared_ptr<TraceBacklog> backlog) : backlog_(std::move(backlog)) {}

    struct Range {
        std::uint32_t first;
        std::uint32_t last;
        UniqueFunction<void(const SpoorEvent&)> handler;
    };

    // Before the start.
    void addRange(Range range) { ranges_.push_back(std::move(range)); }
    void setQueue(SerialQueue& queue) { queue_ = &queue; }
    void setCompletion(UniqueFunction<void()> completion) { completion_ = std::move(completion); }
    void setWallOffset(std::int64_t nanoseconds) { wallOffset_ = nanoseconds; }

    const std::vector<Range>& ranges() const { return ranges_; }

    /// Hands over those of `records`, in time order, that are the session's and between `begin` and `end`. Never
    /// blocks. Together with `complete` and `addLost`: one thread at a time.
    void deliver(std::span<const TraceRecord> records, std::uint64_t begin, std::uint64_t end);
    void addLost(std::uint64_t events) { lost_ = saturatingSum(lost_, events); }
    /// Lets go of the reader's hold on `collection` first: handlers, and what they hold, are not for its thread.
    static void complete(std::shared_ptr<TraceCollection> collection);

    /// No handler is called any more when this returns, but for one that is running on the calling thread.
    void cancel();

    std::uint64_t lost() const { return lost_; }

private:
    class Batch;
    class Delivering;

    void pass(const std::vector<TraceRecord>& records);
    void passCompletion();
    bool isWanted(const TraceRecord& record) const;
    SpoorEvent eventOf(const TraceRecord& record) const;

    const std::shared_ptr<TraceBacklog> backlog_;

    // Constant after the start.
    std::vector<Range> ranges_;
    SerialQueue* queue_ = nullptr;
    std::optional<std::int64_t> wallOffset_; ///< of the day's time over the monotonic one, ns; none: not wanted

    UniqueFunction<void()> completion_; ///< the queue's, from the start on
    std::atomic<std::uint64_t> waiting_ = 0;
    std::atomic<std::uint64_t> lost_ = 0;
    std::atomic<bool> cancelled_ = false;
    std::mutex delivering_; ///< held while handlers run; who cancels waits for it
    std::atomic<std::thread::id> deliverer_;
};

} // namespace vela::platform::spoor
