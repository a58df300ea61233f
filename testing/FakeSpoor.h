// A kernel trace facility in memory. What is emitted, or replayed with times of its own, goes to the sessions that
// collect at that moment; faults come on demand. Thread-safe; outlives its sessions.
#pragma once

#include "platform/Mutex.h"
#include "platform/Spoor.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace vela::testing {

class FakeSpoor final : public platform::Spoor {
public:
    using platform::Spoor::emit;

    FakeSpoor();
    ~FakeSpoor() override;
    FakeSpoor(const FakeSpoor&) = delete;
    FakeSpoor& operator=(const FakeSpoor&) = delete;

    // What a test arranges, for everything from then on.
    /// One unit of a timestamp lasts `numerator` / `denominator` nanoseconds. At first it is one nanosecond.
    void setTimeUnit(std::uint64_t numerator, std::uint64_t denominator);
    /// `eventsRange` and `start` answer these, and a session whose range or start failed gets no events; 0 ends it.
    void failRange(int error);
    void failStart(int error);
    /// `end` answers this and the session does not complete; 0 ends it.
    void failEnd(int error);
    /// So many events were lost, each session says.
    void loseEvents(std::uint64_t count);
    /// Whether ended sessions complete. What they owe comes by `completeEndedSessions`.
    void setCompletes(bool completes);
    void completeEndedSessions();
    /// Delivers `events` as they are to every session that collects.
    void replay(const std::vector<platform::SpoorEvent>& events);
    /// Called after every event that is emitted, outside the lock.
    void setObserver(std::function<void(std::uint32_t eventCode)> observer);

    // What a test looks at.
    /// Codes of the events that were emitted.
    std::vector<std::uint32_t> codes() const;
    /// What sessions were asked for: "create", "completion handler", "wall times on", "range 0x1-0x2", "start NAME",
    /// "end", "destroy".
    std::vector<std::string> calls() const;
    /// Sessions that were created and are not destroyed.
    std::size_t liveSessions() const;
    void clear();

    std::unique_ptr<platform::SpoorSession> createSession() override;
    void emit(std::uint32_t eventCode, const std::array<std::uint64_t, 4>& arguments) override;

private:
    class Session;
    struct SessionState;
    struct Faults {
        int range = 0;
        int start = 0;
        int end = 0;
        std::uint64_t lost = 0;
        bool completes = true;
        std::uint64_t numerator = 1;
        std::uint64_t denominator = 1;
    };

    Faults faults() const;
    void note(std::string call);
    std::vector<std::shared_ptr<SessionState>> sessions() const;

    mutable Mutex mutex_;
    std::vector<std::uint32_t> codes_ VELA_GUARDED_BY(mutex_);
    std::vector<std::string> calls_ VELA_GUARDED_BY(mutex_);
    std::vector<std::shared_ptr<SessionState>> sessions_ VELA_GUARDED_BY(mutex_);
    std::function<void(std::uint32_t)> observer_ VELA_GUARDED_BY(mutex_);
    Faults faults_ VELA_GUARDED_BY(mutex_);
    std::uint64_t time_ VELA_GUARDED_BY(mutex_) = 0; ///< of the last event emitted, in a timestamp's units
};

} // namespace vela::testing
