#include "platform/linux/ThreadAttributes.h"

#include <gtest/gtest.h>
#include <string>

namespace vela::platform {

namespace {

std::string nameFor(std::string_view queueName) { return threadNameFor(queueName).data(); }

TEST(ThreadNameTest, ANameThatFitsIsKept) {
    EXPECT_EQ(nameFor("Tracing Queue"), "Tracing Queue");
    EXPECT_EQ(nameFor("fifteen.bytes.."), "fifteen.bytes..");
    EXPECT_EQ(nameFor(""), "");
}

TEST(ThreadNameTest, LeadingComponentsAreDroppedUntilItFits) {
    EXPECT_EQ(nameFor("com.orvex.vela.session.beaconreporting"), "beaconreporting");
    EXPECT_EQ(nameFor("com.orvex.vela.reporting.server"), "server");
    EXPECT_EQ(nameFor("com.orvex.vela.background"), "vela.background");
}

TEST(ThreadNameTest, AComponentThatIsTooLongKeepsItsLastFifteenBytes) {
    EXPECT_EQ(nameFor("com.orvex.averyverylongcomponent"), "rylongcomponent");
    EXPECT_EQ(nameFor("withoutanydotsatall"), "outanydotsatall");
}

TEST(ThreadNameTest, ATrailingDotDoesNotLeaveAnEmptyName) {
    EXPECT_EQ(nameFor("com.averylongcomponent."), "ylongcomponent.");
}

TEST(ThreadNiceTest, LessUrgentWorkIsNicerAndNeverBeyondTheNicest) {
    EXPECT_EQ(niceFor(QualityOfService::UserInteractive, 0), 0);
    EXPECT_EQ(niceFor(QualityOfService::Default, 0), 1);
    EXPECT_EQ(niceFor(QualityOfService::Utility, 0), 5);
    EXPECT_EQ(niceFor(QualityOfService::Background, 0), 10);
    EXPECT_EQ(niceFor(QualityOfService::Background, 15), 19);
    EXPECT_EQ(niceFor(QualityOfService::UserInteractive, -5), -5);
}

TEST(ThreadNiceTest, TryingChangesNothingForTheCaller) {
    const int before = threadNice();
    niceCanBeTakenBack();
    EXPECT_EQ(threadNice(), before);
}

} // namespace

} // namespace vela::platform
