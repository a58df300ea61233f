// The platform's performance-trace service.
#pragma once

#include "platform/Result.h"

#include <memory>
#include <optional>
#include <string>

namespace vela::platform {

/// Told what a trace does, on a thread of the service's choosing.
class ProbeTraceDelegate {
public:
    virtual ~ProbeTraceDelegate() = default;

    virtual void performanceTraceDidStart(const std::optional<Failure>& error) = 0;
    virtual void performanceTraceDidStop(const std::optional<Failure>& error) = 0;
    /// The end, also of a trace that did not start: the result's file URL, and a token that nobody reads yet.
    virtual void performanceTraceDidComplete(const std::string& url, const std::string& token,
                                             const std::optional<Failure>& error) = 0;
};

class ProbeTraceConfig {
public:
    virtual ~ProbeTraceConfig() = default;
};

/// Thread-safe.
class ProbeTraceSession {
public:
    virtual ~ProbeTraceSession() = default;

    /// The delegate is held weakly; null takes it off, after which it is not called any more.
    virtual void setDelegate(std::weak_ptr<ProbeTraceDelegate> delegate) = 0;
    virtual void startProbeTrace() = 0;
    virtual void stopProbeTrace() = 0;
};

/// Thread-safe.
class Probe {
public:
    virtual ~Probe() = default;

    /// Null for a template that there is not; 1 is always there. What cannot be traced is told by the session's start.
    virtual std::shared_ptr<ProbeTraceConfig> makeProbeTraceConfig(int templateNumber) = 0;
    virtual std::shared_ptr<ProbeTraceSession> createProbeTraceSession(const ProbeTraceConfig& config) = 0;
};

} // namespace vela::platform
