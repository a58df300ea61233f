// Posts detected audio issues as records of the metrics service.
// Thread-safe: no state of its own. `telem` outlives it.
#pragma once

#include "platform/Telem.h"
#include "session/VelaReportingSession.h"

namespace vela {

class VelaReportingTelemBridge final : public VelaReportingSessionEventHandler {
public:
    explicit VelaReportingTelemBridge(platform::Telem& telem) : telem_(telem) {}

    void handleEvent(const Dictionary& message, std::uint32_t category, std::uint32_t type,
                     const std::shared_ptr<VelaReportingSession>& session) override;

private:
    platform::Telem& telem_;
};

} // namespace vela
