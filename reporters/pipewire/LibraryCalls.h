// The reporting service, reached through libvelareporting. Thread-safe, as the library's client is.
#pragma once

#include "reporters/pipewire/ServiceCalls.h"

#include <string>
#include <vela/reporting.hpp>

namespace vela::reporter {

class LibraryCalls final : public ServiceCalls {
public:
    /// `address` as the library takes it; empty: where the library looks by itself.
    explicit LibraryCalls(const std::string& address);

    /// Ok, or why there is no client.
    vela::reporting::Status status() const { return client_.status(); }

    bool isConnected() const override { return client_.state().connected; }
    std::uint64_t connections() const override { return client_.state().connections; }
    bool createSession(const SessionDescription& session) override;
    bool startSession(std::int64_t reporterID) override;
    bool send(std::int64_t reporterID, const Report& report) override;
    bool destroySession(std::int64_t reporterID) override;
    bool stopSession(std::int64_t reporterID, std::chrono::milliseconds timeout) override;

private:
    vela::reporting::Client client_;
};

} // namespace vela::reporter
