// Reads a trace parameters file: a property list in any format, on three levels (tracing/TraceParamsKeys.h). Used by
// one thread at a time.
//
// Whoever starts a trace gets a record whatever the file holds: each fault is logged and what can be read is taken. The
// file is its client's: it is read with that client's rights, and what it costs is bounded (`kTraceParamsFileBytes`,
// `kTraceParamsTextBytes`, the usual limits of property lists).
//
// Every value is taken as text. A level of the file (the list of traces, a trace, its list of points, a point) is
// written as text and that text is read as a property list again, which makes every leaf a text, and a leaf that is
// itself a list in writing becomes that list. A level that is missing, or no list or dictionary where one belongs, is
// empty.
#pragma once

#include "platform/FileSystem.h"
#include "platform/Identity.h"
#include "platform/PropertyListReading.h"
#include "tracing/TraceParams.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace vela {

/// Longest file.
inline constexpr std::size_t kTraceParamsFileBytes = 256 * 1024;
/// Longest text of all levels of a file together, where each character may need four. A file without shared values
/// stays far below it.
inline constexpr std::size_t kTraceParamsTextBytes = 16 * 1024 * 1024;

/// What the parser takes from outside; both outlive it.
struct TraceParamsPlatform {
    const platform::FileSystem& fileSystem;
    const platform::PropertyListReading& propertyListReading;
};

class TraceParamsParser {
public:
    /// `client` named the file; one that is not known reads nothing. A `name` without a "/" at its start is looked for
    /// in this process's current directory.
    static TraceParamsParser initWithFileName(std::string name, std::optional<platform::Identity> client,
                                              const TraceParamsPlatform& tracePlatform);

    /// Never null.
    std::unique_ptr<TraceParams> loadTraceParams() const;

    const std::string& traceParamsFile() const { return traceParamsFile_; }

private:
    TraceParamsParser(std::string name, std::optional<platform::Identity> client,
                      const TraceParamsPlatform& tracePlatform);

    std::string path() const;
    platform::Result<std::string> readBytes() const;
    Value readPropertyList() const;

    const std::string traceParamsFile_;
    const std::optional<platform::Identity> client_;
    const TraceParamsPlatform platform_;
};

/// The number that `text` begins with in hexadecimal digits, after "0x" or "0X" or not: 0 without digits, 0xFFFFFFFF
/// beyond 32 bits.
std::uint32_t traceEventCodeOf(std::string_view text);

} // namespace vela
