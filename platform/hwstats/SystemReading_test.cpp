#include "platform/hwstats/SystemReading.h"
#include "platform/hwstats/SystemTree_test.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace vela::platform::hwstats {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class SystemReadingTest : public ::testing::Test {
protected:
    const SystemTree tree_{};
    testing::ManualClock clock_;
    SystemReading reading_{tree_.root(), clock_};
};

TEST_F(SystemReadingTest, TextsAreTrimmed) {
    tree_.write("/a", "  two words \n\n");
    EXPECT_EQ(reading_.read("/a"), "two words");
    EXPECT_EQ(reading_.read("/b"), std::nullopt);
    tree_.write("/empty", "");
    EXPECT_EQ(reading_.read("/empty"), "");
}

TEST_F(SystemReadingTest, ANumberIsTheWholeText) {
    tree_.write("/a", "18446744073709551615\n");
    tree_.write("/b", "18446744073709551616\n");
    tree_.write("/c", "5 \n");
    tree_.write("/d", "-5");
    tree_.write("/e", "5 6");
    EXPECT_EQ(reading_.number("/a"), 18'446'744'073'709'551'615U);
    EXPECT_EQ(reading_.number("/b"), std::nullopt);
    EXPECT_EQ(reading_.number("/c"), 5U);
    EXPECT_EQ(reading_.number("/d"), std::nullopt);
    EXPECT_EQ(reading_.number("/e"), std::nullopt);
}

TEST_F(SystemReadingTest, NamesAreOrderedByTheirNumbers) {
    for (const char* name : {"cpu10", "cpu2", "cpu1", "cpufreq", "other", "cpu02", ".hidden"}) {
        tree_.write(std::string("/d/") + name + "/x", "");
    }
    EXPECT_THAT(reading_.list("/d", "cpu"), ElementsAre("cpu1", "cpu02", "cpu2", "cpu10", "cpufreq"));
    EXPECT_THAT(reading_.list("/d/none"), IsEmpty());
}

TEST_F(SystemReadingTest, FoldersAreFoldersOnly) {
    tree_.write("/d/sub/x", "");
    tree_.write("/d/file", "");
    tree_.link("/d/link", tree_.root());
    EXPECT_THAT(reading_.folders("/d"), ElementsAre("sub"));
}

TEST_F(SystemReadingTest, AFileThatIsTooLargeIsNone) {
    tree_.write("/a", std::string(SystemReading::kMostFileBytes, 'x'));
    tree_.write("/b", std::string(SystemReading::kMostFileBytes + 1, 'x'));
    EXPECT_EQ(reading_.read("/a")->size(), SystemReading::kMostFileBytes);
    EXPECT_EQ(reading_.read("/b"), std::nullopt);
}

TEST_F(SystemReadingTest, APipeWithoutAWriterIsNotWaitedFor) {
    ASSERT_EQ(mkfifo((tree_.root() + "/pipe").c_str(), 0600), 0);
    EXPECT_EQ(reading_.read("/pipe"), "");
}

TEST_F(SystemReadingTest, TheBudgetOfFilesIsSpent) {
    tree_.write("/a", "1");
    for (std::size_t i = 0; i < SystemReading::kMostFiles; ++i) {
        ASSERT_EQ(reading_.number("/a"), 1U);
    }
    EXPECT_FALSE(reading_.spent());
    EXPECT_EQ(reading_.number("/a"), std::nullopt);
    EXPECT_TRUE(reading_.spent());
}

TEST_F(SystemReadingTest, TheBudgetOfTimeIsSpent) {
    tree_.write("/d/a", "1");
    clock_.advance(SystemReading::kMostTime);
    EXPECT_EQ(reading_.number("/d/a"), 1U);
    clock_.advance(std::chrono::nanoseconds(1));
    EXPECT_EQ(reading_.number("/d/a"), std::nullopt);
    EXPECT_THAT(reading_.list("/d"), IsEmpty());
    EXPECT_TRUE(reading_.spent());
}

} // namespace
} // namespace vela::platform::hwstats
