// The words that every message and session bears: service types, event categories and types, and the reserved keys.
//
// The enumerations are plain numbers on purpose: clients send any number, and what is not named here has a meaning too
// (see VelaReportingUtility.h).
#pragma once

#include "common/values/Key.h"

#include <cstdint>

namespace vela {

/// What kind of audio service a session belongs to. Handed to functions as 32 bits.
enum AudioServiceType : std::uint16_t {
    AudioServiceTypeGeneric = 0,
    AudioServiceTypeMuse = 1,
    AudioServiceTypeTelephony = 2,
    AudioServiceTypeHaptics = 3,
    AudioServiceTypeAlarms = 4,
    AudioServiceTypeStandalone = 5,
    AudioServiceTypeSoundAutoConfig = 6,
    AudioServiceTypeLongFormAudio = 7,
    AudioServiceTypeNonLongFormAudio = 8,
    AudioServiceTypeAudioDeviceUsage = 9,
    AudioServiceTypeAlerts = 10,
    AudioServiceTypeTest = 11,
    AudioServiceTypeAPIUsage = 12,
    AudioServiceTypeSystemSounds = 13,
    AudioServiceTypeUnknown = 65535,
};

/// What a message is about: a base category in the low half, an optional subsystem flag in the high half, which marks a
/// message of an A/B test.
enum AudioEventCategory : std::uint32_t {
    AudioEventCategoryGeneric = 1,
    AudioEventCategoryRecord = 2,
    AudioEventCategoryInput = 3,
    AudioEventCategoryPlayback = 4,
    AudioEventCategoryOutput = 5,
    AudioEventCategoryPlaybackAndRecord = 6,
    AudioEventCategoryIO = 7,
    AudioEventCategorySetup = 8,
    AudioEventCategoryClientRequest = 9,
    AudioEventCategoryRouteChange = 10,
    AudioEventCategoryError = 11,
    AudioEventCategoryHwStatsing = 12,
    AudioEventCategoryPerformance = 13,
    AudioEventCategoryVolume = 14,
    AudioEventCategoryHearingHealth = 15,

    AudioEventCategoryFlagMIDI = 0x04000000,
    AudioEventCategoryFlagSession = 0x08000000,
    AudioEventCategoryFlagDSP = 0x10000000,
    AudioEventCategoryFlagHAL = 0x20000000,
    AudioEventCategoryFlagRouting = 0x40000000,
    AudioEventCategoryFlagToolbox = 0x80000000,

    AudioEventCategoryAll = 0xFFFFFFFF, ///< no A/B test: bears the session's summary
};

enum AudioEventType : std::uint32_t {
    AudioEventTypeStart = 1,
    AudioEventTypeStop = 2,
    AudioEventTypeActivate = 3,
    AudioEventTypeDeactivate = 4,
    AudioEventTypeSetup = 5,
    AudioEventTypeError = 6,
    AudioEventTypeIssueDetector = 7,
    AudioEventTypeJoule = 8,
    AudioEventTypeAudioUnitUsage = 9,
    AudioEventTypeMIDIDriver = 10,
    AudioEventTypeSummary = 11,
    AudioEventTypeHeadphoneAudioExposure = 12,
    AudioEventTypeAudioExposure = 13,
    AudioEventTypeListeningEnhancement = 14,
    AudioEventTypeGauge = 15,
    AudioEventTypeSimple = 16,
    AudioEventTypeHistogram = 17,
    AudioEventTypeState = 18,
    AudioEventTypeUnknown = 65535,
};

/// Configuration key of the client application's name.
inline const Key VelaReportingApplicationName("HostApplicationDisplayID");

/// Category and type of a message as one text.
inline const Key VelaReportingAudioMessageTag("audiotag");

/// Epoch seconds of an event, a real; given by the client. Two names for one key: the one of events that the service
/// makes, the one that the shaping of messages reads.
inline const Key VelaReportingInternalEventEpochTime("velareporting_timestamp");
inline const Key VelaReportingMessageKeyVelaTimestamp("velareporting_timestamp");

/// Seconds that the system was up at an event, an integer.
inline const Key VelaReportingInternalEventSystemUptimeSec("systemuptime_sec");

/// Milliseconds that the client's process was up at an event, an integer.
inline const Key VelaReportingInternalEventProcessUptimeMs("processuptime_ms");

/// Published for clients; the service itself reads neither: keys that comparing messages is to leave out, and seconds
/// between two messages.
inline const Key VelaReportingMessageKeyComparisonFieldBlacklist("_comparison_field_blacklist");
inline const Key VelaReportingMessageKeyThrottleSeconds("_throttle_seconds");

// What clients say about a session's output, from which the shaping of messages makes volume messages at its end.

/// Whether output is running, a boolean.
inline const Key VelaReportingMessageKeySessionOutputRunning("session_output_running");
/// Its presence marks the end of a session, whatever its value.
inline const Key VelaReportingMessageKeySessionDuration("session_duration");
/// Strings.
inline const Key VelaReportingMessageKeySelectedFormat("session_selected_format");
inline const Key VelaReportingMessageKeyActiveDevices("active_devices");
/// Numbers. Volume goes from 0 to 1.
inline const Key VelaReportingMessageKeySpatializationEnabled("spatializationEnabled");
inline const Key VelaReportingMessageKeyRingerState("ringerstate");
inline const Key VelaReportingMessageKeyVolume("NexoSessionVolume");
inline const Key VelaReportingMessageKeySpatialAudioAccessoryFeature("spatial-audio-accessory-feature");
inline const Key VelaReportingMessageKeyChannelsPerFrame("mChannelsPerFrame");

// What volume messages hold besides.

/// The volume's bucket, a string.
inline const Key VelaReportingMessageKeyVolumeBucketed("NexoSessionVolumeBucketed");
/// Seconds that output ran under one set of conditions, a 32-bit float, and their bucket, a string.
inline const Key VelaReportingMessageKeyPlaySeconds("play_seconds");
inline const Key VelaReportingMessageKeyPlaySecondsBucketed("play_secondsBucketed");
/// Place of a message among those that were made together, from 1, and how many these are.
inline const Key VelaReportingMessageKeyMessageIndex("msgidx");
inline const Key VelaReportingMessageKeyMessageCount("msgcnt");

} // namespace vela
