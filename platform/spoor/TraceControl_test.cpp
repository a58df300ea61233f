#include "platform/spoor/TraceControl.h"
#include "platform/spoor/TracePaths.h"
#include "testing/TemporaryFolder.h"

#include <cerrno>
#include <cstring>
#include <fstream>
#include <grp.h>
#include <gtest/gtest.h>
#include <iterator>
#include <sys/stat.h>
#include <unistd.h>

namespace vela::platform::spoor {
namespace {

class TraceControlTest : public ::testing::Test {
protected:
    std::unique_ptr<TraceControl> open(std::optional<gid_t> group = {}) {
        auto control = TraceControl::open(folder_.path(), group);
        if (!control) {
            ADD_FAILURE() << control.failure().description;
            return nullptr;
        }
        return *std::move(control);
    }
    ControlPage page() const {
        std::ifstream file(controlFile(folder_.path()), std::ios::binary);
        const std::string bytes{std::istreambuf_iterator<char>(file), {}};
        ControlPage page{};
        EXPECT_EQ(bytes.size(), kControlFileBytes);
        std::memcpy(&page, bytes.data(), std::min(bytes.size(), sizeof(page)));
        return page;
    }
    mode_t modeOf(const std::string& path) const {
        struct stat status {};
        EXPECT_EQ(stat(path.c_str(), &status), 0) << path;
        return status.st_mode & 07777U;
    }

