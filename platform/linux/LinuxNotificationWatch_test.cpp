#include "platform/linux/LinuxNotificationWatch.h"
#include "testing/TemporaryFolder.h"

#include <cerrno>
#include <cstdio>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

namespace vela::platform {

namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class LinuxNotificationWatchTest : public ::testing::Test, protected LinuxNotificationWatch::Listener {
protected:
    void replaced(std::string_view name) override { seen_.emplace_back(name); }
    void overlooked() override { seen_.emplace_back("overlooked"); }

    std::string path(const std::string& name = "") const { return folder_ / ("run/notifications/" + name); }
    void replace(const std::string& name) {
        std::ofstream(folder_ / "new") << "1";
        fs::rename(folder_ / "new", path(name));
    }

    const testing::TemporaryFolder folder_;
    LinuxNotificationWatch watch_{folder_ / "run/notifications", *this};
    std::vector<std::string> seen_;
};

TEST_F(LinuxNotificationWatchTest, WhatIsReplacedIsTold) {
    ASSERT_EQ(watch_.arm(), 0);
    replace("a");
    replace("b");
    watch_.read();
    EXPECT_THAT(seen_, ElementsAre("a", "b"));
}

TEST_F(LinuxNotificationWatchTest, WhatIsWrittenInPlaceOrRemovedIsNot) {
    ASSERT_EQ(watch_.arm(), 0);
    std::ofstream(path("a")) << "1";
    fs::remove(path("a"));
    watch_.read();
    EXPECT_THAT(seen_, IsEmpty());
}

TEST_F(LinuxNotificationWatchTest, ArmingAgainChangesNothing) {
    ASSERT_EQ(watch_.arm(), 0);
    ASSERT_EQ(watch_.arm(), 0);
    replace("a");
    watch_.read();
    EXPECT_THAT(seen_, ElementsAre("a"));
}

// The kernel keeps 16,384 events unless it is set otherwise; exchanges of two names do not become one event.
TEST_F(LinuxNotificationWatchTest, MoreThanTheKernelKeepsIsOverlooked) {
    int kept = 0;
    std::ifstream("/proc/sys/fs/inotify/max_queued_events") >> kept;
    ASSERT_GT(kept, 0);
    if (kept > 100'000) {
        GTEST_SKIP() << "this kernel keeps " << kept << " events";
    }
    ASSERT_EQ(watch_.arm(), 0);
    replace("a");
    replace("b");
    for (int number = 0; number <= kept; ++number) {
        ASSERT_EQ(renameat2(AT_FDCWD, path("a").c_str(), AT_FDCWD, path("b").c_str(), RENAME_EXCHANGE), 0);
    }
    for (int number = 0; number <= kept; ++number) {
        watch_.read();
    }
    ASSERT_FALSE(seen_.empty());
    EXPECT_EQ(seen_.back(), "overlooked");
    seen_.clear();
    replace("a");
    watch_.read();
    EXPECT_THAT(seen_, ElementsAre("a"));
}

TEST_F(LinuxNotificationWatchTest, AFolderThatTookTheOldOnesPlaceMayHaveBeenOverlooked) {
    ASSERT_EQ(watch_.arm(), 0);
    fs::rename(path(), folder_ / "old");
    fs::create_directory(path());
    replace("a");
    watch_.read();
    EXPECT_THAT(seen_, ElementsAre("overlooked"));
    replace("b");
    watch_.read();
    EXPECT_THAT(seen_, ElementsAre("overlooked", "b"));
}

TEST_F(LinuxNotificationWatchTest, AFolderThatCannotBeMadeIsFoundWhenItComes) {
    std::ofstream(folder_ / "run") << "in the way";
    EXPECT_EQ(watch_.arm(), ENOTDIR);
    fs::remove(folder_ / "run");
    fs::create_directories(path());
    watch_.read();
    replace("a");
    watch_.read();
    EXPECT_EQ(seen_.back(), "a");
}

TEST_F(LinuxNotificationWatchTest, AWakeEndsEveryWait) {
    ASSERT_EQ(watch_.arm(), 0);
    replace("a");
    EXPECT_TRUE(watch_.wait());
    watch_.read();
    std::thread waiter([this] { EXPECT_FALSE(watch_.wait()); });
    watch_.wake();
    waiter.join();
    EXPECT_FALSE(watch_.wait());
}

} // namespace

} // namespace vela::platform
