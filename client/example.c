/* Reports one session of an audio process, in C. Prints what became of it. */
#include <stdio.h>
#include <vela/reporting.h>

enum { kReporterID = 4711, kServiceType = 11, kCategory = 1, kType = 3, kTimeoutMilliseconds = 5000 };

static int fail(const char* what, VelaReportingStatus status, const VelaReportingError* error) {
    fprintf(stderr, "%s: %s: %s %s\n", what, VelaReportingStatusText(status), error->name, error->text);
    return 1;
}

int main(void) {
    VelaReportingError error = {.size = sizeof(error)};
    VelaReportingClient* client = NULL;
    VelaReportingStatus status = VelaReportingClientCreate(NULL, &client);
    if (status != VelaReportingStatusOk) {
        return fail("no client", status, &error);
    }

    /* Setting up may wait: this is not the audio thread. */
    status = VelaReportingCreateReportingSessionAndWait(client, kReporterID, kTimeoutMilliseconds, &error);
    if (status != VelaReportingStatusOk) {
        VelaReportingClientDestroy(client);
        return fail("no session", status, &error);
    }
    VelaReportingSetServiceType(client, kServiceType, kReporterID);
    const VelaReportingField configuration[] = {
        {VELA_REPORTING_TEXT("HostApplicationDisplayID"), VelaReportingText("example.c")},
    };
    VelaReportingSetConfiguration(client, configuration, 1, kReporterID);
    VelaReportingStartReportingSessionForID(client, kReporterID);

    /* This may stand in the audio callback: it returns at once, whatever the service does. */
    const VelaReportingValue channels[] = {VelaReportingText("left"), VelaReportingText("right")};
    const VelaReportingField message[] = {
        {VELA_REPORTING_TEXT("sample_rate"), VelaReportingDouble(48000)},
        {VELA_REPORTING_TEXT("frames"), VelaReportingInteger(512)},
        {VELA_REPORTING_TEXT("overload"), VelaReportingBoolean(false)},
        {VELA_REPORTING_TEXT("channels"), VelaReportingArray(channels, 2)},
    };
    const int64_t ids[] = {kReporterID};
    VelaReportingSendMessage(client, message, sizeof(message) / sizeof(message[0]), kCategory, kType, ids, 1);

    VelaReportingStopReportingSessionForID(client, kReporterID);
    VelaReportingDestroyReportingSession(client, kReporterID);

    VelaReportingClientState state = {.size = sizeof(state)};
    VelaReportingClientGetState(client, &state);
    status = VelaReportingClientDestroy(client);
    printf("dropped %llu, %s\n", (unsigned long long)state.droppedQueueFull, VelaReportingStatusText(status));
    return status == VelaReportingStatusOk ? 0 : 1;
}
