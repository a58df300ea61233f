/*
 * libvelareporting: emits kernel-trace events, in C and C++. The reporting service collects them while a session
 * traces, and makes intervals of them.
 *
 *     #include <vela/trace.h>
 *
 *     vela_trace_emit(0x21040100, streamID, frames);
 *     ...
 *     vela_trace_emit(0x21040101, streamID);
 *
 * A code is 32 bits wide; sessions collect those from 0x21040000 to 0x2104408A. Up to four integers of at most 64 bits
 * go with it; signed ones are extended with their sign. What is left out is 0.
 *
 * Threads: may be called by any thread at any time, in audio callbacks too. While nobody collects, it is two loads and
 * a branch. While somebody does, it writes 64 bytes into memory that it shares with the service, without a lock, a
 * system call or an allocation; where the service records with the kernel and this process may write there, it is one
 * system call that does not block. errno stays.
 *
 * The first event of a process that a session collects, and the first one of each thread that then needs memory to
 * share (1 MiB, for which at most 256 threads of a process have room), make system calls and take locks.
 * VelaReportingTracePrepareThread does that beforehand. The memory to share is locked into RAM as long as that takes
 * less than half of what the process may lock (RLIMIT_MEMLOCK): with the usual 8 MiB that of three threads, and the
 * program has the rest for itself. What is not locked is present as well, but may be swapped out.
 *
 * Handlers of signals may emit where the interrupted thread was prepared: by VelaReportingTracePrepareThread, or by an
 * event of its own. An event that interrupts another one of its thread, or the preparation, is lost, and counted. An
 * unprepared thread allocates at its first event, which a handler must not do in the midst of another allocation.
 *
 * No service is needed. Where none has ever run, a process looks for one once a second at most, when it emits. It looks
 * in $VELA_RUNTIME when that is set, else in $XDG_RUNTIME_DIR/vela, if its files are this user's or root's, and in
 * /run/vela; a service that runs comes before one that did. What it finds first it keeps.
 *
 * Fork: the child emits for itself, and so do its threads. A process that closes descriptors which it did not open must
 * do so before its first event.
 */
#ifndef VELA_TRACE_H
#define VELA_TRACE_H

/* NOLINTBEGIN(modernize-use-using, modernize-deprecated-headers, modernize-redundant-void-arg): C reads it, too. */
/* NOLINTBEGIN(readability-identifier-naming): the names that every emitter writes. */

#include <stdbool.h>
#include <stdint.h>
#include <vela/reporting.h>

#ifdef __cplusplus
extern "C" {
#endif

/** Points to a word that is 0 while nobody collects. For the functions below. */
VELA_REPORTING_API extern const uint32_t* VelaReportingTraceActiveWord;

/** Emits an event, if its code is collected. vela_trace_emit is the short way. "cold": hardly ever called. */
__attribute__((cold)) VELA_REPORTING_API void VelaReportingTraceEmit(uint32_t code, uint64_t first, uint64_t second,
                                                                     uint64_t third,
                                                                     uint64_t fourth) VELA_REPORTING_NOEXCEPT;

/** Does what the calling thread's first event would do, as far as it is known. For threads with no time to lose. */
VELA_REPORTING_API void VelaReportingTracePrepareThread(void) VELA_REPORTING_NOEXCEPT;

/** Whether a session may be collecting: where preparing the arguments is work. */
static inline bool VelaReportingTraceIsActive(void) VELA_REPORTING_NOEXCEPT {
    const uint32_t* const word = __atomic_load_n(&VelaReportingTraceActiveWord, __ATOMIC_ACQUIRE);
    return __atomic_load_n(word, __ATOMIC_RELAXED) != 0;
}

static inline void VelaReportingTraceEmitIfActive(uint32_t code, uint64_t first, uint64_t second, uint64_t third,
                                                  uint64_t fourth) VELA_REPORTING_NOEXCEPT {
    if (VelaReportingTraceIsActive()) {
        VelaReportingTraceEmit(code, first, second, third, fourth);
    }
}

#ifdef __cplusplus
}

/** vela_trace_emit(code), or with up to four integers. */
template <class... Arguments>
inline void vela_trace_emit(uint32_t code, Arguments... arguments) noexcept {
    static_assert(sizeof...(Arguments) <= 4, "an event has at most four arguments");
    const uint64_t given[5] = {static_cast<uint64_t>(arguments)..., 0};
    VelaReportingTraceEmitIfActive(code, given[0], given[1], given[2], given[3]);
}

#else

/* clang-format off */
/** vela_trace_emit(code), or with up to four integers. */
#define vela_trace_emit(...) VELA_TRACE_CHOOSE_(__VA_ARGS__, VELA_TRACE_4_, VELA_TRACE_3_, VELA_TRACE_2_, VELA_TRACE_1_, VELA_TRACE_0_, 0)(__VA_ARGS__)
#define VELA_TRACE_CHOOSE_(code, a, b, c, d, chosen, ...) chosen
#define VELA_TRACE_0_(code) VelaReportingTraceEmitIfActive(code, 0, 0, 0, 0)
#define VELA_TRACE_1_(code, a) VelaReportingTraceEmitIfActive(code, (uint64_t)(a), 0, 0, 0)
#define VELA_TRACE_2_(code, a, b) VelaReportingTraceEmitIfActive(code, (uint64_t)(a), (uint64_t)(b), 0, 0)
#define VELA_TRACE_3_(code, a, b, c) VelaReportingTraceEmitIfActive(code, (uint64_t)(a), (uint64_t)(b), (uint64_t)(c), 0)
#define VELA_TRACE_4_(code, a, b, c, d) VelaReportingTraceEmitIfActive(code, (uint64_t)(a), (uint64_t)(b), (uint64_t)(c), (uint64_t)(d))
/* clang-format on */

#endif

/* NOLINTEND(readability-identifier-naming) */
/* NOLINTEND(modernize-use-using, modernize-deprecated-headers, modernize-redundant-void-arg) */

#endif
