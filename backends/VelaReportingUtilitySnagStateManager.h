// Watches the energy messages of haptics sessions and has a diagnostic snapshot taken when a leaked one shows.
//
//     idle --a message other than the cached one--> armed --a message other than the cached one--> captured, idle
//
// Messages are compared whole, their times included. Those that bear no leaked session's time change nothing.
//
// Confined to the reporting queue. One serves the whole service.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/Malady.h"
#include "session/VelaReportingSession.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

namespace vela {

class VelaReportingUtilitySnagStateManager {
public:
    /// `malady` outlives it.
    explicit VelaReportingUtilitySnagStateManager(platform::Malady& malady) : malady_(malady) {}

    /// `processName`: name of the process that sent the message, none where it is not known.
    void handleEvent(const Dictionary& message, std::uint32_t category, std::uint32_t type,
                     const std::shared_ptr<VelaReportingSession>& session,
                     const std::optional<std::string>& processName);

    std::int64_t leakedHapticsSessionCounter() const { return leakedHapticsSessionCounter_; }
    /// Of the last capture; null before the first.
    const std::shared_ptr<platform::MaladyReporter>& maladyReporter() const { return maladyReporter_; }
    /// The message that was counted; empty while none is.
    const Dictionary& messageCache() const { return messageCache_; }

private:
    void requestSnapshot(const platform::MaladySignature& signature);

    platform::Malady& malady_;
    std::int64_t leakedHapticsSessionCounter_ = 0;
    std::shared_ptr<platform::MaladyReporter> maladyReporter_;
    Dictionary messageCache_;
};

} // namespace vela
