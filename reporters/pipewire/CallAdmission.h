// Which calls are taken while many wait for a service. What is left out is left out whole: a session with everything of
// it, or a run from its start to its stop. So what was begun is always ended, and no end waits that nothing waits for.
// Queue-confined: its owner's lock.
#pragma once

#include "reporters/pipewire/ReportDelivery.h"

#include <cstddef>
#include <cstdint>
#include <map>

namespace vela::reporter {

class CallAdmission {
public:
    /// Beyond `mostCalls` only the stops of runs and the ends of sessions are taken whose start or creation was.
    explicit CallAdmission(std::size_t mostCalls) : mostCalls_(mostCalls) {}

    /// Whether to take the next call while `waiting` others wait.
    bool admits(const Call& call, std::size_t waiting);

private:
    enum class Missing : std::uint8_t { Session, Run };

    bool admits(const CreateCall& call, bool isFull);
    bool admits(const StartCall& call, bool isFull);
    bool admits(const SendCall& call, bool isFull);
    bool admits(const StopCall& call, bool isFull);
    bool admits(const DestroyCall& call, bool isFull);

    const std::size_t mostCalls_;
    std::map<std::int64_t, Missing> missing_; ///< by reporter ID
};

} // namespace vela::reporter
