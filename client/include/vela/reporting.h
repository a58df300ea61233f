/*
 * libvelareporting: reports an audio process's sessions to the Vela reporting service. C API.
 *
 * A process makes one client, gives it sessions and sends messages. Every call that has no "AndWait" in its name copies
 * its arguments into a bounded queue and returns: it takes no lock, allocates nothing, never waits and may be made on a
 * real-time audio thread. A thread of the client's own passes the queue on to the service. What the queue could not
 * take is counted; see VelaReportingClientGetState.
 *
 *     VelaReportingClient* client = NULL;
 *     if (VelaReportingClientCreate(NULL, &client) != VelaReportingStatusOk) { ... }
 *     VelaReportingCreateReportingSession(client, 42);
 *     VelaReportingSetServiceType(client, 1, 42);
 *     VelaReportingStartReportingSessionForID(client, 42);
 *     const VelaReportingField message[] = {
 *         {VELA_REPORTING_TEXT("sample_rate"), VelaReportingDouble(48000)},
 *         {VELA_REPORTING_TEXT("device"), VelaReportingText("Built-in")},
 *     };
 *     const int64_t ids[] = {42};
 *     VelaReportingSendMessage(client, message, 2, 1, 3, ids, 1);
 *     ...
 *     VelaReportingClientDestroy(client);
 *
 * Threads: every function may be called from any thread at any time, except VelaReportingClientDestroy, which must be
 * the last call with its client.
 *
 * Order: calls of one thread reach the service in the order made, those that wait included.
 *
 * Lost connections: when the service ends, the client connects again (at once, then after 50 ms, doubling up to 5 s),
 * creates, configures and starts its sessions anew and goes on with the queue. Calls that had been written to the
 * service before it ended and that it had not handled are lost. As long as there is neither a session nor anything
 * queued, the client does not try.
 *
 * Fork: only the process that created a client may use it. A child that goes on without exec must neither use nor
 * destroy it: its thread does not exist there. The connection does not pass through exec.
 */
#ifndef VELA_REPORTING_H
#define VELA_REPORTING_H

/* NOLINTBEGIN(modernize-use-using, modernize-deprecated-headers, cppcoreguidelines-pro-type-vararg) */

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>
#include <string.h>

