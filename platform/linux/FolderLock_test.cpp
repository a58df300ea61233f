#include "platform/linux/FolderLock.h"
#include "testing/TemporaryFolder.h"

#include <chrono>
#include <gtest/gtest.h>
#include <optional>
#include <thread>

namespace vela::platform {

namespace {

using namespace std::chrono_literals;

TEST(FolderLockTest, OneAtATimeHoldsIt) {
    const testing::TemporaryFolder folder;
    std::optional<FolderLock> first(std::in_place, folder.path());
    ASSERT_TRUE(*first);
    const FolderLock second(folder.path(), 0ms);
    EXPECT_EQ(errno, EBUSY);
    EXPECT_FALSE(second);
    first.reset();
    EXPECT_TRUE(FolderLock(folder.path(), 0ms));
}

TEST(FolderLockTest, ItWaitsForItsTurn) {
    const testing::TemporaryFolder folder;
    std::optional<FolderLock> first(std::in_place, folder.path());
    std::thread other([&first] { first.reset(); });
    EXPECT_TRUE(FolderLock(folder.path(), 60s));
    other.join();
}

TEST(FolderLockTest, WithoutAFolderItIsNotHeld) {
    const testing::TemporaryFolder folder;
    const FolderLock lock(folder / "none");
    EXPECT_EQ(errno, ENOENT);
    EXPECT_FALSE(lock);
}

} // namespace

} // namespace vela::platform
