/*
 * libvelareporting: publishes the statistics channels of a driver, in C. The reporting service samples them when a
 * reporting session starts and when it stops, and reports the difference.
 *
 *     const int64_t bounds[] = {0, 500, 1000, 2000, 5000};
 *     const char* const states[] = {"idle", "running"};
 *     const VelaReportingChannelDefinition definitions[] = {
 *         VelaReportingCounterDefinition("xruns"),
 *         VelaReportingHistogramDefinition("busy", "us", bounds, 5),
 *         VelaReportingStateDefinition("stream", states, 2),
 *     };
 *     VelaReportingChannelsOptions options = {.size = sizeof(options), .driver = "My Driver", .group = "Speaker"};
 *     VelaReportingChannels* channels = NULL;
 *     VelaReportingChannelsCreate(&options, definitions, 3, &channels, NULL);
 *     VelaReportingChannel* xruns = VelaReportingChannelsGet(channels, 0);
 *     ...
 *     VelaReportingCounterAdd(xruns, 1);
 *     ...
 *     VelaReportingChannelsDestroy(channels);
 *
 * The groups that the service asks for are "Tarn", "Speaker", "Rx", "Tx", "StateTransitionTimes_ms", "Haptics" with the
 * subgroup "Stats", and the subgroups "MCA" and "Brook" in any group.
 *
 * Threads: creating and destroying allocate and make system calls. Updates are for real-time threads: each is some
 * twenty instructions, without a lock, a system call or an allocation, and never waits. A channel is updated by one
 * thread at a time; different channels may be updated by different threads at the same time.
 *
 * No service is needed. The channels stand in a file of their own (docs/channel-files.md), in memory that the service
 * reads. The file stays when the process ends, so that what it counted is still reported; the next file of the same
 * publisher, driver, group and subgroup takes its place. The runtime folder should be in memory (tmpfs), as it is
 * everywhere by default: on a disk, writing back may hold up an update.
 *
 * Fork: only the process that created channels may update and destroy them.
 */
#ifndef VELA_CHANNELS_H
#define VELA_CHANNELS_H

/* NOLINTBEGIN(modernize-use-using, modernize-deprecated-headers) */

#include <stddef.h>
#include <stdint.h>
#include <vela/reporting.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef enum VelaReportingChannelFormat {
    /** One signed number. */
    VelaReportingChannelFormatCounter = 1,
    /** States, of which there is one at a time: how often each was entered and how long it lasted. */
    VelaReportingChannelFormatState = 2,
    /** How many values lay between bounds, and the least and the greatest of them. */
    VelaReportingChannelFormatHistogram = 3
} VelaReportingChannelFormat;

/** What a channel is. Everything is copied. Texts are UTF-8 of at most 256 bytes without control characters. */
typedef struct VelaReportingChannelDefinition {
    /** sizeof(VelaReportingChannelDefinition); the same in all definitions of a call. */
    size_t size;
    /** A VelaReportingChannelFormat. */
    uint32_t format;
    /** Not empty. The service's reports leave out each "_" and " " of it. */
    const char* name;
    /** Such as "us"; may be null. */
    const char* unit;
    /** Of a histogram: rising, one more than there are buckets; bucket i holds bounds[i] <= value < bounds[i + 1]. */
    const int64_t* bounds;
    /** 2 to 513. */
    size_t boundCount;
    /** Of a state channel: their names. */
    const char* const* states;
    /** 1 to 512. */
    size_t stateCount;
} VelaReportingChannelDefinition;

static inline VelaReportingChannelDefinition VelaReportingCounterDefinition(const char* name) VELA_REPORTING_NOEXCEPT {
    VelaReportingChannelDefinition definition;
    memset(&definition, 0, sizeof(definition));
    definition.size = sizeof(definition);
    definition.format = VelaReportingChannelFormatCounter;
    definition.name = name;
    return definition;
}
static inline VelaReportingChannelDefinition
VelaReportingHistogramDefinition(const char* name, const char* unit, const int64_t* bounds,
                                 size_t boundCount) VELA_REPORTING_NOEXCEPT {
    VelaReportingChannelDefinition definition = VelaReportingCounterDefinition(name);
    definition.format = VelaReportingChannelFormatHistogram;
    definition.unit = unit;
    definition.bounds = bounds;
    definition.boundCount = boundCount;
    return definition;
}
static inline VelaReportingChannelDefinition VelaReportingStateDefinition(const char* name, const char* const* states,
                                                                          size_t stateCount) VELA_REPORTING_NOEXCEPT {
    VelaReportingChannelDefinition definition = VelaReportingCounterDefinition(name);
    definition.format = VelaReportingChannelFormatState;
    definition.states = states;
    definition.stateCount = stateCount;
    return definition;
}

