// That a call which does not wait allocates nothing. Not part of sanitized builds, whose runtime has an allocator of
// its own.
#include "benchmarks/CountedAllocations.h"
#include "client/Client_integrationtest.h"

namespace vela::client {

namespace {

using ClientAllocationsTest = ClientTest;

TEST_F(ClientAllocationsTest, SendingAllocatesNothing) {
    const OwnedClient client = make();
    sendTwelve(client);
    const std::uint64_t before = allocationsOfThisThread();
    for (int round = 0; round < 1000; ++round) {
        sendTwelve(client);
    }
    EXPECT_EQ(allocationsOfThisThread(), before);
    EXPECT_NE(std::make_unique<int>(1), nullptr);
    EXPECT_GT(allocationsOfThisThread(), before) << "the count works";
}

TEST_F(ClientAllocationsTest, NeitherDoesTheFullQueue) {
    service_.setReading(false);
    VelaReportingClientOptions hasty = options();
    hasty.flushMilliseconds = -1;
    const OwnedClient client = make(hasty);
    const std::uint64_t before = allocationsOfThisThread();
    while (sendTwelve(client) == VelaReportingStatusOk) {
    }
    for (int round = 0; round < 100; ++round) {
        sendTwelve(client);
    }
    EXPECT_EQ(allocationsOfThisThread(), before);
}

} // namespace

} // namespace vela::client
