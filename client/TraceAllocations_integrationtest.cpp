// That an event allocates nothing once its thread has emitted one or was prepared. Not part of sanitized builds, whose
// runtime has an allocator of its own.
#include "benchmarks/CountedAllocations.h"
#include "client/Trace_integrationtest.h"
#include "client/include/vela/trace.h"

#include <thread>

namespace vela::client {

namespace {

using TraceAllocationsTest = TraceTest;

TEST_F(TraceAllocationsTest, EventsBehindTheFirstAllocateNothing) {
    start();
    vela_trace_emit(0x21040100);
    const std::uint64_t before = allocationsOfThisThread();
    for (int i = 0; i < 1'000; ++i) {
        vela_trace_emit(0x21040100, i);
    }
    EXPECT_EQ(allocationsOfThisThread(), before);
    EXPECT_EQ(finish().size(), 1'001U);
}

TEST_F(TraceAllocationsTest, APreparedThreadsFirstEventAllocatesNothing) {
    start();
    std::thread([] {
        VelaReportingTracePrepareThread();
        const std::uint64_t before = allocationsOfThisThread();
        vela_trace_emit(0x21040100);
        EXPECT_EQ(allocationsOfThisThread(), before);
    }).join();
    EXPECT_EQ(finish().size(), 1U);
}

} // namespace

} // namespace vela::client
