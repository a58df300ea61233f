// How the channels of the drivers' statistics become keys and values of messages. Pure functions but for their log
// lines; callable from any thread.
#pragma once

#include "common/VelaReportingLogCategories.h"
#include "common/values/Dictionary.h"
#include "platform/HwStats.h"

#include <string>
#include <string_view>

namespace vela {

/// What the channels of all drivers add up to: one message for each format.
struct VelaReportingDriverStatistics {
    DictionaryBuilder simple;
    DictionaryBuilder histogram;
    DictionaryBuilder state;
};

/// The subsystem's log. Whatever file a line is written in, it carries the utility's name.
inline NamedLogCategory driverLog() { return VelaReportingDriverUtilityCategory().as("VelaReportingDriverUtility"); }

/// Adds a channel to the statistics of its format; other formats are dropped with a log line. Of channels with one key
/// the later overwrites the earlier.
void processChannel(const platform::HwStatsChannel& channel, VelaReportingDriverStatistics& statistics);

/// Adds the value, unless it is below 1.
void processSimpleData(const platform::HwStatsChannel& channel, DictionaryBuilder& driverStats);

/// Adds "count=2,lower=0,upper=20,min=1,max=9,unit=ms::0-10:3": the number of buckets, the least and greatest of their
/// bounds and 0, the channel's least and greatest value and unit, then bounds and hits of the buckets that have any,
/// with ";" between them. Adds nothing when none has.
void processHistogramData(const platform::HwStatsChannel& channel, DictionaryBuilder& driverStats);

/// Adds "name:on,transition:2,residency:40,duty_cycle:0.500000;" for each state with residency one after another; an
/// empty text when there is none.
void processStateData(const platform::HwStatsChannel& channel, DictionaryBuilder& driverStats);

/// "MyDriver_Rx_Simple_FramesDropped": driver up to its "<", group, subgroup, `type` and channel, each without its own
/// "_" and " " (but for `type`); those that the channel does not name are left out.
std::string getDriverStatsKey(const platform::HwStatsChannel& channel, std::string_view type);

} // namespace vela
