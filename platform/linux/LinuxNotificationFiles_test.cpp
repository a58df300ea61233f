#include "platform/linux/LinuxFileSystem.h"
#include "platform/linux/LinuxNotificationFiles.h"
#include "testing/TemporaryFolder.h"

#include <cerrno>
#include <filesystem>
#include <gtest/gtest.h>
#include <limits>
#include <string>
#include <sys/stat.h>
#include <thread>
#include <vector>

namespace vela::platform {

namespace {

using State = std::optional<std::uint64_t>;

TEST(LinuxNotificationFilesTest, AStateIsADecimalNumberOf64Bits) {
    EXPECT_EQ(readNotificationState("0"), State(0));
    EXPECT_EQ(readNotificationState("1\n"), State(1));
    EXPECT_EQ(readNotificationState("007"), State(7));
    EXPECT_EQ(readNotificationState("18446744073709551615"), State(std::numeric_limits<std::uint64_t>::max()));
}

TEST(LinuxNotificationFilesTest, AnythingElseIsNoState) {
    for (const std::string& text :
         {std::string(), std::string("\n"), std::string("x"), std::string("18446744073709551616"), std::string("-1"),
          std::string("+1"), std::string(" 1"), std::string("1 "), std::string("1\n\n"), std::string("1x"),
          std::string("0x1"), std::string("1.0"), std::string("1\0", 2)}) {
        EXPECT_EQ(readNotificationState(text), std::nullopt) << text;
    }
}

TEST(LinuxNotificationFilesTest, NamesAreThoseOfFiles) {
    EXPECT_TRUE(isNotificationName("com.orvex.vela.reporting"));
    EXPECT_TRUE(isNotificationName(std::string(255, 'x')));
    for (const std::string& name : {std::string(), std::string("."), std::string(".x"), std::string("a/b"),
                                    std::string("/"), std::string("a\0b", 3), std::string(256, 'x')}) {
        EXPECT_FALSE(isNotificationName(name)) << name;
    }
}

class PostNotificationTest : public ::testing::Test {
protected:
    State state(const std::string& name) const { return notificationState(folder_ / "notifications", name); }
    static unsigned permissionsOf(const std::string& path) {
        struct stat status {};
        return stat(path.c_str(), &status) == 0 ? status.st_mode & 07777U : 0;
    }

    const testing::TemporaryFolder folder_;
};

TEST_F(PostNotificationTest, WithAStateTheStateIsThat) {
    ASSERT_TRUE(postNotification(folder_.path(), "a", 5));
    EXPECT_EQ(state("a"), State(5));
    EXPECT_EQ(*LinuxFileSystem().readFile(folder_ / "notifications/a", 100), "5");
    EXPECT_EQ(permissionsOf(folder_ / "notifications"), 0755U);
    EXPECT_EQ(permissionsOf(folder_ / "notifications/a"), 0644U);
}

TEST_F(PostNotificationTest, WithoutAStateItStaysAsItIs) {
    ASSERT_TRUE(postNotification(folder_.path(), "a", 18'446'744'073'709'551'615U));
    ASSERT_TRUE(postNotification(folder_.path(), "a", std::nullopt));
    EXPECT_EQ(state("a"), State(18'446'744'073'709'551'615U));
}

TEST_F(PostNotificationTest, WithoutAStateWhereThereIsNoneItIsZero) {
    ASSERT_TRUE(postNotification(folder_.path(), "a", std::nullopt));
    EXPECT_EQ(state("a"), State(0));
    ASSERT_TRUE(LinuxFileSystem().writeFileAtomically(folder_ / "notifications/b", "x", 0644));
    EXPECT_EQ(state("b"), std::nullopt);
    ASSERT_TRUE(postNotification(folder_.path(), "b", std::nullopt));
    EXPECT_EQ(state("b"), State(0));
}

TEST_F(PostNotificationTest, ANameThatCannotBeAFilesIsRefused) {
    EXPECT_EQ(postNotification(folder_.path(), "../a", 1).failure().code, EINVAL);
    EXPECT_EQ(postNotification(folder_.path(), ".a", 1).failure().description,
              "\".a\" cannot be the name of a notification");
    EXPECT_FALSE(std::filesystem::exists(folder_ / "notifications"));
}

TEST_F(PostNotificationTest, AFolderThatCannotBeMadeIsAFailure) {
    ASSERT_TRUE(LinuxFileSystem().writeFileAtomically(folder_ / "notifications", "in the way", 0644));
    EXPECT_EQ(postNotification(folder_.path(), "a", 1).failure().code, ENOTDIR);
}

TEST_F(PostNotificationTest, PostsWithoutAStateNeverBringAnOldOneBack) {
    std::vector<std::thread> posters;
    for (int poster = 0; poster < 3; ++poster) {
        posters.emplace_back([this] {
            for (int number = 0; number < 20; ++number) {
                EXPECT_TRUE(postNotification(folder_.path(), "a", std::nullopt));
            }
        });
    }
    for (std::uint64_t number = 1; number <= 20; ++number) {
        ASSERT_TRUE(postNotification(folder_.path(), "a", number));
        EXPECT_EQ(state("a"), State(number));
    }
    for (std::thread& poster : posters) {
        poster.join();
    }
    EXPECT_EQ(state("a"), State(20));
}

} // namespace

} // namespace vela::platform
