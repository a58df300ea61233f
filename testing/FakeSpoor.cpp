#include "testing/FakeSpoor.h"

#include "common/TextFormat.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <thread>

namespace vela::testing {

using platform::SerialQueue;
using platform::SpoorEvent;
using platform::UniqueFunction;

/// What a session shares with the items on its queue, which may run when the session is gone.
struct FakeSpoor::SessionState {
    struct Range {
        std::uint32_t first = 0;
        std::uint32_t last = 0;
        UniqueFunction<void(const SpoorEvent&)> handler;
    };

    bool wants(std::uint32_t code) const VELA_REQUIRES(mutex) {
        return std::any_of(ranges.begin(), ranges.end(),
                           [code](const Range& range) { return code >= range.first && code <= range.last; });
    }
    /// On the session's queue. Ranges stay as they are once events come.
    void handle(const SpoorEvent& event) VELA_NO_THREAD_SAFETY_ANALYSIS {
        for (Range& range : ranges) {
            if (event.eventCode >= range.first && event.eventCode <= range.last) {
                range.handler(event);
            }
        }
    }
    bool isGone() const {
        const MutexLock lock(mutex);
        return destroyed;
    }

    mutable Mutex mutex;
    std::vector<Range> ranges VELA_GUARDED_BY(mutex);
    UniqueFunction<void()> completion VELA_GUARDED_BY(mutex);
    SerialQueue* queue VELA_GUARDED_BY(mutex) = nullptr; ///< where a start was tried
    bool wallTimes VELA_GUARDED_BY(mutex) = false;
    bool collects VELA_GUARDED_BY(mutex) = false;
    bool ended VELA_GUARDED_BY(mutex) = false;
    bool destroyed VELA_GUARDED_BY(mutex) = false;

    static void deliver(const std::shared_ptr<SessionState>& state, std::vector<SpoorEvent> events) {
        const MutexLock lock(state->mutex);
        if (!state->collects) {
            return;
        }
        std::erase_if(events, [&state](const SpoorEvent& event)
                                  VELA_NO_THREAD_SAFETY_ANALYSIS { return !state->wants(event.eventCode); });
        if (!events.empty()) {
            state->queue->post([state, list = std::move(events)] {
                for (const SpoorEvent& event : list) {
                    if (state->isGone()) {
                        return;
                    }
                    state->handle(event);
                }
            });
        }
    }

    /// What an ended session owes, once.
    static void complete(const std::shared_ptr<SessionState>& state) {
        const MutexLock lock(state->mutex);
        if (!state->ended || state->destroyed || !state->completion) {
            return;
        }
        state->queue->post([state, handler = std::exchange(state->completion, {})]() mutable {
            if (!state->isGone()) {
                handler();
            }
        });
    }
};

class FakeSpoor::Session final : public platform::SpoorSession {
public:
    Session(FakeSpoor& spoor, std::shared_ptr<SessionState> state) : spoor_(spoor), state_(std::move(state)) {}
    ~Session() override {
        spoor_.note("destroy");
        {
            const MutexLock lock(state_->mutex);
            state_->destroyed = true;
            state_->collects = false;
        }
        const MutexLock lock(spoor_.mutex_);
        std::erase(spoor_.sessions_, state_);
    }
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;

    void setCompletionHandler(UniqueFunction<void()> handler) override {
        spoor_.note("completion handler");
        const MutexLock lock(state_->mutex);
        state_->completion = std::move(handler);
    }

    void setWallTimesEnabled(bool enabled) override {
        spoor_.note(enabled ? "wall times on" : "wall times off");
        const MutexLock lock(state_->mutex);
        state_->wallTimes = enabled;
    }

    int eventsRange(std::uint32_t first, std::uint32_t last, UniqueFunction<void(const SpoorEvent&)> handler) override {
        spoor_.note(formatText("range 0x%x-0x%x", first, last));
        if (const int error = spoor_.faults().range; error != 0) {
            return error;
        }
        const MutexLock lock(state_->mutex);
        state_->ranges.push_back({first, last, std::move(handler)});
        return 0;
    }

    int start(SerialQueue& queue) override {
        spoor_.note("start " + std::string(queue.name()));
        const int error = spoor_.faults().start;
        const MutexLock lock(state_->mutex);
        state_->queue = &queue;
        state_->collects = error == 0;
        return error;
    }