    testing::TemporaryFolder folder_;
};

TEST_F(TraceControlTest, AFreshPageCollectsNothing) {
    const auto control = open();
    EXPECT_TRUE(isControlPage(page()));
    EXPECT_EQ(page().active, 0U);
    EXPECT_EQ(page().markerSerial, 0U);
    EXPECT_EQ(modeOf(folder_ / "trace"), 0755U);
    EXPECT_EQ(modeOf(folder_ / "trace/rings"), 0755U);
    EXPECT_EQ(modeOf(folder_ / "trace/control"), 0644U);
}

TEST_F(TraceControlTest, RootSharesTheFolderOfRingsWithTheEmittersGroup) {
    if (geteuid() != 0) {
        GTEST_SKIP() << "only root may give a folder to a group";
    }
    const auto control = open(gid_t{4242});
    EXPECT_EQ(modeOf(folder_ / "trace/rings"), 01775U);
    struct stat status {};
    ASSERT_EQ(stat((folder_ / "trace/rings").c_str(), &status), 0);
    EXPECT_EQ(status.st_gid, 4242U);
}

TEST_F(TraceControlTest, AFolderThatIsThereKeepsItsPermissions) {
    ASSERT_EQ(mkdir((folder_ / "trace").c_str(), 0755), 0);
    ASSERT_EQ(mkdir((folder_ / "trace/rings").c_str(), 0700), 0);
    const auto control = open(gid_t{4242});
    EXPECT_EQ(modeOf(folder_ / "trace/rings"), 0700U);
}

TEST_F(TraceControlTest, ARangeIsShownAndTakenBack) {
    const auto control = open();
    const std::size_t slot = control->activate(0x10, 0x20);
    EXPECT_EQ(page().active, 1U);
    EXPECT_EQ(page().slots[0].low, 0x10U);
    EXPECT_EQ(page().slots[0].high, 0x20U);
    EXPECT_TRUE(collects(page(), page().active, 0x10));
    EXPECT_TRUE(collects(page(), page().active, 0x20));
    EXPECT_FALSE(collects(page(), page().active, 0x0F));
    EXPECT_FALSE(collects(page(), page().active, 0x21));
    EXPECT_NE(page().heartbeat, 0U);
    control->deactivate(slot);
    EXPECT_EQ(page().active, 0U);
}

TEST_F(TraceControlTest, EveryStartIsAGenerationOfItsOwn) {
    const auto control = open();
    const std::uint32_t before = page().generation;
    control->activate(1, 2);
    EXPECT_EQ(page().generation, before + 1);
    control->activate(1, 2);
    EXPECT_EQ(page().generation, before + 2);
}

TEST_F(TraceControlTest, ASlotIsUsedAgain) {
    const auto control = open();
    EXPECT_EQ(control->activate(1, 2), 0U);
    EXPECT_EQ(control->activate(3, 4), 1U);
    control->deactivate(0);
    EXPECT_EQ(page().active, 2U);
    EXPECT_EQ(control->activate(5, 6), 0U);
    EXPECT_EQ(page().active, 3U);
    EXPECT_EQ(page().slots[0].low, 5U);
}

TEST_F(TraceControlTest, MoreRangesThanSlotsShareTheLastOne) {
    const auto control = open();
    for (std::uint32_t i = 0; i < 40; ++i) {
        EXPECT_EQ(control->activate(100 * i, 100 * i + 1), i);
    }
    EXPECT_EQ(page().active, 0xFFFFFFFFU);
    EXPECT_EQ(page().slots[31].low, 3100U);
    EXPECT_EQ(page().slots[31].high, 3901U);
    control->deactivate(31);
    EXPECT_EQ(page().slots[31].low, 3200U);
    control->deactivate(39);
    EXPECT_EQ(page().slots[31].high, 3801U);
    for (std::size_t i = 32; i < 39; ++i) {
        control->deactivate(i);
    }
    EXPECT_EQ(page().active, 0x7FFFFFFFU);
}

TEST_F(TraceControlTest, TheMarkersPathHasAnotherNumberEachTime) {
    const auto control = open();
    control->setMarker("/a/marker");
    const std::uint32_t first = page().markerSerial;
    EXPECT_NE(first, 0U);
    EXPECT_STREQ(page().marker.data(), "/a/marker");
    control->setMarker("");
    EXPECT_EQ(page().markerSerial, 0U);
    EXPECT_STREQ(page().marker.data(), "");
    control->setMarker("/a/marker");
    EXPECT_NE(page().markerSerial, 0U);
    EXPECT_NE(page().markerSerial, first);
}

TEST_F(TraceControlTest, APathThatDoesNotFitIsNone) {
    const auto control = open();
    control->setMarker(std::string(256, 'x'));
    EXPECT_EQ(page().markerSerial, 0U);
    control->setMarker(std::string(255, 'x'));
    EXPECT_NE(page().markerSerial, 0U);
}

TEST_F(TraceControlTest, ASecondServiceIsRefusedWhileTheFirstLives) {
    auto control = open();
    const auto second = TraceControl::open(folder_.path(), {});
    ASSERT_FALSE(second);
    EXPECT_EQ(second.failure().code, EBUSY);
    control.reset();
    EXPECT_TRUE(TraceControl::open(folder_.path(), {}));
}

TEST_F(TraceControlTest, ThePageStaysAndCountsOn) {
    struct stat first {};
    struct stat second {};
    {
        const auto control = open();
        control->activate(1, 2);
        control->setMarker("/a/marker");
        ASSERT_EQ(stat(controlFile(folder_.path()).c_str(), &first), 0);
    }
    const ControlPage left = page();
    EXPECT_EQ(left.active, 0U);
    const auto control = open();
    ASSERT_EQ(stat(controlFile(folder_.path()).c_str(), &second), 0);
    EXPECT_EQ(first.st_ino, second.st_ino);
    EXPECT_EQ(page().generation, left.generation);
    EXPECT_EQ(page().markerSerial, 0U);
    control->setMarker("/a/marker");
    EXPECT_GT(page().markerSerial, left.markerSerial);
}

TEST_F(TraceControlTest, WhatADeadServiceLeftActiveEnds) {
    { const auto control = open(); }
    ControlPage left = page();
    left.active = 5;
    std::fstream file(controlFile(folder_.path()), std::ios::binary | std::ios::in | std::ios::out);
    file.write(reinterpret_cast<const char*>(&left), sizeof(left));
    file.close();
    EXPECT_EQ(page().active, 5U);
    const auto control = open();
    EXPECT_EQ(page().active, 0U);
}

TEST_F(TraceControlTest, AFileWithOtherContentBecomesAPage) {
    ASSERT_EQ(mkdir((folder_ / "trace").c_str(), 0755), 0);
    std::ofstream(controlFile(folder_.path())) << std::string(10'000, 'x');
    const auto opened = TraceControl::open(folder_.path(), {});
    ASSERT_TRUE(opened);
    std::ifstream file(controlFile(folder_.path()), std::ios::binary);
    ControlPage read{};
    file.read(reinterpret_cast<char*>(&read), sizeof(read));
    EXPECT_TRUE(isControlPage(read));
    EXPECT_EQ(read.active, 0U);
}

TEST_F(TraceControlTest, ALinkInThePagesPlaceIsRefused) {
    ASSERT_EQ(mkdir((folder_ / "trace").c_str(), 0755), 0);
    std::ofstream(folder_ / "victim") << "precious";
    ASSERT_EQ(symlink((folder_ / "victim").c_str(), controlFile(folder_.path()).c_str()), 0);
    EXPECT_FALSE(TraceControl::open(folder_.path(), {}));
    std::ifstream victim(folder_ / "victim");
    std::string content;
    victim >> content;
    EXPECT_EQ(content, "precious");
}

TEST_F(TraceControlTest, AFifoInThePagesPlaceIsRefused) {
    ASSERT_EQ(mkdir((folder_ / "trace").c_str(), 0755), 0);
    ASSERT_EQ(mkfifo(controlFile(folder_.path()).c_str(), 0644), 0);
    EXPECT_FALSE(TraceControl::open(folder_.path(), {}));
}

TEST_F(TraceControlTest, WhereNoFolderCanBeThereIsAFailure) {
    std::ofstream(folder_ / "file") << "x";
    const auto control = TraceControl::open(folder_ / "file", {});
    ASSERT_FALSE(control);
    EXPECT_EQ(control.failure().code, ENOTDIR);
}

} // namespace
} // namespace vela::platform::spoor
