// The reporting service as the sender of reports needs it.
#pragma once

#include "reporters/pipewire/Reports.h"

#include <chrono>
#include <cstdint>

namespace vela::reporter {

class ServiceCalls {
public:
    virtual ~ServiceCalls() = default;

    virtual bool isConnected() const = 0;
    /// How often a connection came about. Every further one is to a service that remembers nothing: it was given the
    /// sessions of before, started where they were, and none of their messages.
    virtual std::uint64_t connections() const = 0;

    // These do not wait, and answer whether they were taken.

    virtual bool createSession(const SessionDescription& session) = 0;
    virtual bool startSession(std::int64_t reporterID) = 0;
    virtual bool send(std::int64_t reporterID, const Report& report) = 0;
    virtual bool destroySession(std::int64_t reporterID) = 0;

    /// Waits, and answers whether the service did, so that it has handled everything before too.
    virtual bool stopSession(std::int64_t reporterID, std::chrono::milliseconds timeout) = 0;
};

} // namespace vela::reporter
