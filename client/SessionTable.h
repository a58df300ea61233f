// What the service was told of this client's sessions, to be told again to a service that knows nothing of them.
// Confined to the client's thread.
#pragma once

#include "client/CallQueue.h"
#include "common/values/Dictionary.h"

#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>
#include <utility>

namespace vela::client {

class SessionTable {
public:
    static constexpr std::size_t kMostSessions = 16384;
    /// Of one session, marshalled.
    static constexpr std::size_t kMostConfigurationBytes = std::size_t{1024} * 1024;

    /// Notes a call that was written to the service. False when it is not remembered because of the limits.
    bool apply(const CallRecord& record);

    /// Appends the calls that make all sessions as they are, in the order of their creation, and counts `serial` up for
    /// each. A session that was stopped is not started.
    void replay(std::string& output, std::uint32_t& serial) const;

    bool empty() const { return sessions_.empty(); }

private:
    struct Session {
        std::uint64_t creation = 0; ///< counts up
        std::optional<std::uint16_t> serviceType;
        Dictionary configuration;
        std::size_t configurationBytes = 0; ///< of all that was set, so an upper bound
        bool started = false;
    };

    bool create(std::int64_t reporterID);
    static bool configure(Session& session, const CallRecord& record);

    std::unordered_map<std::int64_t, Session> sessions_;
    std::uint64_t creations_ = 0;
};

} // namespace vela::client
