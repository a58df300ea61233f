// Marshals the arguments of calls out of the caller's views into memory that is there: no allocation, no exception, no
// lock, so that it may run on a real-time thread. The byte order is this machine's. Pure functions.
//
// In two steps: the first checks everything and tells the exact size, so that the second cannot fail and the queue
// holds no byte that is not used. The caller's memory must not change in between.
#pragma once

#include "client/include/vela/reporting.h"

#include <cstddef>
#include <cstdint>
#include <span>

namespace vela::client {

/// The time of a call.
struct Stamps {
    double epochSeconds = 0;
    std::int32_t systemUptimeSeconds = 0;
    std::int64_t processUptimeMilliseconds = 0;
};

/// Arguments of sendMessage: "a{sv}uqaax".
struct MessageArguments {
    std::span<const VelaReportingField> fields;
    std::uint32_t category = 0;
    std::uint16_t type = 0;
    bool toAll = false; ///< no list of sessions
    std::span<const std::int64_t> reporterIDs;
    Stamps stamps;
};

/// Arguments of setConfiguration: "a{sv}x".
struct ConfigurationArguments {
    std::span<const VelaReportingField> fields;
    std::int64_t reporterID = 0;
};

/// What the first step found.
struct Measure {
    VelaReportingStatus status = VelaReportingStatusOk; ///< or InvalidArgument or TooLarge
    std::size_t bytes = 0;
};

/// Containers within each other that a message may have, itself included; what the service takes by default.
inline constexpr unsigned kMostDepth = 32;

/// `most`: the bytes that the arguments may have.
Measure measure(const MessageArguments& arguments, std::size_t most);
Measure measure(const ConfigurationArguments& arguments, std::size_t most);

/// Writes what was measured to `body`, which begins at a multiple of 8 and has the measured size.
void write(const MessageArguments& arguments, std::span<std::byte> body);
void write(const ConfigurationArguments& arguments, std::span<std::byte> body);

} // namespace vela::client