    int end() override {
        spoor_.note("end");
        const Faults faults = spoor_.faults();
        {
            const MutexLock lock(state_->mutex);
            if (state_->queue == nullptr) {
                return EINVAL; // nobody tried to start it: there is no queue to complete on
            }
            state_->collects = false;
            if (faults.end != 0) {
                return faults.end;
            }
            state_->ended = true;
        }
        if (faults.completes) {
            SessionState::complete(state_);
        }
        return 0;
    }

    std::uint64_t lostEvents() const override { return spoor_.faults().lost; }

    std::uint64_t nanoseconds(std::uint64_t timestamp) const override {
        const Faults faults = spoor_.faults();
        return timestamp * faults.numerator / faults.denominator;
    }

private:
    FakeSpoor& spoor_;
    const std::shared_ptr<SessionState> state_;
};

FakeSpoor::FakeSpoor() = default;
FakeSpoor::~FakeSpoor() = default;

void FakeSpoor::setTimeUnit(std::uint64_t numerator, std::uint64_t denominator) {
    const MutexLock lock(mutex_);
    faults_.numerator = numerator;
    faults_.denominator = denominator;
}

void FakeSpoor::failRange(int error) {
    const MutexLock lock(mutex_);
    faults_.range = error;
}

void FakeSpoor::failStart(int error) {
    const MutexLock lock(mutex_);
    faults_.start = error;
}

void FakeSpoor::failEnd(int error) {
    const MutexLock lock(mutex_);
    faults_.end = error;
}

void FakeSpoor::loseEvents(std::uint64_t count) {
    const MutexLock lock(mutex_);
    faults_.lost = count;
}

void FakeSpoor::setCompletes(bool completes) {
    const MutexLock lock(mutex_);
    faults_.completes = completes;
}

void FakeSpoor::completeEndedSessions() {
    for (const auto& state : sessions()) {
        SessionState::complete(state);
    }
}

void FakeSpoor::replay(const std::vector<SpoorEvent>& events) {
    for (const auto& state : sessions()) {
        SessionState::deliver(state, events);
    }
}

void FakeSpoor::setObserver(std::function<void(std::uint32_t)> observer) {
    const MutexLock lock(mutex_);
    observer_ = std::move(observer);
}

std::vector<std::uint32_t> FakeSpoor::codes() const {
    const MutexLock lock(mutex_);
    return codes_;
}

std::vector<std::string> FakeSpoor::calls() const {
    const MutexLock lock(mutex_);
    return calls_;
}

std::size_t FakeSpoor::liveSessions() const {
    const MutexLock lock(mutex_);
    return sessions_.size();
}

void FakeSpoor::clear() {
    const MutexLock lock(mutex_);
    codes_.clear();
    calls_.clear();
}

std::unique_ptr<platform::SpoorSession> FakeSpoor::createSession() {
    note("create");
    auto state = std::make_shared<SessionState>();
    const MutexLock lock(mutex_);
    sessions_.push_back(state);
    return std::make_unique<Session>(*this, std::move(state));
}

void FakeSpoor::emit(std::uint32_t eventCode, const std::array<std::uint64_t, 4>& arguments) {
    using std::chrono::microseconds;
    const auto wall = std::chrono::duration_cast<microseconds>(std::chrono::system_clock::now().time_since_epoch());
    SpoorEvent event;
    event.arguments = arguments;
    event.eventCode = eventCode;
    event.threadID = std::hash<std::thread::id>()(std::this_thread::get_id());
    std::function<void(std::uint32_t)> observer;
    {
        const MutexLock lock(mutex_);
        event.timestamp = ++time_;
        codes_.push_back(eventCode);
        observer = observer_;
    }
    for (const auto& state : sessions()) {
        SpoorEvent own = event;
        {
            const MutexLock lock(state->mutex);
            if (state->wallTimes) {
                own.wallTimeSeconds = wall.count() / std::micro::den;
                own.wallTimeMicroseconds = static_cast<std::int32_t>(wall.count() % std::micro::den);
            }
        }
        SessionState::deliver(state, {own});
    }
    if (observer) {
        observer(eventCode);
    }
}

FakeSpoor::Faults FakeSpoor::faults() const {
    const MutexLock lock(mutex_);
    return faults_;
}

void FakeSpoor::note(std::string call) {
    const MutexLock lock(mutex_);
    calls_.push_back(std::move(call));
}

std::vector<std::shared_ptr<FakeSpoor::SessionState>> FakeSpoor::sessions() const {
    const MutexLock lock(mutex_);
    return sessions_;
}

} // namespace vela::testing