#ifdef __cplusplus
extern "C" {
#endif

#ifndef VELA_REPORTING_API
#define VELA_REPORTING_API __attribute__((visibility("default")))
#endif

#ifdef __cplusplus
#define VELA_REPORTING_NOEXCEPT noexcept
#else
#define VELA_REPORTING_NOEXCEPT
#endif

/* ---- Status ---------------------------------------------------------------------------------------------------- */

/** What became of a call. */
typedef enum VelaReportingStatus {
    /** Done; for a call that does not wait: queued. */
    VelaReportingStatusOk = 0,
    /** A null pointer, a struct of an unknown size, a value of an unknown kind or nested too deeply, an address that is
        none. Nothing was queued. */
    VelaReportingStatusInvalidArgument = 1,
    /** The queue has no room. Nothing was queued. */
    VelaReportingStatusQueueFull = 2,
    /** The call's arguments are larger than a quarter of the queue. Nothing was queued. */
    VelaReportingStatusTooLarge = 3,
    /** The reply did not come in time. The call may still take effect. */
    VelaReportingStatusTimeout = 4,
    /** The service ended after the call was written to it. It may or may not have taken effect. */
    VelaReportingStatusDisconnected = 5,
    /** No service could be reached, or it did not let this process in. A call that shapes a session, or a message, is
        still queued and takes effect when a service comes; a question is not asked any more. */
    VelaReportingStatusNoService = 6,
    /** The service answered with an error, which VelaReportingError tells. */
    VelaReportingStatusRefused = 7,
    /** The operating system lacks memory, descriptors or threads. */
    VelaReportingStatusNoResources = 8,
    /** The service's reply does not have the form of this protocol. */
    VelaReportingStatusProtocolError = 9
} VelaReportingStatus;

/** A short English text of a status, "" for an unknown one. Never null; lives for ever. */
VELA_REPORTING_API const char* VelaReportingStatusText(VelaReportingStatus status) VELA_REPORTING_NOEXCEPT;

/** Details of a call that waited and was not Ok. */
typedef struct VelaReportingError {
    /** sizeof(VelaReportingError), set by the caller before the call. */
    size_t size;
    /** The D-Bus error's name, such as "com.orvex.audio.reporting.Code1" (reporting is disabled), or "". */
    char name[256];
    /** For a person; shortened to fit. Both are valid UTF-8 and end in NUL. */
    char text[512];
} VelaReportingError;

/* ---- Values ---------------------------------------------------------------------------------------------------- */

typedef enum VelaReportingKind {
    VelaReportingKindBoolean = 1,
    /** 64 bits, signed. */
    VelaReportingKindInteger = 2,
    /** 64 bits, unsigned. */
    VelaReportingKindUnsigned = 3,
    VelaReportingKindDouble = 4,
    /** UTF-8. Bytes that are none, and NUL, are sent as U+FFFD. */
    VelaReportingKindText = 5,
    VelaReportingKindData = 6,
    /** Seconds since 1970-01-01 00:00:00 UTC. */
    VelaReportingKindDate = 7,
    VelaReportingKindArray = 8,
    VelaReportingKindDictionary = 9
} VelaReportingKind;

struct VelaReportingField;

/** A value that refers to memory of the caller's, which is read during the call only. */
typedef struct VelaReportingValue {
    /** A VelaReportingKind. */
    uint32_t kind;
    union {
        bool boolean;
        int64_t integer;
        uint64_t unsignedInteger;
        /** Double and date. */
        double real;
        /** Text and data. `bytes` may be null when `size` is 0. */
        struct {
            const void* bytes;
            size_t size;
        } bytes;
        struct {
            const struct VelaReportingValue* values;
            size_t count;
        } array;
        struct {
            const struct VelaReportingField* fields;
            size_t count;
        } dictionary;
    } as;
} VelaReportingValue;

/** One entry of a dictionary. The key is UTF-8 and need not end in NUL. Keys should differ; of two equal ones the
    service keeps the last value. */
typedef struct VelaReportingField {
    const char* key;
    size_t keySize;
    VelaReportingValue value;
} VelaReportingField;

/** A string literal as the first two members of a field. */
#define VELA_REPORTING_TEXT(literal) (literal), sizeof(literal) - 1

static inline VelaReportingValue VelaReportingBoolean(bool boolean) VELA_REPORTING_NOEXCEPT {
    VelaReportingValue value;
    value.kind = VelaReportingKindBoolean;
    value.as.boolean = boolean;
    return value;
}
static inline VelaReportingValue VelaReportingInteger(int64_t integer) VELA_REPORTING_NOEXCEPT {
    VelaReportingValue value;
    value.kind = VelaReportingKindInteger;
    value.as.integer = integer;
    return value;
}
static inline VelaReportingValue VelaReportingUnsigned(uint64_t integer) VELA_REPORTING_NOEXCEPT {
    VelaReportingValue value;
    value.kind = VelaReportingKindUnsigned;
    value.as.unsignedInteger = integer;
    return value;
}
static inline VelaReportingValue VelaReportingDouble(double real) VELA_REPORTING_NOEXCEPT {
    VelaReportingValue value;
    value.kind = VelaReportingKindDouble;
    value.as.real = real;
    return value;
}
/** Seconds since 1970. */
static inline VelaReportingValue VelaReportingDate(double seconds) VELA_REPORTING_NOEXCEPT {
    VelaReportingValue value;
    value.kind = VelaReportingKindDate;
    value.as.real = seconds;
    return value;
}
static inline VelaReportingValue VelaReportingTextOfSize(const char* bytes, size_t size) VELA_REPORTING_NOEXCEPT {
    VelaReportingValue value;
    value.kind = VelaReportingKindText;
    value.as.bytes.bytes = bytes;
    value.as.bytes.size = size;
    return value;
}
/** `text` ends in NUL and is not null. */
static inline VelaReportingValue VelaReportingText(const char* text) VELA_REPORTING_NOEXCEPT {
    return VelaReportingTextOfSize(text, strlen(text));
}
static inline VelaReportingValue VelaReportingData(const void* bytes, size_t size) VELA_REPORTING_NOEXCEPT {
    VelaReportingValue value;
    value.kind = VelaReportingKindData;
    value.as.bytes.bytes = bytes;
    value.as.bytes.size = size;
    return value;
}
static inline VelaReportingValue VelaReportingArray(const VelaReportingValue* values,
                                                    size_t count) VELA_REPORTING_NOEXCEPT {
    VelaReportingValue value;
    value.kind = VelaReportingKindArray;
    value.as.array.values = values;
    value.as.array.count = count;
    return value;
}
static inline VelaReportingValue VelaReportingDictionary(const VelaReportingField* fields,
                                                         size_t count) VELA_REPORTING_NOEXCEPT {
    VelaReportingValue value;
    value.kind = VelaReportingKindDictionary;
    value.as.dictionary.fields = fields;
    value.as.dictionary.count = count;
    return value;
}

/* ---- The client ------------------------------------------------------------------------------------------------ */

typedef struct VelaReportingClient VelaReportingClient;

/** A member that is 0 or null takes its default; clear the struct, set `size`, set what is to differ. */
typedef struct VelaReportingClientOptions {
    /** sizeof(VelaReportingClientOptions). */
    size_t size;
    /** A D-Bus address, such as "unix:path=/run/vela/com.orvex.vela.reporting.server"; several are separated by ";"
        and tried in order. By default that in $VELA_REPORTING_ADDRESS; without it $XDG_RUNTIME_DIR/vela/NAME, then
        /run/vela/NAME, where NAME is com.orvex.vela.reporting.server. Copied. */
    const char* address;
    /** Bytes of the queue, rounded up to a power of two from 64 KiB to 1 GiB. By default 1 MiB. */
    size_t queueBytes;
    /** How long VelaReportingClientDestroy waits for what is queued. By default 1000; negative: not at all. */
    int32_t flushMilliseconds;
} VelaReportingClientOptions;

/**
 * Makes a client, its queue and its thread. Allocates and makes system calls: not for a real-time thread. It does not
 * wait for the service, which may come later.
 *
 * `options` may be null. On Ok `*client` is the client, else null. InvalidArgument, NoResources.
 */
VELA_REPORTING_API VelaReportingStatus VelaReportingClientCreate(const VelaReportingClientOptions* options,
                                                                 VelaReportingClient** client) VELA_REPORTING_NOEXCEPT;

/**
 * Passes on what is queued, for at most the time that the options set, then ends the client. It does not wait for a
 * service that cannot be reached. Sessions end with the connection. `client` may be null.
 *
 * Ok; Timeout when something queued was not passed on. The client is gone either way.
 */
VELA_REPORTING_API VelaReportingStatus VelaReportingClientDestroy(VelaReportingClient* client) VELA_REPORTING_NOEXCEPT;

/** Counters begin at 0 with the client and never go back. */
typedef struct VelaReportingClientState {
    /** sizeof(VelaReportingClientState), set by the caller. */
    size_t size;
    /** The service is there and has let this process in. */
    bool connected;
    /** How often that came about; every time but the first is a reconnection. */
    uint64_t connections;
    /** Calls written to the service. */
    uint64_t sent;
    /** Calls that the queue had no room for. */
    uint64_t droppedQueueFull;
    /** Calls that were larger than a quarter of the queue. */
    uint64_t droppedTooLarge;
    /** Calls with a value of an unknown kind, a null pointer, or nested more than 32 deep. */
    uint64_t droppedInvalid;
    /** Sessions and configurations beyond what the client remembers for a reconnection: 16384 sessions, 1 MiB of
        configuration each. */
    uint64_t notRemembered;
    /** Bytes of the queue, those in use, and the most that ever were. */
    size_t queueBytes;
    size_t queuedBytes;
    size_t highestQueuedBytes;
} VelaReportingClientState;

/** Never waits. InvalidArgument when a pointer is null or `state->size` is too small to hold anything. */
VELA_REPORTING_API VelaReportingStatus
VelaReportingClientGetState(const VelaReportingClient* client, VelaReportingClientState* state) VELA_REPORTING_NOEXCEPT;

/* ---- Calls that do not wait ------------------------------------------------------------------------------------ */

/*
 * Each answers Ok (queued), QueueFull, TooLarge or InvalidArgument. The last sixteenth of the queue is kept for calls
 * other than messages, so that a flood of messages keeps no session from ending.
 */

/** Makes a session. The service replaces one of the same ID that this client has. */
VELA_REPORTING_API VelaReportingStatus VelaReportingCreateReportingSession(VelaReportingClient* client,
                                                                           int64_t reporterID) VELA_REPORTING_NOEXCEPT;
/** Unknown sessions are ignored, here and below. */
VELA_REPORTING_API VelaReportingStatus VelaReportingSetServiceType(VelaReportingClient* client, uint16_t serviceType,
                                                                   int64_t reporterID) VELA_REPORTING_NOEXCEPT;
/** Adds the fields to the session's configuration; those of a key that is there replace it. The key
    "HostApplicationDisplayID" names the application. */
VELA_REPORTING_API VelaReportingStatus VelaReportingSetConfiguration(VelaReportingClient* client,
                                                                     const VelaReportingField* fields, size_t count,
                                                                     int64_t reporterID) VELA_REPORTING_NOEXCEPT;
VELA_REPORTING_API VelaReportingStatus
VelaReportingStartReportingSessionForID(VelaReportingClient* client, int64_t reporterID) VELA_REPORTING_NOEXCEPT;
VELA_REPORTING_API VelaReportingStatus
VelaReportingStopReportingSessionForID(VelaReportingClient* client, int64_t reporterID) VELA_REPORTING_NOEXCEPT;
VELA_REPORTING_API VelaReportingStatus VelaReportingDestroyReportingSession(VelaReportingClient* client,
                                                                            int64_t reporterID) VELA_REPORTING_NOEXCEPT;

/**
 * Sends a message to the sessions `reporterIDs`, which may be other clients'. With a null `reporterIDs` it goes to all
 * active sessions; with `reporterIDCount` 0 and a pointer that is not null, to none.
 *
 * The time of the call is added under these keys, each unless `fields` has it: "velareporting_timestamp" (seconds since
 * 1970, a double), "systemuptime_sec" (seconds that the system is up, time asleep included, rounded to the nearest, a
 * 32-bit integer) and "processuptime_ms" (milliseconds since this process started, an integer).
 */
VELA_REPORTING_API VelaReportingStatus VelaReportingSendMessage(VelaReportingClient* client,
                                                                const VelaReportingField* fields, size_t fieldCount,
                                                                uint32_t category, uint16_t type,
                                                                const int64_t* reporterIDs,
                                                                size_t reporterIDCount) VELA_REPORTING_NOEXCEPT;

/* ---- Calls that wait for the reply ----------------------------------------------------------------------------- */

/*
 * Not for real-time threads: they wait, at most `timeoutMilliseconds` (0: only queued and answered Timeout; negative:
 * for ever). Each answers Ok once the service has answered, or any other status. `error` may be null; it is written
 * whenever the call was not Ok and its `size` is set.
 */

VELA_REPORTING_API VelaReportingStatus
VelaReportingCreateReportingSessionAndWait(VelaReportingClient* client, int64_t reporterID, int32_t timeoutMilliseconds,
                                           VelaReportingError* error) VELA_REPORTING_NOEXCEPT;
VELA_REPORTING_API VelaReportingStatus
VelaReportingSetServiceTypeAndWait(VelaReportingClient* client, uint16_t serviceType, int64_t reporterID,
                                   int32_t timeoutMilliseconds, VelaReportingError* error) VELA_REPORTING_NOEXCEPT;
VELA_REPORTING_API VelaReportingStatus VelaReportingSetConfigurationAndWait(
    VelaReportingClient* client, const VelaReportingField* fields, size_t count, int64_t reporterID,
    int32_t timeoutMilliseconds, VelaReportingError* error) VELA_REPORTING_NOEXCEPT;
/** The service answers when the session's start is complete, which may take seconds. */
VELA_REPORTING_API VelaReportingStatus VelaReportingStartReportingSessionForIDAndWait(
    VelaReportingClient* client, int64_t reporterID, int32_t timeoutMilliseconds,
    VelaReportingError* error) VELA_REPORTING_NOEXCEPT;
VELA_REPORTING_API VelaReportingStatus VelaReportingStopReportingSessionForIDAndWait(
    VelaReportingClient* client, int64_t reporterID, int32_t timeoutMilliseconds,
    VelaReportingError* error) VELA_REPORTING_NOEXCEPT;
VELA_REPORTING_API VelaReportingStatus VelaReportingDestroyReportingSessionAndWait(
    VelaReportingClient* client, int64_t reporterID, int32_t timeoutMilliseconds,
    VelaReportingError* error) VELA_REPORTING_NOEXCEPT;
/** Refused with "com.orvex.audio.reporting.Code1" while reporting is disabled. */
VELA_REPORTING_API VelaReportingStatus
VelaReportingSendMessageAndWait(VelaReportingClient* client, const VelaReportingField* fields, size_t fieldCount,
                                uint32_t category, uint16_t type, const int64_t* reporterIDs, size_t reporterIDCount,
                                int32_t timeoutMilliseconds, VelaReportingError* error) VELA_REPORTING_NOEXCEPT;

/** The service type of a session of any client; 65535 for an unknown ID. */
VELA_REPORTING_API VelaReportingStatus VelaReportingGetServiceNameForReporterID(
    VelaReportingClient* client, int64_t reporterID, uint16_t* serviceType, int32_t timeoutMilliseconds,
    VelaReportingError* error) VELA_REPORTING_NOEXCEPT;

/** What the service knows of a reporter ID. */
typedef struct VelaReportingReporter {
    /** The ID asked for, or 0 when no client has it. */
    int64_t reporterID;
    /** 65535 when no client has it. */
    uint16_t serviceType;
} VelaReportingReporter;

/** Whether a reporter ID is valid. */
VELA_REPORTING_API VelaReportingStatus VelaReportingReporterID(VelaReportingClient* client, int64_t reporterID,
                                                               VelaReportingReporter* reporter,
                                                               int32_t timeoutMilliseconds,
                                                               VelaReportingError* error) VELA_REPORTING_NOEXCEPT;

/** The reporter IDs of all clients. `*count` becomes how many there are; at most `capacity` of them are written, so a
    `*count` above `capacity` asks for another call with more room. */
VELA_REPORTING_API VelaReportingStatus VelaReportingGetAllReporters(VelaReportingClient* client, int64_t* reporterIDs,
                                                                    size_t capacity, size_t* count,
                                                                    int32_t timeoutMilliseconds,
                                                                    VelaReportingError* error) VELA_REPORTING_NOEXCEPT;

/** Ends the service, which only root and the service's own user may. Ok once the connection has ended. */
VELA_REPORTING_API VelaReportingStatus VelaReportingKillService(VelaReportingClient* client,
                                                                int32_t timeoutMilliseconds,
                                                                VelaReportingError* error) VELA_REPORTING_NOEXCEPT;

#ifdef __cplusplus
}
#endif

/* NOLINTEND(modernize-use-using, modernize-deprecated-headers, cppcoreguidelines-pro-type-vararg) */

#endif
