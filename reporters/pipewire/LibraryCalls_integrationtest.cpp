// The reporter's calls through the client library to a service of the test's own.
#include "client/FakeService_integrationtest.h"
#include "reporters/pipewire/LibraryCalls.h"
#include "testing/TemporaryFolder.h"

#include <chrono>
#include <gtest/gtest.h>

namespace vela::reporter {
namespace {

using namespace std::chrono_literals;

class LibraryCallsTest : public ::testing::Test {
protected:
    const vela::testing::TemporaryFolder folder_;
    vela::testing::FakeService service_{folder_ / "socket"};
    LibraryCalls calls_{"unix:path=" + (folder_ / "socket")};
};

TEST_F(LibraryCallsTest, AStopIsDoneWhenItIsAnswered) { EXPECT_TRUE(calls_.stopSession(7, 30s)); }

TEST_F(LibraryCallsTest, AStopIsDoneWhenItIsRefused) {
    service_.setDisabled(true);
    EXPECT_TRUE(calls_.stopSession(7, 30s));
}

TEST_F(LibraryCallsTest, AStopIsDoneWhenTheAnswerHasAnotherForm) {
    service_.setWrongReply(true);
    EXPECT_TRUE(calls_.stopSession(7, 30s));
}

TEST_F(LibraryCallsTest, AStopIsNotDoneWithoutAnAnswer) {
    service_.setAnswering(false);
    EXPECT_FALSE(calls_.stopSession(7, 10ms));
}

} // namespace
} // namespace vela::reporter
