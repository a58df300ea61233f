// The kernel trace facility: sessions that collect trace events, and the emission of single events.
#pragma once

#include "platform/UniqueFunction.h"
#include "platform/WorkQueue.h"

#include <array>
#include <cstdint>
#include <memory>

namespace vela::platform {

/// One collected event.
struct SpoorEvent {
    std::uint64_t timestamp = 0; ///< in the session's own time units
    std::array<std::uint64_t, 4> arguments{};
    std::uint64_t threadID = 0;
    std::uint32_t eventCode = 0;
    std::uint32_t cpu = 0;
    std::int64_t wallTimeSeconds = 0;
    std::int32_t wallTimeMicroseconds = 0;
    std::int32_t processID = 0; ///< as the emitter says; 0 where it says nothing
};

/// Used by one thread at a time but for what says otherwise. Every session that was ended completes exactly once, also
/// after a failed start, and may be destroyed inside its own completion handler. Destroying it before that ends it
/// without a completion.
class SpoorSession {
public:
    virtual ~SpoorSession() = default;

    /// Called once on the session's queue when it has ended, after its last event.
    virtual void setCompletionHandler(UniqueFunction<void()> handler) = 0;
    virtual void setWallTimesEnabled(bool enabled) = 0;
    /// Delivers every event with a code from `first` to `last`, both included, to `handler`. 0, or an error number.
    virtual int eventsRange(std::uint32_t first, std::uint32_t last,
                            UniqueFunction<void(const SpoorEvent&)> handler) = 0;
    /// Starts to collect; events are delivered on `queue`. 0, or an error number.
    virtual int start(SerialQueue& queue) = 0;
    /// Ends the collection: what was emitted before is delivered, then the completion handler is called.
    virtual int end() = 0;
    /// Events that were emitted and could not be delivered. For the completion handler: it is final then.
    virtual std::uint64_t lostEvents() const = 0;
    /// Any thread.
    virtual std::uint64_t nanoseconds(std::uint64_t timestamp) const = 0;
};

/// Thread-safe.
class Spoor {
public:
    virtual ~Spoor() = default;

    virtual std::unique_ptr<SpoorSession> createSession() = 0;

    /// Emits one event. Costs a load and a branch while no session collects.
    virtual void emit(std::uint32_t eventCode, const std::array<std::uint64_t, 4>& arguments) = 0;
    void emit(std::uint32_t eventCode) { emit(eventCode, {}); }
};

} // namespace vela::platform
