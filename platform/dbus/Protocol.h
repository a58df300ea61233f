// Names of the service's D-Bus protocol, shared by the service and its clients. Constants.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace vela::platform::dbus {

// The service.
inline constexpr std::string_view kSocketName = "com.orvex.vela.reporting.server";
inline constexpr std::string_view kServiceName = "com.orvex.vela.reporting.server";
inline constexpr std::string_view kObjectPath = "/com/orvex/vela/reporting/server";
inline constexpr std::string_view kReportingInterface = "com.orvex.vela.reporting.VelaReportingServiceProtocol";
inline constexpr std::string_view kInspectionInterface = "com.orvex.vela.reporting.Inspection1";

// Members of the reporting interface.
inline constexpr std::string_view kCreateReportingSession = "createReportingSession";
inline constexpr std::string_view kSetServiceType = "setServiceType";
inline constexpr std::string_view kGetServiceNameForReporterID = "getServiceNameForReporterID";
inline constexpr std::string_view kSetConfiguration = "setConfiguration";
inline constexpr std::string_view kStartReportingSessionForID = "startReportingSessionForID";
inline constexpr std::string_view kSendMessage = "sendMessage";
inline constexpr std::string_view kStopReportingSessionForID = "stopReportingSessionForID";
inline constexpr std::string_view kDestroyReportingSession = "destroyReportingSession";
inline constexpr std::string_view kReporterID = "reporterID";
inline constexpr std::string_view kGetAllReporters = "getAllReporters";
inline constexpr std::string_view kKillService = "killService";

// Members of the inspection interface.
inline constexpr std::string_view kGetLedger = "GetLedger";
inline constexpr std::string_view kGetSessions = "GetSessions";
inline constexpr std::string_view kGetVersion = "GetVersion";

/// Keys of what `reporterID` answers: the first is an x, the second a q.
inline constexpr std::string_view kReporterIDKey = "reporterID";
inline constexpr std::string_view kServiceTypeKey = "serviceType";

/// Domain of the service's own errors; the error's name is this, ".Code" and the code.
inline constexpr std::string_view kReportingErrorDomain = "com.orvex.audio.reporting";
inline constexpr std::string_view kReportingDisabledError = "com.orvex.audio.reporting.Code1";

// The bus side of D-Bus.
inline constexpr std::string_view kBusName = "org.freedesktop.DBus";
inline constexpr std::string_view kBusPath = "/org/freedesktop/DBus";
inline constexpr std::string_view kBusInterface = "org.freedesktop.DBus";
inline constexpr std::string_view kIntrospectableInterface = "org.freedesktop.DBus.Introspectable";
inline constexpr std::string_view kPeerInterface = "org.freedesktop.DBus.Peer";
inline constexpr std::string_view kPropertiesInterface = "org.freedesktop.DBus.Properties";

// Errors.
inline constexpr std::string_view kFailedError = "org.freedesktop.DBus.Error.Failed";
inline constexpr std::string_view kNoReplyError = "org.freedesktop.DBus.Error.NoReply";
inline constexpr std::string_view kInvalidArgsError = "org.freedesktop.DBus.Error.InvalidArgs";
inline constexpr std::string_view kLimitsExceededError = "org.freedesktop.DBus.Error.LimitsExceeded";
inline constexpr std::string_view kAccessDeniedError = "org.freedesktop.DBus.Error.AccessDenied";
inline constexpr std::string_view kUnknownMethodError = "org.freedesktop.DBus.Error.UnknownMethod";
inline constexpr std::string_view kUnknownObjectError = "org.freedesktop.DBus.Error.UnknownObject";
inline constexpr std::string_view kUnknownInterfaceError = "org.freedesktop.DBus.Error.UnknownInterface";
inline constexpr std::string_view kUnknownPropertyError = "org.freedesktop.DBus.Error.UnknownProperty";
/// Bytes that are no message: whoever reads them closes the connection.
inline constexpr std::string_view kInconsistentMessageError = "org.freedesktop.DBus.Error.InconsistentMessage";

// Sizes that the protocol sets.
inline constexpr std::size_t kMaximumMessageBytes = 128 * 1024 * 1024;
inline constexpr std::size_t kMaximumArrayBytes = 64 * 1024 * 1024;
inline constexpr std::size_t kMaximumNameBytes = 255;
inline constexpr std::size_t kMaximumSignatureBytes = 255;

enum class MessageType : std::uint8_t { Invalid = 0, MethodCall = 1, MethodReturn = 2, Error = 3, Signal = 4 };

// Bits of a message's flags.
inline constexpr std::uint8_t kNoReplyExpectedFlag = 0x1;
inline constexpr std::uint8_t kNoAutoStartFlag = 0x2;

enum class HeaderField : std::uint8_t {
    Path = 1,
    Interface,
    Member,
    ErrorName,
    ReplySerial,
    Destination,
    Sender,
    Signature,
    UnixFds,
};

/// The text that makes a struct of a string and a real, (sd), a date.
inline constexpr std::string_view kDateText = "date";

} // namespace vela::platform::dbus
