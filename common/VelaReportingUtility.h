// What every part of the service asks of messages, types, processes and numbers. Free functions, callable from any
// thread; they never change their arguments. The only state is the build type, asked once.
#pragma once

#include "common/VelaReportingLogCategories.h"
#include "common/VelaReportingVocabulary.h"
#include "common/values/Dictionary.h"
#include "platform/DeviceProperties.h"
#include "platform/ProcessInformation.h"
#include "platform/WorkQueue.h"

#include <cstdint>
#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace vela {

// Service types, categories and event types.

/// Name of a service type; "unknown" for 65535 and "telephony" for every number that is no type.
std::string_view VelaReportingUtilityGenerateServiceNameFromServiceType(std::uint32_t type);

/// The type of an exact, case-sensitive name; 65535 for any other text and for none.
AudioServiceType VelaReportingUtilityGenerateServiceTypeFromServiceName(std::optional<std::string_view> name);

/// Whether a real-time reporting session of this type batches its events: all do but "apiusage".
bool VelaReportingUtilityShouldBatchBeaconReportingEventsForServiceType(std::uint32_t type);

/// Whether the category has a high half and is not 0xFFFFFFFF.
bool VelaReportingUtilityIsABTestModeOn(std::uint32_t category);

/// "Playback"; "DSP_Playback" with a flag; "_Playback" with a high half that is no single flag.
std::string VelaReportingUtilityCategoryString(std::uint32_t category);

/// "Start"; "Generic" for every number that is no type.
std::string_view VelaReportingUtilityTypeString(std::uint32_t type);

/// The category without its flag, as real-time reporting takes it.
std::uint16_t VelaReportingUtilityRetrieveBeaconReportingCategoryFromCategory(std::uint32_t category);

/// The reporter ID itself, all 64 bits.
std::int64_t VelaReportingUtilityExtractSessionIDFromReporterID(std::int64_t reporterID);

// Messages.

/// The message with "audiotag" set to the category's and the type's strings, one right after the other.
Dictionary VelaReportingUtilityAddAudioMessageTag(const Dictionary& message, std::uint32_t category,
                                                  std::uint32_t type);

/// The message without "velareporting_timestamp"; on an internal build the message itself.
Dictionary VelaReportingUtilityRemoveEventEpochTime(const Dictionary& message);

/// The message with "_" for every " " in its keys, values untouched. Where two keys become one, the later one's value
/// stays.
Dictionary VelaReportingUtilityRemoveWhiteSpaceFromKeys(const Dictionary& message);

/// The value of "HostApplicationDisplayID", which may be of any kind, or "Unknown" when there is none; none without a
/// message.
Value VelaReportingUtilityRetrieveAppName(const std::optional<Dictionary>& message);

// Processes.

/// The name of a process, or none: the service's own name for its own pid, none below 1, else the command name of its
/// record (15 bytes at most). A character that the system cut at its end is left out; other bytes that are not UTF-8
/// give none.
std::optional<std::string> VelaReportingUtilityProcessNameForPID(const platform::ProcessInformation& processes,
                                                                 std::int32_t pid);

/// Whether the whole record of `pid` was read into `record`.
bool VelaReportingUtilityProcessInfoForPID(const platform::ProcessInformation& processes, std::int32_t pid,
                                           platform::ProcessRecord& record);

// Numbers.

/// Shortest play time, in seconds, that volume messages count: 0.5 for every type.
double VelaReportingUtilityVolumeMinimumPlayingTime(std::uint32_t type);

/// `value` rounded to `places` decimals, halves away from zero; tens and hundreds with negative places.
double VelaReportingUtilityRoundWithPlaces(double value, std::int32_t places);

/// The bucket nearest to `number` as text with up to `fractionDigits` decimals and, unless that is 0, at least one. The
/// walk goes in the buckets' order and stops where the distance first grows, so that of two equally near ones the later
/// is taken. None without buckets.
std::optional<std::string> VelaReportingUtilityBucketNumberToString(double number, std::span<const double> buckets,
                                                                    std::uint32_t fractionDigits);

// Switches.

/// The device's answer to "InternalBuild", asked when it is first wanted and kept. The composition root makes one,
/// which outlives the service; while it lives it answers `VelaReportingUtilityIsInternalBuild`. Thread-safe.
class VelaReportingBuildType {
public:
    explicit VelaReportingBuildType(const platform::DeviceProperties& deviceProperties);
    ~VelaReportingBuildType();
    VelaReportingBuildType(const VelaReportingBuildType&) = delete;
    VelaReportingBuildType& operator=(const VelaReportingBuildType&) = delete;

    bool isInternal() const;

private:
    const platform::DeviceProperties& deviceProperties_;
    mutable std::once_flag asked_;
    mutable bool internal_ = false; ///< written once, under `asked_`
};

/// Whether this is an internal build; false where nobody made a `VelaReportingBuildType`.
bool VelaReportingUtilityIsInternalBuild();

/// Asked before a single message is sent. Always true.
bool VelaReportingUtilityShouldSendMessage();

/// Asked before a session transaction is opened. Always true.
bool VelaReportingUtilityAllowSessionTransactions();

// Waiting for a flag that another thread sets. `flag` is only touched with the condition's lock held.

/// Waits until `flag` is true (true) or one wait has lasted `timeoutSeconds` (false). Every wake-up that finds the flag
/// still false begins a new wait of the full length. `waitingText` is logged before each wait and `timeoutText` at its
/// end.
bool VelaReportingUtilityWait(platform::Condition& condition, double timeoutSeconds, const bool& flag,
                              std::string_view waitingText, std::string_view timeoutText,
                              const LogCategory& logCategory);

/// Sets `flag` and wakes one waiter.
void VelaReportingUtilitySignal(platform::Condition& condition, bool& flag);

} // namespace vela
