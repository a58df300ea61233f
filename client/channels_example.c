/* Publishes a driver's channels for some cycles of 1 ms each, or until it is ended. */
#define _POSIX_C_SOURCE 200809L
#include <stdio.h>
#include <stdlib.h>
#include <time.h>
#include <vela/channels.h>

enum { kIdle, kRunning };

int main(int argumentCount, char** arguments) {
    const long cycles = argumentCount > 1 ? strtol(arguments[1], NULL, 10) : 0; /* 0: without an end */
    const int64_t bounds[] = {0, 100, 1000, 10000};
    const char* const states[] = {"idle", "running"};
    const VelaReportingChannelDefinition definitions[] = {
        VelaReportingCounterDefinition("cycles"),
        VelaReportingHistogramDefinition("late", "us", bounds, sizeof(bounds) / sizeof(bounds[0])),
        VelaReportingStateDefinition("stream", states, sizeof(states) / sizeof(states[0])),
    };
    VelaReportingChannelsOptions options = {.size = sizeof(options), .driver = "Example Driver", .group = "Speaker"};
    VelaReportingError error = {.size = sizeof(error)};
    VelaReportingChannels* channels = NULL;
    if (VelaReportingChannelsCreate(&options, definitions, sizeof(definitions) / sizeof(definitions[0]), &channels,
                                    &error) != VelaReportingStatusOk) {
        fprintf(stderr, "no channels: %s\n", error.text);
        return 1;
    }
    VelaReportingChannel* const counter = VelaReportingChannelsGet(channels, 0);
    VelaReportingChannel* const late = VelaReportingChannelsGet(channels, 1);
    VelaReportingChannel* const stream = VelaReportingChannelsGet(channels, 2);
    for (long cycle = 0; cycles == 0 || cycle < cycles; ++cycle) {
        /* These three may stand in an audio callback. */
        VelaReportingStateEnter(stream, cycle % 2 == 0 ? kRunning : kIdle);
        VelaReportingHistogramRecord(late, cycle % 200);
        VelaReportingCounterAdd(counter, 1);
        nanosleep(&(struct timespec){0, 1000000}, NULL);
    }
    VelaReportingChannelsDestroy(channels);
    printf("%ld cycles published\n", cycles);
    return 0;
}
