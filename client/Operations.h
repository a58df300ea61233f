// The protocol's operations as the client's parts name them. Constants and pure functions.
#pragma once

#include "client/include/vela/reporting.h"
#include "platform/dbus/MessageReader.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace vela::client {

enum class Operation : std::uint16_t {
    CreateReportingSession,
    SetServiceType,
    SetConfiguration,
    StartReportingSessionForID,
    SendMessage,
    StopReportingSessionForID,
    DestroyReportingSession,
    GetServiceNameForReporterID,
    ReporterID,
    GetAllReporters,
    KillService,
};
inline constexpr std::size_t kOperations = 11;

struct OperationForm {
    std::string_view member;
    std::string_view arguments; ///< signature
    std::string_view reply;     ///< signature
};
const OperationForm& formOf(Operation operation);

/// Whether a call makes sense only while somebody waits for it: questions, and the end of the service.
constexpr bool needsWaiter(Operation operation) { return operation >= Operation::GetServiceNameForReporterID; }

/// What a waiting call is told.
struct Reply {
    VelaReportingStatus status = VelaReportingStatusOk;
    std::string errorName;
    std::string errorText;
    // Of the operation's own kind.
    std::uint16_t serviceType = 0;
    VelaReportingReporter reporter{};
    std::vector<std::int64_t> reporterIDs;
};

/// Reads the return or the error that answers a call of `operation`.
Reply replyOf(Operation operation, const platform::dbus::MessageHeader& header);

} // namespace vela::client
