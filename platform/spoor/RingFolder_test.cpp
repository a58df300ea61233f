#include "platform/spoor/OwnerLock.h"
#include "platform/spoor/RingFolder.h"
#include "platform/spoor/TraceRing.h"
#include "testing/CapturingLog.h"
#include "testing/TemporaryFolder.h"

#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace vela::platform::spoor {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class RingFolderTest : public ::testing::Test {
protected:
    std::unique_ptr<TraceRing> makeRing() {
        auto ring = TraceRing::create(folder_.path());
        if (!ring) {
            ADD_FAILURE() << ring.failure().description;
            return nullptr;
        }
        auto made = *std::move(ring);
        made->adopt();
        return made;
    }
    std::vector<std::uint32_t> drain(bool all = false) {
        std::vector<TraceRecord> records;
        rings_.drain(all, records, lost_);
        std::vector<std::uint32_t> codes;
        for (const TraceRecord& record : records) {
            codes.push_back(record.code);
        }
        return codes;
    }
    /// Rings of living emitters that are empty, and take no room on the disk.
    std::vector<FileDescriptor> fill(std::size_t count) const {
        std::vector<FileDescriptor> files;
        for (std::size_t i = 0; i < count; ++i) {
            const RingHeader header;
            const std::string path = folder_ / (std::to_string(i) + "-empty.ring");
            files.emplace_back(open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0644));
            EXPECT_EQ(pwrite(files.back().get(), &header, sizeof(header), 0), ssize_t{sizeof(header)});
            EXPECT_EQ(ftruncate(files.back().get(), kRingFileBytes), 0);
            EXPECT_TRUE(lockAsOwner(files.back().get()));
        }
        return files;
    }
    std::size_t files() const {
        const std::filesystem::directory_iterator entries(folder_.path());
        return static_cast<std::size_t>(std::distance(begin(entries), end(entries)));
    }

    testing::TemporaryFolder folder_;
    RingFolder rings_{folder_.path()};
    std::uint64_t lost_ = 0;
};

TEST_F(RingFolderTest, ARingThatComesWhileCollectingIsReadFromItsBegin) {
    ASSERT_TRUE(rings_.begin());
    const auto ring = makeRing();
    EXPECT_TRUE(ring->write(traceNow(), 1, {}));
    EXPECT_THAT(drain(), ElementsAre(1));
    EXPECT_TRUE(ring->write(traceNow(), 2, {}));
    EXPECT_THAT(drain(), ElementsAre(2));
    EXPECT_EQ(lost_, 0U);
}

TEST_F(RingFolderTest, WhatARingHeldBeforeIsPassedOver) {
    const auto ring = makeRing();
    EXPECT_TRUE(ring->write(traceNow(), 1, {}));
    ASSERT_TRUE(rings_.begin());
    EXPECT_TRUE(ring->write(traceNow(), 2, {}));
    EXPECT_THAT(drain(), ElementsAre(2));
}

TEST_F(RingFolderTest, SeveralRingsAreRead) {
    ASSERT_TRUE(rings_.begin());
    const auto first = makeRing();
    const auto second = makeRing();
    EXPECT_TRUE(first->write(traceNow(), 1, {}));
    EXPECT_TRUE(second->write(traceNow(), 2, {}));
    EXPECT_THAT(drain(), ::testing::UnorderedElementsAre(1, 2));
    EXPECT_EQ(rings_.rings(), 2U);
}

TEST_F(RingFolderTest, ARingWhoseEmitterIsGoneIsReadToItsEndAndRemoved) {
    ASSERT_TRUE(rings_.begin());
    auto ring = makeRing();
    EXPECT_THAT(drain(), IsEmpty());
    EXPECT_TRUE(ring->write(traceNow(), 1, {}));
    ring.reset();
    EXPECT_EQ(files(), 1U);
    EXPECT_THAT(drain(true), ElementsAre(1));
    EXPECT_EQ(files(), 0U);
    EXPECT_EQ(rings_.rings(), 0U);
}

TEST_F(RingFolderTest, ARingThatCameAndWasLeftBetweenTwoReadingsIsReadAndRemoved) {
    ASSERT_TRUE(rings_.begin());
    auto ring = makeRing();
    EXPECT_TRUE(ring->write(traceNow(), 1, {}));
    ring.reset();
    EXPECT_THAT(drain(true), ElementsAre(1));
    EXPECT_EQ(files(), 0U);
}

