// Offers every message to the analytics service, under a framework-wide and a service-specific event name.
// Thread-safe: no state of its own. `tally` outlives it.
#pragma once

#include "platform/Tally.h"
#include "session/VelaReportingSession.h"

namespace vela {

class VelaReportingTallyBridge final : public VelaReportingSessionEventHandler {
public:
    explicit VelaReportingTallyBridge(platform::Tally& tally) : tally_(tally) {}

    /// A payload is the message and the application's name. It is built where and when the service wants it, from the
    /// configuration that the session has then; until that it holds the message and the session.
    void handleEvent(const Dictionary& message, std::uint32_t category, std::uint32_t type,
                     const std::shared_ptr<VelaReportingSession>& session) override;

private:
    platform::Tally& tally_;
};

} // namespace vela
