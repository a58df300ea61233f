// Finds the stretches of a session during which audio output was running under one unchanged set of conditions, and
// makes one volume message for each. A pure function but for its debug lines, which bear the session's name; callable
// from any thread.
#pragma once

#include "common/values/Dictionary.h"
#include "shaping/StoredMessage.h"

#include <array>
#include <span>
#include <vector>

namespace vela {

/// Buckets of volumes.
inline constexpr std::array<double, 17> VelaReportingUtilityBucketNumberToStringVolumes = {
    0, 0.0625, 0.125, 0.1875, 0.25, 0.3125, 0.375, 0.4375, 0.5, 0.5625, 0.625, 0.6875, 0.75, 0.8125, 0.875, 0.9375, 1};

/// Buckets of play times, in seconds.
inline constexpr std::array<double, 11> VelaReportingUtilityBucketNumberToStringTimes = {
    0, 1, 5, 10, 30, 60, 300, 1800, 3600, 7200, 18000};

/// One message for each stretch that lasted longer than `minimumPlaytime` seconds, in order. `process` is the
/// application, of any kind of value; without one, and while no volume is known, there are no messages.
///
/// Rapid changes of the spatial settings are combined first (RapidMessages.h; 2 seconds). A message has these entries,
/// in this order; conditions have the value and kind that the client last sent before the stretch ended:
///
///     session_selected_format          "unknown" until one is known
///     active_devices                   "unknown" until one is known
///     HostApplicationDisplayID         process
///     NexoSessionVolume
///     NexoSessionVolumeBucketed        string: nearest of the volumes above, "0.0625"
///     play_seconds                     32-bit float
///     spatial-audio-accessory-feature  false until one is known
///     spatializationEnabled            false until one is known
///     ringerstate                      false until one is known
///     mChannelsPerFrame                -1 until one is known
///     play_secondsBucketed             string: nearest of the times above, "300"
///     msgidx                           integer, from 1
///     msgcnt                           integer: how many messages there are
///
/// - A stretch begins when output starts ("session_output_running"), and where another ends while output goes on. It
///   ends when output stops, with "session_duration", and with another format, device list, spatialization, ringer
///   state or volume than before.
/// - Format and devices are compared as text (other kinds by their textual form); spatialization and ringer state as
///   numbers, what is no number being 0; volumes as numbers, and as values where one is a boolean or no number. The
///   first volume is no change; the first of any other that differs from what stands above is one.
/// - The accessory feature and the number of channels are reported, but do not end a stretch.
/// - Times, running and volumes that are no numbers read as 0 and false.
/// - A stretch that is still open at the end is not reported.
/// - Wanted as it is: "session_duration" alone leaves the remembered "session_output_running" as it was. The next start
///   then begins no stretch, and the time to its end is counted from 0. Nor is a stretch corrected that ends before it
///   began, as the combining above may make it: it counts as too short.
/// - Takes time in proportion to the messages and their entries.
std::vector<Dictionary> createVolumeMessages(std::span<const StoredMessage> messages, const Value& process,
                                             double minimumPlaytime);

} // namespace vela
