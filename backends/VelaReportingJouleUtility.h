// Writes the use of haptics engines to the energy log.
// Thread-safe: no state of its own. `joule` outlives it.
#pragma once

#include "platform/Joule.h"
#include "session/VelaReportingSession.h"

namespace vela {

class VelaReportingJouleUtility final : public VelaReportingSessionEventHandler {
public:
    explicit VelaReportingJouleUtility(platform::Joule& joule) : joule_(joule) {}

    void handleEvent(const Dictionary& message, std::uint32_t category, std::uint32_t type,
                     const std::shared_ptr<VelaReportingSession>& session) override;

private:
    platform::Joule& joule_;
};

} // namespace vela
