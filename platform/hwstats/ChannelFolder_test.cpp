#include "platform/hwstats/ChannelFolder.h"
#include "platform/hwstats/ChannelPublisher.h"
#include "platform/hwstats/ChannelTables_test.h"
#include "platform/hwstats/SystemTree_test.h"
#include "testing/TemporaryFolder.h"

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace vela::platform::hwstats {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::UnorderedElementsAre;

class ChannelFolderTest : public ::testing::Test {
protected:
    std::unique_ptr<ChannelPublisher> publish(const std::string& publisher) const {
        return *ChannelPublisher::create(path_.path(), publisher, exampleTable());
    }
    void write(const std::string& name, const std::string& bytes) const {
        std::ofstream(path_ / name, std::ios::binary) << bytes;
    }
    Samples sample() {
        Samples samples;
        samples.time = 1;
        error_ = folder_.sample([](const ChannelTable&) { return true; }, samples);
        return samples;
    }
    std::vector<std::string> keys() {
        const Samples samples = sample();
        std::vector<std::string> keys;
        for (const SampleBlock& block : samples.blocks) {
            keys.push_back(block.key);
        }
        return keys;
    }

    const testing::TemporaryFolder path_;
    ChannelFolder folder_{path_.path()};
    std::optional<int> error_;
};

TEST_F(ChannelFolderTest, FilesAreSampledByName) {
    const auto second = publish("b");
    const auto first = publish("a");
    first->channels()[0].add(5);
    const Samples samples = sample();
    ASSERT_EQ(samples.blocks.size(), 2U);
    EXPECT_EQ(samples.blocks[0].key, "file:a-Driver-Speaker-Stats.channels");
    EXPECT_EQ(samples.blocks[0].words[0], 5U);
    EXPECT_TRUE(samples.blocks[0].wholeWhenNew);
    EXPECT_FALSE(samples.blocks[0].ended);
    EXPECT_EQ(error_, std::nullopt);
}

TEST_F(ChannelFolderTest, AFolderThatIsNotThereHasNoFiles) {
    ChannelFolder none(path_ / "none");
    Samples samples;
    EXPECT_EQ(none.sample([](const ChannelTable&) { return true; }, samples), std::nullopt);
    EXPECT_THAT(samples.blocks, IsEmpty());
}

TEST_F(ChannelFolderTest, WhatIsNoFolderIsAnError) {
    write("file", "x");
    ChannelFolder file(path_ / "file");
    Samples samples;
    EXPECT_EQ(file.sample([](const ChannelTable&) { return true; }, samples), ENOTDIR);
}

TEST_F(ChannelFolderTest, OnlyWantedTablesAreSampled) {
    const auto publisher = publish("a");
    Samples samples;
    folder_.sample([](const ChannelTable& table) { return table.group == "Rx"; }, samples);
    EXPECT_THAT(samples.blocks, IsEmpty());
    EXPECT_THAT(samples.missed, IsEmpty());
}

TEST_F(ChannelFolderTest, APublisherThatEndedIsSampledAndKnownToHaveEnded) {
    publish("a")->channels()[0].add(5);
    const Samples samples = sample();
    EXPECT_EQ(samples.blocks.at(0).words[0], 5U);
    EXPECT_TRUE(samples.blocks[0].ended);
}

TEST_F(ChannelFolderTest, ATableIsSharedByAllSamplings) {
    const auto publisher = publish("a");
    const Samples first = sample();
    const Samples second = sample();
    EXPECT_EQ(first.blocks.at(0).table, second.blocks.at(0).table);
}

TEST_F(ChannelFolderTest, APublisherThatStartsAnewIsReadAnew) {
    auto publisher = publish("a");
    const Samples first = sample();
    publisher.reset();
    const auto again = *ChannelPublisher::create(
        path_.path(), "a", {"Driver", "Speaker", "Stats", {{HwStatsFormat::Simple, "other", {}, {}, {}}}});
    again->channels()[0].add(3);
    const Samples second = sample();
    EXPECT_EQ(second.blocks.at(0).table->channels.at(0).name, "other");
    EXPECT_EQ(second.blocks[0].words[0], 3U);
    EXPECT_NE(second.blocks[0].generation, first.blocks.at(0).generation);
}

TEST_F(ChannelFolderTest, OtherFilesAreNone) {
    const std::string bytes = fileOf(exampleTable());
    write("good.channels", bytes);
    write(".hidden.channels", bytes);
    write("good.channels.tmp", bytes);
    write("empty.channels", "");
    write("short.channels", bytes.substr(0, bytes.size() - 1));
    write("text.channels", "not a channel file, but longer than the header of one would be: nothing in it is right");
    std::filesystem::create_directories(path_ / "folder.channels");
    std::filesystem::create_symlink(path_ / "good.channels", path_ / "link.channels");
    ASSERT_EQ(mkfifo((path_ / "pipe.channels").c_str(), 0600), 0);
    EXPECT_THAT(keys(), ElementsAre("file:good.channels"));
    EXPECT_THAT(keys(), ElementsAre("file:good.channels"));
}

TEST_F(ChannelFolderTest, AFileThatWasMendedIsReadAnew) {
    std::string bytes = fileOf(exampleTable());
    bytes[70] = '\xFF';
    write("a.channels", bytes);
    EXPECT_THAT(keys(), IsEmpty());
    write("a.channels", fileOf(exampleTable()) + "more");
    EXPECT_THAT(keys(), ElementsAre("file:a.channels"));
}

TEST_F(ChannelFolderTest, WhatIsWrongWithAFileIsToldOnce) {
    const std::string bytes = fileOf(exampleTable());
    write("empty.channels", "");
    write("good.channels", bytes);
    write("short.channels", bytes.substr(0, bytes.size() - 1));
    sample();
    EXPECT_THAT(folder_.takeFaults(), ElementsAre("empty.channels: it is shorter than a header",
                                                  "short.channels: it is shorter than it says"));
    sample();
    EXPECT_THAT(folder_.takeFaults(), IsEmpty());
}

TEST_F(ChannelFolderTest, AFileIsToldAgainWhenSomethingElseIsWrong) {
    std::string bytes = fileOf(exampleTable());
    putAt(bytes, 12, std::uint32_t{2});
    write("a.channels", bytes);
    sample();
    EXPECT_THAT(folder_.takeFaults(), ElementsAre("a.channels: its version is 2, not 1"));
    write("a.channels", bytes + "more");
    sample();
    EXPECT_THAT(folder_.takeFaults(), IsEmpty()) << "the same fault of another file";
    putAt(bytes, 12, kChannelFileVersion);
    bytes[bytes.find("frames")] = '\xFF';
    write("a.channels", bytes);
    const Samples samples = sample();
    EXPECT_THAT(folder_.takeFaults(), ElementsAre("a.channels: channel 0: a channel's name is no UTF-8"));
    EXPECT_THAT(samples.missed, ElementsAre("file:a.channels"));
}

TEST_F(ChannelFolderTest, AFileThatShrinksUnderItsPublisherIsMissed) {
    write("a.channels", fileOf(exampleTable()));
    ASSERT_EQ(keys().size(), 1U);
    ASSERT_EQ(truncate((path_ / "a.channels").c_str(), 100), 0);
    const Samples samples = sample();
    EXPECT_THAT(samples.blocks, IsEmpty());
}

TEST_F(ChannelFolderTest, FilesBeyondTheBoundAreLeftOut) {
    const std::string bytes = fileOf(exampleTable());
    for (std::size_t i = 0; i < ChannelFolder::kMostFiles; ++i) {
        write(std::to_string(1'000 + i) + ".channels", bytes);
    }
    EXPECT_FALSE(sample().incomplete);
    write("2000.channels", bytes);
    const Samples samples = sample();
    EXPECT_EQ(samples.blocks.size(), ChannelFolder::kMostFiles);
    EXPECT_TRUE(samples.incomplete);
}

TEST_F(ChannelFolderTest, ChannelsBeyondTheBoundAreMissed) {
    const ChannelTable many{"d", "g", {}, std::vector<ChannelDescription>(4'096, exampleTable().channels[0])};
    const std::string bytes = fileOf(many);
    for (const char* name : {"a", "b", "c", "d", "e"}) {
        write(std::string(name) + ".channels", bytes);
    }
    const Samples samples = sample();
    EXPECT_EQ(samples.blocks.size(), 4U);
    EXPECT_THAT(samples.missed, UnorderedElementsAre("file:e.channels"));
}

TEST_F(ChannelFolderTest, TablesBeyondTheBoundOfMemoryAreMissed) {
    // In memory 1.5 MiB and a little: ten fit.
    const ChannelDescription counter{HwStatsFormat::Simple, std::string(256, 'x'), {}, {}, {}};
    const ChannelTable large{"d", "other", {}, std::vector<ChannelDescription>(4'096, counter)};
    const std::string bytes = fileOf(large);
    for (const char* name : {"b", "c", "d", "e", "f", "g", "h", "i", "j", "k", "l"}) {
        write(std::string(name) + ".channels", bytes);
    }
    const auto sampleSpeaker = [this] {
        Samples samples;
        folder_.sample([](const ChannelTable& table) { return table.group == "Speaker"; }, samples);
        return samples;
    };
    constexpr const char* kFault = "l.channels: the channels of all files take up more than 16777216 bytes";
    EXPECT_THAT(sampleSpeaker().missed, ElementsAre("file:l.channels"));
    EXPECT_THAT(folder_.takeFaults(), ElementsAre(kFault));
    write("a.channels", fileOf(exampleTable()));
    const Samples small = sampleSpeaker();
    EXPECT_EQ(small.blocks.size(), 1U) << "there is room for a small one";
    EXPECT_THAT(small.missed, ElementsAre("file:l.channels"));
    EXPECT_THAT(folder_.takeFaults(), IsEmpty());
    std::filesystem::remove(path_ / "b.channels");
    EXPECT_THAT(sampleSpeaker().missed, IsEmpty());
}

} // namespace
} // namespace vela::platform::hwstats
