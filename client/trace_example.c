/* Emits the begin and the end of some intervals of about 1 ms each. */
#define _POSIX_C_SOURCE 200809L
#include <stdio.h>
#include <stdlib.h>
#include <time.h>
#include <vela/trace.h>

enum { kBegin = 0x21040100, kEnd = 0x21040101 };

int main(int argumentCount, char** arguments) {
    const long cycles = argumentCount > 1 ? strtol(arguments[1], NULL, 10) : 1000;
    VelaReportingTracePrepareThread();
    for (long cycle = 0; cycle < cycles; ++cycle) {
        /* These two may stand in an audio callback. */
        vela_trace_emit(kBegin, cycle);
        nanosleep(&(struct timespec){0, 1000000}, NULL);
        vela_trace_emit(kEnd, cycle, cycles);
    }
    printf("%ld intervals emitted\n", cycles);
    return 0;
}
