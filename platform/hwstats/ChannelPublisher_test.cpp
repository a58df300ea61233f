#include "platform/hwstats/ChannelFileNames.h"
#include "platform/hwstats/ChannelFileReader.h"
#include "platform/hwstats/ChannelPublisher.h"
#include "platform/hwstats/ChannelTables_test.h"
#include "testing/TemporaryFolder.h"

#include <algorithm>
#include <csignal>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <sys/stat.h>
#include <sys/wait.h>

namespace vela::platform::hwstats {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class ChannelPublisherTest : public ::testing::Test {
protected:
    std::unique_ptr<ChannelPublisher> publish(const std::string& publisher = "test") {
        auto made = ChannelPublisher::create(folder_.path(), publisher, exampleTable());
        EXPECT_TRUE(static_cast<bool>(made)) << (made ? "" : made.failure().description);
        return made ? *std::move(made) : nullptr;
    }
    static ChannelFileHeader headerOf(const std::string& path) {
        const FileDescriptor descriptor(open(path.c_str(), O_RDONLY));
        FileBytes file(descriptor.get());
        return *readChannelFileHeader(file, std::filesystem::file_size(path));
    }
    static std::vector<std::uint64_t> wordsOf(const std::string& path, std::uint64_t now = 0) {
        const FileDescriptor descriptor(open(path.c_str(), O_RDONLY));
        FileBytes file(descriptor.get());
        const ChannelFileHeader header = *readChannelFileHeader(file, std::filesystem::file_size(path));
        const auto table = *readChannelTable(file, header);
        EXPECT_EQ(*table, exampleTable());
        return readChannelValues(file, header, *table, now)->words;
    }
    std::vector<std::string> files() const {
        std::vector<std::string> names;
        for (const auto& entry : std::filesystem::directory_iterator(folder_.path())) {
            names.push_back(entry.path().filename().string());
        }
        std::ranges::sort(names);
        return names;
    }