TEST_F(RingFolderTest, AtTheBeginRingsOfThoseWhoAreGoneAreRemoved) {
    makeRing().reset();
    const auto living = makeRing();
    EXPECT_EQ(files(), 2U);
    ASSERT_TRUE(rings_.begin());
    EXPECT_EQ(files(), 1U);
    EXPECT_EQ(rings_.rings(), 1U);
}

TEST_F(RingFolderTest, AnOldFileWithoutANameIsRemovedAndAYoungOneStays) {
    std::ofstream(folder_ / ".1-1-1") << "x";
    std::ofstream(folder_ / ".1-1-2") << "x";
    const timespec times[2] = {{1'000'000'000, 0}, {1'000'000'000, 0}};
    ASSERT_EQ(utimensat(AT_FDCWD, (folder_ / ".1-1-1").c_str(), times, 0), 0);
    ASSERT_TRUE(rings_.begin());
    EXPECT_FALSE(std::filesystem::exists(folder_ / ".1-1-1"));
    EXPECT_TRUE(std::filesystem::exists(folder_ / ".1-1-2"));
}

TEST_F(RingFolderTest, WhatIsNoRingIsPassedOverAndStays) {
    ASSERT_EQ(mkfifo((folder_ / "fifo.ring").c_str(), 0644), 0);
    ASSERT_EQ(mkdir((folder_ / "folder.ring").c_str(), 0755), 0);
    ASSERT_EQ(symlink("/etc/passwd", (folder_ / "link.ring").c_str()), 0);
    std::ofstream(folder_ / "notes.txt") << "x";
    ASSERT_TRUE(rings_.begin());
    std::ofstream(folder_ / "short.ring") << "x";
    std::ofstream(folder_ / "empty.ring");
    const auto ring = makeRing();
    EXPECT_TRUE(ring->write(traceNow(), 1, {}));
    EXPECT_THAT(drain(true), ElementsAre(1));
    EXPECT_THAT(drain(true), IsEmpty());
    EXPECT_EQ(files(), 7U);
}

TEST_F(RingFolderTest, ARingThatIsCutIsLeftAlone) {
    ASSERT_TRUE(rings_.begin());
    const auto cut = makeRing();
    const auto whole = makeRing();
    EXPECT_TRUE(cut->write(traceNow(), 1, {}));
    EXPECT_TRUE(whole->write(traceNow(), 2, {}));
    ASSERT_EQ(truncate(cut->path().c_str(), 100), 0);
    EXPECT_THAT(drain(), ElementsAre(2));
    EXPECT_TRUE(whole->write(traceNow(), 3, {}));
    EXPECT_THAT(drain(true), ElementsAre(3));
}

TEST_F(RingFolderTest, OneUserHasABoundedNumberOfRings) {
    ASSERT_TRUE(rings_.begin());
    for (std::size_t i = 0; i < RingFolder::kMostRingsOfUser + 10; ++i) {
        std::ofstream(folder_ / (std::to_string(i) + ".ring")) << "x";
    }
    EXPECT_THAT(drain(true), IsEmpty());
    EXPECT_EQ(rings_.rings(), RingFolder::kMostRingsOfUser);
}