/** Clear the struct, set `size`, set what is to differ. Texts as in a definition; everything is copied. */
typedef struct VelaReportingChannelsOptions {
    /** sizeof(VelaReportingChannelsOptions). */
    size_t size;
    /** The driver's name; needed. What stands before a "<" counts in the service's reports. */
    const char* driver;
    /** At least one of the two is needed. */
    const char* group;
    const char* subGroup;
    /** Tells apart programs that have drivers of one name. By default the program's own name. */
    const char* publisher;
    /** The folder of the file, which must be there. By default "hwstats" below $VELA_RUNTIME; without that variable
        below $XDG_RUNTIME_DIR/vela or /run/vela, whichever is there and can be written to. */
    const char* folder;
} VelaReportingChannelsOptions;

/** The channels of one driver. */
typedef struct VelaReportingChannels VelaReportingChannels;
/** One of them. */
typedef struct VelaReportingChannel VelaReportingChannel;

/**
 * Publishes channels, with all values 0 and no state entered. At most 4096, and 4 MiB in all.
 *
 * On Ok `*channels` are the channels, else null. InvalidArgument when something cannot be as it was given; NoResources
 * when the file cannot be made: `error`, which may be null, has the reason in its `text`.
 */
VELA_REPORTING_API VelaReportingStatus VelaReportingChannelsCreate(const VelaReportingChannelsOptions* options,
                                                                   const VelaReportingChannelDefinition* definitions,
                                                                   size_t count, VelaReportingChannels** channels,
                                                                   VelaReportingError* error) VELA_REPORTING_NOEXCEPT;

/** Leaves the states that were entered last, and marks the file: nobody updates it any more. `channels` may be null. */
VELA_REPORTING_API void VelaReportingChannelsDestroy(VelaReportingChannels* channels) VELA_REPORTING_NOEXCEPT;

/** The channel of that definition; null where there is none, or `channels` is null. It lives as long as `channels`. */
VELA_REPORTING_API VelaReportingChannel* VelaReportingChannelsGet(VelaReportingChannels* channels,
                                                                  size_t index) VELA_REPORTING_NOEXCEPT;

/* ---- Updates --------------------------------------------------------------------------------------------------- */

/* With a null channel, or one of another format, these do nothing: a program without channels needs no other code. */

VELA_REPORTING_API void VelaReportingCounterAdd(VelaReportingChannel* channel, int64_t change) VELA_REPORTING_NOEXCEPT;
/** A counter that goes back counts as one that began anew at 0. */
VELA_REPORTING_API void VelaReportingCounterSet(VelaReportingChannel* channel, int64_t value) VELA_REPORTING_NOEXCEPT;

/** A value beyond the bounds counts in the first or last bucket. */
VELA_REPORTING_API void VelaReportingHistogramRecord(VelaReportingChannel* channel,
                                                     int64_t value) VELA_REPORTING_NOEXCEPT;

/** No state at all, for the calls below. */
#define VELA_REPORTING_NO_STATE UINT64_MAX

/** Enters a state by its number, and leaves the one before. To enter the present one again is no transition. Reads the
    monotonic clock, which on some machines is a system call. */
VELA_REPORTING_API void VelaReportingStateEnter(VelaReportingChannel* channel, uint64_t state) VELA_REPORTING_NOEXCEPT;
/** The same at a time that the caller knows: nanoseconds of CLOCK_MONOTONIC. */
VELA_REPORTING_API void VelaReportingStateEnterAt(VelaReportingChannel* channel, uint64_t state,
                                                  uint64_t nanoseconds) VELA_REPORTING_NOEXCEPT;

#ifdef __cplusplus
}
#endif

/* NOLINTEND(modernize-use-using, modernize-deprecated-headers) */

#endif
