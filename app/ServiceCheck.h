// What `vela-reportingd --check` finds out: whether each part of the platform does its work on this device. The parts
// are really used; facts about the machine are handed in. Free functions; checkService blocks until its work items have
// run.
#pragma once

#include "common/Settings.h"
#include "platform/JsonWriting.h"
#include "platform/ProcessInformation.h"
#include "platform/PropertyListReading.h"
#include "platform/WorkQueue.h"
#include "platform/host/HostFacts.h"

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

namespace vela {

enum class CheckOutcome : std::uint8_t {
    Fine,
    Note,    ///< absent or lesser, and the service does without
    Missing, ///< the service cannot do its work
};

struct CheckFinding {
    std::string subject;
    CheckOutcome outcome = CheckOutcome::Fine;
    std::string text; ///< one line
};

/// Borrowed for the call.
struct CheckedParts {
    platform::WorkQueues& queues;
    const platform::ProcessInformation& processes;
    const platform::PropertyListReading& propertyLists;
    const platform::JsonWriting& json;
};

struct CheckedFacts {
    std::optional<std::string> settingsFile;    ///< that was read
    std::size_t singleSettings = 0;             ///< how many the command line gave
    std::string logFailure;                     ///< why the log target of the settings is not there; empty when it is
    bool threadPriorities = false;              ///< whether the queues' quality becomes a thread priority
    platform::FolderState state{};              ///< of paths.state
    platform::FolderState runtime{};            ///< of paths.runtime
    std::optional<std::string> traceFolder;     ///< of the kernel's trace file system
    bool traceInstances = false;                ///< whether this process may make trace instances there
    std::optional<std::string> performanceTool; ///< file of the `perf` program
};

/// Everything found, in a fixed order. Waits at most `patience` for each work item.
std::vector<CheckFinding> checkService(const Settings& settings, const CheckedParts& parts, const CheckedFacts& facts,
                                       platform::Nanoseconds patience);

bool isSomethingMissing(std::span<const CheckFinding> findings);

/// One line each: subject, "ok", "note" or "missing", text.
std::string findingsAsText(std::span<const CheckFinding> findings);

/// One JSON object a line: subject, outcome, text.
std::string findingsAsJson(std::span<const CheckFinding> findings);

} // namespace vela
