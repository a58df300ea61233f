#include "common/VelaReportingUtility.h"

#include "common/values/Utf8.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <charconv>
#include <cmath>
#include <utility>

namespace vela {

namespace {

constexpr std::array<std::string_view, 14> kServiceNames = {
    "generic",         "muse",          "telephony",        "haptics",          "alarms", "standalone",
    "soundautoconfig", "longformaudio", "nonlongformaudio", "audiodeviceusage", "alerts", "test",
    "apiusage",        "systemsounds"};
constexpr std::string_view kUnknownServiceName = "unknown";

// "Input" before "Playback" and "Output" before "PlaybackAndRecord": the numbers are the clients', in no natural order.
constexpr std::array<std::string_view, 16> kCategories = {
    "Undefined",     "Generic",     "Record", "Input",      "Playback",    "Output", "PlaybackAndRecord", "IO", "Setup",
    "ClientRequest", "RouteChange", "Error",  "HwStatsing", "Performance", "Volume", "HearingHealth"};

constexpr std::array<std::pair<std::uint32_t, std::string_view>, 6> kCategoryFlags = {{
    {AudioEventCategoryFlagMIDI, "MIDI"},
    {AudioEventCategoryFlagSession, "Session"},
    {AudioEventCategoryFlagDSP, "DSP"},
    {AudioEventCategoryFlagHAL, "HAL"},
    {AudioEventCategoryFlagRouting, "Routing"},
    {AudioEventCategoryFlagToolbox, "Toolbox"},
}};

// The lower-case "e" in "Listeningenhancement" is wanted.
constexpr std::array<std::string_view, 19> kTypes = {"Generic",
                                                     "Start",
                                                     "Stop",
                                                     "Activate",
                                                     "Deactivate",
                                                     "Setup",
                                                     "Error",
                                                     "IssueDetector",
                                                     "Joule",
                                                     "AudioUnitUsage",
                                                     "MIDIDriver",
                                                     "Summary",
                                                     "HeadphoneAudioExposure",
                                                     "AudioExposure",
                                                     "Listeningenhancement",
                                                     "Gauge",
                                                     "Simple",
                                                     "Histogram",
                                                     "State"};

constexpr std::uint32_t kBaseCategory = 0x0000FFFF;
constexpr std::uint32_t kCategoryFlag = 0xFFFF0000;

std::string_view baseCategoryString(std::uint32_t category) {
    const std::uint32_t base = category & kBaseCategory;
    return base < kCategories.size() ? kCategories[base] : kCategories[0];
}

std::string_view flagString(std::uint32_t category) {
    for (const auto& [flag, name] : kCategoryFlags) {
        if ((category & kCategoryFlag) == flag) {
            return name;
        }
    }
    return {};
}

// `number` with up to `fractionDigits` decimals and, unless that is 0, at least one; no grouping, "." whatever the
// locale.
std::string decimalText(double number, std::uint32_t fractionDigits) {
    constexpr std::uint32_t kMostDigits = 100; // more say nothing: the buckets are plain decimals
    const std::uint32_t digits = std::min(fractionDigits, kMostDigits);
    constexpr std::size_t kLongestInteger = 310; // digits of the largest double
    std::array<char, kLongestInteger + kMostDigits + 2> buffer{};
    const auto result = std::to_chars(buffer.data(), buffer.data() + buffer.size(), number, std::chars_format::fixed,
                                      static_cast<int>(digits));
    std::string text(buffer.data(), result.ptr);
    if (digits != 0 && std::isfinite(number)) {
        const std::size_t shortest = text.find('.') + 2;
        text.resize(std::max(shortest, text.find_last_not_of('0') + 1));
    }
    return text;
}

// How many bytes of a cut character stand at the end of `text`.
std::size_t utf8CutAtEnd(std::string_view text) {
    for (std::size_t bytes = 1; bytes <= std::min<std::size_t>(3, text.size()); ++bytes) {
        const auto byte = static_cast<unsigned char>(text[text.size() - bytes]);
        if ((byte & 0xC0U) == 0x80U) {
            continue; // inside a character
        }
        const std::size_t wanted = byte >= 0xF0 ? 4 : byte >= 0xE0 ? 3 : byte >= 0xC0 ? 2 : 1;
        return bytes < wanted ? bytes : 0;
    }
    return 0;
}

std::atomic<const VelaReportingBuildType*> processBuildType{nullptr};

} // namespace

std::string_view VelaReportingUtilityGenerateServiceNameFromServiceType(std::uint32_t type) {
    if (type < kServiceNames.size()) {
        return kServiceNames[type];
    }
    if (type == AudioServiceTypeUnknown) {
        return kUnknownServiceName;
    }
    // Wanted: a number that is no type counts as telephony, not as unknown.
    return kServiceNames[AudioServiceTypeTelephony];
}

AudioServiceType VelaReportingUtilityGenerateServiceTypeFromServiceName(std::optional<std::string_view> name) {
    for (std::size_t type = 0; type < kServiceNames.size(); ++type) {
        if (name == kServiceNames[type]) {
            return static_cast<AudioServiceType>(type);
        }
    }
    return AudioServiceTypeUnknown;
}

bool VelaReportingUtilityShouldBatchBeaconReportingEventsForServiceType(std::uint32_t type) {
    return type != AudioServiceTypeAPIUsage;
}

bool VelaReportingUtilityIsABTestModeOn(std::uint32_t category) {
    return category > kBaseCategory && category != AudioEventCategoryAll;
}

std::string VelaReportingUtilityCategoryString(std::uint32_t category) {
    std::string text;
    if (VelaReportingUtilityIsABTestModeOn(category)) {
        text += flagString(category);
        text += '_';
    }
    text += baseCategoryString(category);
    return text;
}

std::string_view VelaReportingUtilityTypeString(std::uint32_t type) {
    if (type < kTypes.size()) {
        return kTypes[type];
    }
    return type == AudioEventTypeUnknown ? std::string_view("Unknown") : kTypes[0];
}

std::uint16_t VelaReportingUtilityRetrieveBeaconReportingCategoryFromCategory(std::uint32_t category) {
    return static_cast<std::uint16_t>(category & kBaseCategory);
}

std::int64_t VelaReportingUtilityExtractSessionIDFromReporterID(std::int64_t reporterID) { return reporterID; }

Dictionary VelaReportingUtilityAddAudioMessageTag(const Dictionary& message, std::uint32_t category,
                                                  std::uint32_t type) {
    std::string tag = VelaReportingUtilityCategoryString(category);
    tag += VelaReportingUtilityTypeString(type);
    return message.setting(VelaReportingAudioMessageTag, Value(std::string_view(tag)));
}

Dictionary VelaReportingUtilityRemoveEventEpochTime(const Dictionary& message) {
    return VelaReportingUtilityIsInternalBuild() ? message : message.removing(VelaReportingInternalEventEpochTime);
}

Dictionary VelaReportingUtilityRemoveWhiteSpaceFromKeys(const Dictionary& message) {
    return message.replacingSpacesInKeys();
}

Value VelaReportingUtilityRetrieveAppName(const std::optional<Dictionary>& message) {
    if (!message) {
        return {};
    }
    static const String unknown("Unknown");
    const ValueRef name = message->find(VelaReportingApplicationName);
    return name ? Value(name) : Value(unknown);
}

std::optional<std::string> VelaReportingUtilityProcessNameForPID(const platform::ProcessInformation& processes,
                                                                 std::int32_t pid) {
    if (pid == processes.ownPid()) {
        return processes.ownName();
    }
    if (pid < 1) {
        return std::nullopt;
    }
    platform::ProcessRecord record;
    if (!VelaReportingUtilityProcessInfoForPID(processes, pid, record)) {
        return std::nullopt;
    }
    std::string name = std::move(record.commandName);
    name.resize(name.size() - utf8CutAtEnd(name));
    return isValidUtf8(name) ? std::optional(std::move(name)) : std::nullopt;
}

bool VelaReportingUtilityProcessInfoForPID(const platform::ProcessInformation& processes, std::int32_t pid,
                                           platform::ProcessRecord& record) {
    return processes.read(pid, record);
}

double VelaReportingUtilityVolumeMinimumPlayingTime([[maybe_unused]] std::uint32_t type) { return 0.5; }

double VelaReportingUtilityRoundWithPlaces(double value, std::int32_t places) {
    const double scale = std::pow(10.0, places);
    return std::round(value * scale) / scale;
}

std::optional<std::string> VelaReportingUtilityBucketNumberToString(double number, std::span<const double> buckets,
                                                                    std::uint32_t fractionDigits) {
    std::optional<double> candidate;
    double previousDistance = -1.0;
    for (const double bucket : buckets) {
        const double distance = std::abs(number - bucket);
        if (previousDistance >= 0 && distance > previousDistance) {
            break;
        }
        candidate = bucket;
        previousDistance = distance;
    }
    return candidate ? std::optional(decimalText(*candidate, fractionDigits)) : std::nullopt;
}

VelaReportingBuildType::VelaReportingBuildType(const platform::DeviceProperties& deviceProperties)
    : deviceProperties_(deviceProperties) {
    processBuildType.store(this, std::memory_order_release);
}

VelaReportingBuildType::~VelaReportingBuildType() { processBuildType.store(nullptr, std::memory_order_release); }

bool VelaReportingBuildType::isInternal() const {
    std::call_once(asked_, [this] { internal_ = deviceProperties_.booleanProperty("InternalBuild").value_or(false); });
    return internal_;
}

bool VelaReportingUtilityIsInternalBuild() {
    const VelaReportingBuildType* buildType = processBuildType.load(std::memory_order_acquire);
    return buildType != nullptr && buildType->isInternal();
}

bool VelaReportingUtilityShouldSendMessage() { return true; }

bool VelaReportingUtilityAllowSessionTransactions() { return true; }

bool VelaReportingUtilityWait(platform::Condition& condition, double timeoutSeconds, const bool& flag,
                              std::string_view waitingText, std::string_view timeoutText,
                              const LogCategory& logCategory) {
    const std::unique_lock lock(condition);
    while (!flag) {
        logCategory.info("%@", waitingText);
        const auto timeout = std::chrono::duration<double>(timeoutSeconds);
        if (!condition.waitUntil(condition.monotonicNow() + std::chrono::round<platform::Nanoseconds>(timeout))) {
            logCategory.error("%@", timeoutText);
            return false;
        }
        logCategory.info("continuing");
    }
    return true;
}

void VelaReportingUtilitySignal(platform::Condition& condition, bool& flag) {
    const std::unique_lock lock(condition);
    flag = true;
    condition.signal();
}

} // namespace vela