TEST_F(RingFolderTest, EventsOfARingWithoutRoomAreCountedAndToldOnce) {
    const testing::CapturingLog log;
    ASSERT_TRUE(rings_.begin());
    const auto others = fill(RingFolder::kMostRingsOfUser);
    EXPECT_THAT(drain(true), IsEmpty());
    const auto first = makeRing();
    const auto second = makeRing();
    for (std::uint32_t i = 0; i < 20'000; ++i) {
        EXPECT_TRUE(first->write(traceNow(), 1, {}));
    }
    EXPECT_TRUE(second->write(traceNow(), 2, {}));
    second->addLost(3);
    EXPECT_THAT(drain(true), IsEmpty());
    EXPECT_EQ(lost_, 20'004U);
    EXPECT_TRUE(second->write(traceNow(), 2, {}));
    EXPECT_THAT(drain(true), IsEmpty());
    EXPECT_EQ(lost_, 20'005U);
    EXPECT_THAT(drain(true), IsEmpty());
    EXPECT_EQ(lost_, 20'005U);
    const auto lines = log.linesOf("velart");
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_EQ(lines[0].level, LogLevel::Default);
    EXPECT_THAT(lines[0].message,
                ::testing::MatchesRegex("kernel trace: no room for ring [0-9-]*\\.ring: the limit is 512 rings, 256 of "
                                        "one user; events of further threads are lost"));
}

TEST_F(RingFolderTest, WhatARingWithoutRoomHeldBeforeIsNotCounted) {
    const auto others = fill(RingFolder::kMostRingsOfUser - 1);
    std::vector<std::unique_ptr<TraceRing>> own; // one of them has room
    for (int i = 0; i < 4; ++i) {
        own.push_back(makeRing());
        EXPECT_TRUE(own.back()->write(traceNow(), 1, {}));
    }
    ASSERT_TRUE(rings_.begin());
    EXPECT_EQ(rings_.rings(), 256U);
    for (const auto& ring : own) {
        EXPECT_TRUE(ring->write(traceNow(), 2, {}));
    }
    const std::size_t read = drain(true).size();
    EXPECT_EQ(read + lost_, 4U);
}

TEST_F(RingFolderTest, ARingWithoutRoomIsReadWhenThereIsRoom) {
    ASSERT_TRUE(rings_.begin());
    auto others = fill(RingFolder::kMostRingsOfUser);
    EXPECT_THAT(drain(true), IsEmpty());
    const auto ring = makeRing();
    EXPECT_TRUE(ring->write(traceNow(), 1, {}));
    EXPECT_THAT(drain(true), IsEmpty());
    EXPECT_EQ(lost_, 1U);
    others.pop_back();
    EXPECT_TRUE(ring->write(traceNow(), 2, {}));
    EXPECT_THAT(drain(true), IsEmpty()); // finds the dead one
    EXPECT_TRUE(ring->write(traceNow(), 3, {}));
    EXPECT_THAT(drain(true), IsEmpty());
    EXPECT_EQ(lost_, 3U);
    EXPECT_TRUE(ring->write(traceNow(), 4, {}));
    EXPECT_THAT(drain(), ElementsAre(4));
    EXPECT_EQ(lost_, 3U);
}

TEST_F(RingFolderTest, ADeadRingWithoutRoomIsCountedToItsEndAndRemoved) {
    ASSERT_TRUE(rings_.begin());
    const auto others = fill(RingFolder::kMostRingsOfUser);
    EXPECT_THAT(drain(true), IsEmpty());
    auto ring = makeRing();
    EXPECT_TRUE(ring->write(traceNow(), 1, {}));
    ring.reset();
    EXPECT_EQ(files(), 257U);
    EXPECT_THAT(drain(true), IsEmpty());
    EXPECT_EQ(lost_, 1U);
    EXPECT_EQ(files(), 256U);
}

TEST_F(RingFolderTest, MoreNamesThanAreLookedAtAreToldOnce) {
    const testing::CapturingLog log;
    for (std::size_t i = 0; i < 4097; ++i) {
        std::ofstream(folder_ / (std::to_string(i) + ".txt")).flush();
    }
    ASSERT_TRUE(rings_.begin());
    EXPECT_THAT(drain(true), IsEmpty());
    const auto lines = log.linesOf("velart");
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_EQ(lines[0].message, "kernel trace: " + folder_.path() +
                                    " has more than its limit of 4096 names: events of further rings are lost, "
                                    "uncounted");
}

TEST_F(RingFolderTest, WithoutAFolderItDoesNotBegin) {
    RingFolder none(folder_ / "none");
    const auto begun = none.begin();
    ASSERT_FALSE(begun);
    EXPECT_EQ(begun.failure().code, ENOENT);
}

TEST_F(RingFolderTest, AThreadThatWritesAllTheTimeLosesNothing) {
    ASSERT_TRUE(rings_.begin());
    const auto ring = makeRing();
    std::vector<std::uint32_t> codes;
    for (std::uint32_t i = 0; i < 100'000; ++i) {
        EXPECT_TRUE(ring->write(traceNow(), i, {}));
        if (i % 5'000 == 0) {
            const auto drained = drain();
            codes.insert(codes.end(), drained.begin(), drained.end());
        }
    }
    const auto drained = drain(true);
    codes.insert(codes.end(), drained.begin(), drained.end());
    EXPECT_EQ(lost_, 0U);
    ASSERT_EQ(codes.size(), 100'000U);
    for (std::uint32_t i = 0; i < 100'000; ++i) {
        ASSERT_EQ(codes[i], i);
    }
}

} // namespace
} // namespace vela::platform::spoor
