#include "platform/spoor/TraceCollection.h"

#include <algorithm>
#include <utility>

namespace vela::platform::spoor {

namespace {

constexpr std::int64_t kNanosecondsPerSecond = 1'000'000'000;
constexpr std::int64_t kNanosecondsPerMicrosecond = 1'000;

bool holds(const TraceCollection::Range& range, std::uint32_t code) {
    return range.first <= code && code <= range.last;
}

} // namespace

class TraceCollection::Delivering {
public:
    explicit Delivering(TraceCollection& collection) : collection_(collection), lock_(collection.delivering_) {
        collection_.deliverer_ = std::this_thread::get_id();
    }
    ~Delivering() { collection_.deliverer_ = std::thread::id(); }
    Delivering(const Delivering&) = delete;
    Delivering& operator=(const Delivering&) = delete;

private:
    TraceCollection& collection_;
    const std::lock_guard<std::mutex> lock_;
};

/// Events on their way, which wait until this is gone: also where the queue is destroyed and never passes them.
class TraceCollection::Batch {
public:
    Batch(std::shared_ptr<TraceCollection> collection, std::vector<TraceRecord> records)
        : collection_(std::move(collection)),
          records_(std::move(records)) {}
    Batch(Batch&& other) noexcept = default;
    Batch& operator=(Batch&&) = delete;
    Batch(const Batch&) = delete;
    Batch& operator=(const Batch&) = delete;
    ~Batch() {
        if (collection_ != nullptr) {
            collection_->waiting_ -= records_.size();
            collection_->backlog_->giveBack(records_.size());
        }
    }

    void pass() const { collection_->pass(records_); }

private:
    std::shared_ptr<TraceCollection> collection_;
    std::vector<TraceRecord> records_;
};

bool TraceCollection::isWanted(const TraceRecord& record) const {
    return std::ranges::any_of(ranges_, [&](const Range& range) { return holds(range, record.code); });
}

void TraceCollection::deliver(std::span<const TraceRecord> records, std::uint64_t begin, std::uint64_t end) {
    std::vector<TraceRecord> wanted;
    for (const TraceRecord& record : records) {
        if (begin <= record.time && record.time <= end && isWanted(record)) {
            wanted.push_back(record);
        }
    }
    if (wanted.empty()) {
        return;
    }
    const std::uint64_t room = kMostWaiting - std::min<std::uint64_t>(kMostWaiting, waiting_);
    const std::uint64_t taken = backlog_->take(std::min<std::uint64_t>(room, wanted.size()));
    addLost(wanted.size() - taken);
    wanted.resize(static_cast<std::size_t>(taken));
    waiting_ += taken;
    queue_->post([batch = Batch(shared_from_this(), std::move(wanted))] { batch.pass(); });
}

SpoorEvent TraceCollection::eventOf(const TraceRecord& record) const {
    SpoorEvent event;
    event.timestamp = record.time;
    event.arguments = record.arguments;
    event.threadID = record.thread;
    event.eventCode = record.code;
    event.cpu = record.cpu;
    event.processID = record.process;
    if (wallOffset_) {
        const auto wall = static_cast<std::int64_t>(record.time) + *wallOffset_;
        const std::int64_t fraction = (wall % kNanosecondsPerSecond + kNanosecondsPerSecond) % kNanosecondsPerSecond;
        event.wallTimeSeconds = (wall - fraction) / kNanosecondsPerSecond;
        event.wallTimeMicroseconds = static_cast<std::int32_t>(fraction / kNanosecondsPerMicrosecond);
    }
    return event;
}

void TraceCollection::pass(const std::vector<TraceRecord>& records) {
    const Delivering scope(*this);
    for (const TraceRecord& record : records) {
        const SpoorEvent event = eventOf(record);
        for (Range& range : ranges_) {
            if (cancelled_) {
                return;
            }
            if (holds(range, record.code) && range.handler) {
                range.handler(event);
            }
        }
    }
}

void TraceCollection::complete(std::shared_ptr<TraceCollection> collection) {
    SerialQueue& queue = *collection->queue_;
    queue.post([self = std::move(collection)] { self->passCompletion(); });
}

void TraceCollection::passCompletion() {
    UniqueFunction<void()> handler; // destroyed behind the scope: what it holds may be the session
    {
        const Delivering scope(*this);
        if (cancelled_ || !completion_) {
            return;
        }
        handler = std::exchange(completion_, {});
        handler();
    }
}

void TraceCollection::cancel() {
    cancelled_ = true;
    if (deliverer_.load() != std::this_thread::get_id()) {
        const std::lock_guard<std::mutex> lock(delivering_);
    }
}

} // namespace vela::platform::spoor
