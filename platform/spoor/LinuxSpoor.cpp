#include "platform/spoor/LinuxSpoor.h"

#include <cerrno>
#include <utility>

namespace vela::platform {

namespace {

using spoor::TraceCollection;
using spoor::TraceReader;

/// Ranges of one session.
constexpr std::size_t kMostRanges = 64;

class LinuxSpoorSession final : public SpoorSession {
public:
    LinuxSpoorSession(std::shared_ptr<TraceReader> reader, const Clock& clock)
        : reader_(std::move(reader)),
          clock_(clock) {}
    ~LinuxSpoorSession() override {
        // In this order: what the reader has posted before its removal is not run behind the cancelling.
        reader_->remove(*collection_);
        collection_->cancel();
    }
    LinuxSpoorSession(const LinuxSpoorSession&) = delete;
    LinuxSpoorSession& operator=(const LinuxSpoorSession&) = delete;

    void setCompletionHandler(UniqueFunction<void()> handler) override {
        if (state_ == State::Fresh) {
            collection_->setCompletion(std::move(handler));
        }
    }
    void setWallTimesEnabled(bool enabled) override { wallTimes_ = enabled; }
    int eventsRange(std::uint32_t first, std::uint32_t last, UniqueFunction<void(const SpoorEvent&)> handler) override {
        if (first > last) {
            return EINVAL;
        }
        if (state_ != State::Fresh) {
            return EBUSY;
        }
        if (collection_->ranges().size() == kMostRanges) {
            return ENOSPC;
        }
        collection_->addRange({first, last, std::move(handler)});
        return 0;
    }
    int start(SerialQueue& queue) override {
        if (state_ != State::Fresh) {
            return EALREADY;
        }
        collection_->setQueue(queue);
        if (wallTimes_) {
            collection_->setWallOffset(
                (clock_.now().time_since_epoch() - clock_.monotonicNow().time_since_epoch()).count());
        }
        // From the start on, a handler may destroy this.
        const std::shared_ptr<TraceReader> reader = reader_;
        state_ = State::Running;
        const int error = reader->start(collection_);
        if (error != 0) {
            state_ = State::Failed;
        }
        return error;
    }
    int end() override {
        switch (std::exchange(state_, state_ == State::Fresh ? State::Fresh : State::Ended)) {
        case State::Fresh:
            return EINVAL; // nobody tried to start it: there is no queue to complete on
        case State::Ended:
            return EALREADY;
        case State::Failed:
            TraceCollection::complete(collection_);
            return 0;
        case State::Running:
            break;
        }
        // The completion may destroy this before the call returns.
        const std::shared_ptr<TraceReader> reader = reader_;
        reader->end(*collection_);
        return 0;
    }
    std::uint64_t lostEvents() const override { return collection_->lost(); }
    std::uint64_t nanoseconds(std::uint64_t timestamp) const override { return timestamp; }

private:
    enum class State : std::uint8_t { Fresh, Running, Failed, Ended };

    const std::shared_ptr<TraceReader> reader_;
    const Clock& clock_;
    const std::shared_ptr<TraceCollection> collection_ = std::make_shared<TraceCollection>(reader_->backlog());
    State state_ = State::Fresh;
    bool wallTimes_ = false;
};

spoor::TraceReaderOptions readerOptions(LinuxSpoorOptions options) {
    return {std::move(options.runtimeFolder),
            {std::move(options.traceFolders), std::move(options.instanceName), options.bufferKilobytes},
            options.emitterGroup};
}

} // namespace

LinuxSpoor::LinuxSpoor(LinuxSpoorOptions options, const Clock& clock)
    : clock_(clock),
      reader_(std::make_shared<TraceReader>(readerOptions(options))),
      emitter_({{options.runtimeFolder, true}}) {}

std::unique_ptr<SpoorSession> LinuxSpoor::createSession() {
    return std::make_unique<LinuxSpoorSession>(reader_, clock_);
}

} // namespace vela::platform
