// What every ProcessInformation does, as a test suite that runs on the fake and on the real one.
//
// A harness has: `const ProcessInformation& processes()`; `std::int32_t child()`, a living child of the own process
// named "velachild"; `std::int32_t gone()`, a child that has ended and was waited for.
#pragma once

#include "platform/ProcessInformation.h"

#include <cstdint>
#include <gtest/gtest.h>
#include <limits>

namespace vela::testing {

template <class Harness>
class ProcessInformationContract : public ::testing::Test {
protected:
    const platform::ProcessInformation& processes() { return harness_.processes(); }

    void expectNoRecord(std::int32_t pid) {
        platform::ProcessRecord record{.pid = 5, .parent = 6, .commandName = "before", .startTimeTicks = 7};
        EXPECT_FALSE(processes().read(pid, record));
        EXPECT_EQ(record.pid, 5);
        EXPECT_EQ(record.parent, 6);
        EXPECT_EQ(record.commandName, "before");
        EXPECT_EQ(record.startTimeTicks, 7U);
    }

    Harness harness_;
};

TYPED_TEST_SUITE_P(ProcessInformationContract);

TYPED_TEST_P(ProcessInformationContract, AChildsRecordHoldsItsNumberNameAndParent) {
    platform::ProcessRecord record;
    ASSERT_TRUE(this->processes().read(this->harness_.child(), record));
    EXPECT_EQ(record.pid, this->harness_.child());
    EXPECT_EQ(record.commandName, "velachild");
    EXPECT_EQ(record.parent, this->processes().ownPid());
}

TYPED_TEST_P(ProcessInformationContract, TheOwnProcessHasARecordWithItsName) {
    platform::ProcessRecord record;
    ASSERT_TRUE(this->processes().read(this->processes().ownPid(), record));
    EXPECT_EQ(record.pid, this->processes().ownPid());
    EXPECT_FALSE(record.commandName.empty());
    EXPECT_TRUE(this->processes().ownName().starts_with(record.commandName));
}

TYPED_TEST_P(ProcessInformationContract, AChildStartedAfterItsParent) {
    platform::ProcessRecord parent;
    platform::ProcessRecord child;
    ASSERT_TRUE(this->processes().read(this->processes().ownPid(), parent));
    ASSERT_TRUE(this->processes().read(this->harness_.child(), child));
    EXPECT_GT(parent.startTimeTicks, 0U);
    EXPECT_GE(child.startTimeTicks, parent.startTimeTicks);
}

TYPED_TEST_P(ProcessInformationContract, AProcessThatIsGoneHasNoRecord) { this->expectNoRecord(this->harness_.gone()); }
TYPED_TEST_P(ProcessInformationContract, ZeroIsNoProcess) { this->expectNoRecord(0); }
TYPED_TEST_P(ProcessInformationContract, MinusOneIsNoProcess) { this->expectNoRecord(-1); }
TYPED_TEST_P(ProcessInformationContract, TheSmallestNumberIsNoProcess) {
    this->expectNoRecord(std::numeric_limits<std::int32_t>::min());
}
TYPED_TEST_P(ProcessInformationContract, TheLargestNumberIsNoProcess) {
    this->expectNoRecord(std::numeric_limits<std::int32_t>::max());
}

REGISTER_TYPED_TEST_SUITE_P(ProcessInformationContract, AChildsRecordHoldsItsNumberNameAndParent,
                            TheOwnProcessHasARecordWithItsName, AChildStartedAfterItsParent,
                            AProcessThatIsGoneHasNoRecord, ZeroIsNoProcess, MinusOneIsNoProcess,
                            TheSmallestNumberIsNoProcess, TheLargestNumberIsNoProcess);

} // namespace vela::testing