    const testing::TemporaryFolder folder_;
};

TEST_F(ChannelPublisherTest, ANewFileHoldsZeros) {
    const auto publisher = publish();
    EXPECT_EQ(publisher->path(), folder_ / "test-Driver-Speaker-Stats.channels");
    EXPECT_THAT(files(), ElementsAre("test-Driver-Speaker-Stats.channels"));
    EXPECT_THAT(wordsOf(publisher->path(), 1'000), ElementsAre(0, 0, 0, 0, 0, 0, 0, 0, 0));
    const ChannelFileHeader header = headerOf(publisher->path());
    EXPECT_EQ(header.pid, getpid());
    EXPECT_NE(header.generation, 0U);
    EXPECT_NE(header.processStart, 0U);
    EXPECT_NE(header.created, 0U);
    EXPECT_EQ(header.closed, 0U);
    struct stat status {};
    ASSERT_EQ(stat(publisher->path().c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777U, 0644U);
}

TEST_F(ChannelPublisherTest, ACounterIsAddedToAndSet) {
    const auto publisher = publish();
    PublishedChannel& counter = publisher->channels()[0];
    counter.add(5);
    counter.add(-7);
    EXPECT_EQ(static_cast<std::int64_t>(wordsOf(publisher->path())[0]), -2);
    counter.set(40);
    counter.add(2);
    EXPECT_EQ(wordsOf(publisher->path())[0], 42U);
}

TEST_F(ChannelPublisherTest, AValueCountsInItsBucket) {
    const auto publisher = publish();
    PublishedChannel& histogram = publisher->channels()[1]; // 0 to 10, 10 to 20
    for (const std::int64_t value : {0, 9, 10, 19}) {
        histogram.record(value);
    }
    const auto words = wordsOf(publisher->path());
    EXPECT_EQ(words[1], 0U);
    EXPECT_EQ(words[2], 19U);
    EXPECT_EQ(words[3], 2U);
    EXPECT_EQ(words[4], 2U);
}

TEST_F(ChannelPublisherTest, AValueBeyondTheBoundsCountsInTheNearestBucket) {
    const auto publisher = publish();
    PublishedChannel& histogram = publisher->channels()[1];
    histogram.record(20);
    histogram.record(std::numeric_limits<std::int64_t>::max());
    histogram.record(-1);
    histogram.record(std::numeric_limits<std::int64_t>::min());
    const auto words = wordsOf(publisher->path());
    EXPECT_EQ(static_cast<std::int64_t>(words[1]), std::numeric_limits<std::int64_t>::min());
    EXPECT_EQ(static_cast<std::int64_t>(words[2]), std::numeric_limits<std::int64_t>::max());
    EXPECT_EQ(words[3], 2U);
    EXPECT_EQ(words[4], 2U);
}

TEST_F(ChannelPublisherTest, EveryBucketOfAnyNumberOfThemIsFound) {
    for (std::int64_t buckets = 1; buckets <= 9; ++buckets) {
        ChannelTable table{"Driver", std::to_string(buckets), {}, {{HwStatsFormat::Histogram, "h", {}, {}, {}}}};
        for (std::int64_t i = 0; i <= buckets; ++i) {
            table.channels[0].bounds.push_back(10 * i);
        }
        const auto publisher = *ChannelPublisher::create(folder_.path(), "test", table);
        for (std::int64_t i = 0; i < buckets; ++i) {
            publisher->channels()[0].record(10 * i);
            publisher->channels()[0].record(10 * i + 9);
        }
        const FileDescriptor descriptor(open(publisher->path().c_str(), O_RDONLY));
        FileBytes file(descriptor.get());
        const auto values = readChannelValues(file, headerOf(publisher->path()), table, 0);
        EXPECT_EQ(std::vector(values->words.begin() + 2, values->words.end()),
                  std::vector<std::uint64_t>(static_cast<std::size_t>(buckets), 2));
    }
}

TEST_F(ChannelPublisherTest, TheFirstValueIsLeastAndGreatest) {
    const auto publisher = publish();
    publisher->channels()[1].record(7);
    const auto words = wordsOf(publisher->path());
    EXPECT_EQ(words[1], 7U);
    EXPECT_EQ(words[2], 7U);
}

TEST_F(ChannelPublisherTest, StatesAreEnteredAndLeft) {
    const auto publisher = publish();
    PublishedChannel& state = publisher->channels()[2];
    state.enter(0, 1'000);
    state.enter(1, 1'100);
    state.enter(1, 1'150); // no transition
    state.enter(0, 1'200);
    state.enter(7, 1'250); // no state
    // idle 2x 100 and going on, running 1x 100
    EXPECT_THAT(wordsOf(publisher->path(), 1'300), ElementsAre(0, 0, 0, 0, 0, 2, 200, 1, 100));
    state.enter(kNoState, 1'400);
    EXPECT_THAT(wordsOf(publisher->path(), 9'999), ElementsAre(0, 0, 0, 0, 0, 2, 300, 1, 100));
}

TEST_F(ChannelPublisherTest, ATimeThatGoesBackAddsNothing) {
    const auto publisher = publish();
    publisher->channels()[2].enter(0, 1'000);
    publisher->channels()[2].enter(1, 900);
    EXPECT_THAT(wordsOf(publisher->path()), ElementsAre(0, 0, 0, 0, 0, 1, 0, 1, 0));
}

TEST_F(ChannelPublisherTest, UpdatesOfOtherFormatsDoNothing) {
    const auto publisher = publish();
    auto& channels = publisher->channels();
    channels[0].record(1);
    channels[0].enter(0, 1);
    channels[1].add(1);
    channels[1].set(1);
    channels[1].enter(0, 1);
    channels[2].add(1);
    channels[2].record(1);
    EXPECT_THAT(wordsOf(publisher->path()), ElementsAre(0, 0, 0, 0, 0, 0, 0, 0, 0));
}

TEST_F(ChannelPublisherTest, TheEndInOrderIsMarkedAndTheFileStays) {
    auto publisher = publish();
    const std::string path = publisher->path();
    publisher->channels()[0].add(3);
    publisher->channels()[2].enter(1, 1);
    publisher.reset();
    EXPECT_EQ(headerOf(path).closed, 1U);
    const auto words = wordsOf(path, ~std::uint64_t{0});
    EXPECT_EQ(words[0], 3U);
    EXPECT_GT(words[8], 0U) << "until the end";
    EXPECT_LT(words[8], ~std::uint64_t{0} / 2) << "and not beyond it";
}

TEST_F(ChannelPublisherTest, TheNextPublisherTakesThePlaceOfOneThatEnded) {
    const std::uint64_t first = headerOf(publish()->path()).generation;
    const auto second = publish();
    EXPECT_THAT(files(), ElementsAre("test-Driver-Speaker-Stats.channels"));
    EXPECT_NE(headerOf(second->path()).generation, first);
}

TEST_F(ChannelPublisherTest, PublishersOfOneNameThatLiveAtATimeHaveNumbers) {
    const auto first = publish();
    auto second = publish();
    const auto third = publish();
    EXPECT_THAT(files(), ElementsAre("test-Driver-Speaker-Stats.channels", "test-Driver-Speaker-Stats~2.channels",
                                     "test-Driver-Speaker-Stats~3.channels"));
    second.reset();
    const auto fourth = publish();
    EXPECT_EQ(fourth->path(), folder_ / "test-Driver-Speaker-Stats~2.channels");
}

TEST_F(ChannelPublisherTest, AFileThatIsNoneIsReplaced) {
    std::ofstream(folder_ / "test-Driver-Speaker-Stats.channels") << "nonsense";
    EXPECT_EQ(wordsOf(publish()->path()).size(), 9U);
}

TEST_F(ChannelPublisherTest, AFolderInTheWayIsPassedBy) {
    std::filesystem::create_directories(folder_ / "test-Driver-Speaker-Stats.channels");
    EXPECT_EQ(publish()->path(), folder_ / "test-Driver-Speaker-Stats~2.channels");
}

TEST_F(ChannelPublisherTest, LinksAreNotFollowed) {
    std::ofstream(folder_ / "precious") << "stays";
    std::filesystem::create_symlink(folder_ / "precious", folder_ / "test-Driver-Speaker-Stats.channels");
    EXPECT_EQ(publish()->path(), folder_ / "test-Driver-Speaker-Stats~2.channels");
    EXPECT_EQ(std::filesystem::file_size(folder_ / "precious"), 5U);
}

TEST_F(ChannelPublisherTest, WithoutAFolderThereIsAReason) {
    const auto made = ChannelPublisher::create(folder_ / "none", "p", exampleTable());
    ASSERT_FALSE(static_cast<bool>(made));
    EXPECT_EQ(made.failure().code, ENOENT);
    EXPECT_EQ(made.failure().description, "open " + (folder_ / "none") + ": No such file or directory");
}

TEST_F(ChannelPublisherTest, AFailureLeavesNothingBehind) {
    EXPECT_FALSE(static_cast<bool>(ChannelPublisher::create(folder_.path(), "p", {"d", "g", {}, {}})));
    EXPECT_THAT(files(), IsEmpty());
}

/// Runs `work` in a child of its own and ends it with SIGKILL as soon as it says that it is done.
template <class Work>
void inKilledProcess(Work work) {
    int ready[2];
    ASSERT_EQ(pipe(ready), 0);
    const pid_t child = fork();
    if (child == 0) {
        work();
        if (write(ready[1], "x", 1) != 1) {
            _exit(1);
        }
        for (;;) {
            pause();
        }
    }
    close(ready[1]);
    char byte = 0;
    EXPECT_EQ(read(ready[0], &byte, 1), 1);
    close(ready[0]);
    kill(child, SIGKILL);
    EXPECT_EQ(waitpid(child, nullptr, 0), child);
}

TEST_F(ChannelPublisherTest, WhatAKilledPublisherCountedStays) {
    const std::string path = folder_ / "test-Driver-Speaker-Stats.channels";
    inKilledProcess([this] {
        ChannelPublisher* const publisher = publish().release(); // the process ends before it
        publisher->channels()[0].add(9);
        publisher->channels()[2].enter(1, 1);
    });
    EXPECT_EQ(wordsOf(path)[0], 9U);
    EXPECT_EQ(headerOf(path).closed, 0U);
    const FileDescriptor file(open(path.c_str(), O_RDONLY));
    EXPECT_FALSE(hasLivingPublisher(file.get()));
    const auto next = publish();
    EXPECT_EQ(next->path(), path) << "and its place is free";
    const FileDescriptor nextFile(open(path.c_str(), O_RDONLY));
    EXPECT_TRUE(hasLivingPublisher(nextFile.get()));
}

} // namespace
} // namespace vela::platform::hwstats
