#include "reporters/pipewire/StatisticsChannels.h"
#include "testing/TemporaryFolder.h"

#include <cstring>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <iterator>

namespace vela::reporter {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class StatisticsChannelsTest : public ::testing::Test {
protected:
    /// "speaker" for a driver that publishes, "speaker ended" for one that has ended; streams apart.
    std::vector<std::string> sinks() const {
        std::vector<std::string> found;
        for (const auto& entry : std::filesystem::directory_iterator(folder.path())) {
            const std::string name = entry.path().filename();
            const std::size_t end = name.find("-Speaker-");
            if (end != std::string::npos) {
                const std::size_t begin = name.rfind('-', end - 1) + 1;
                found.push_back(name.substr(begin, end - begin) + (isClosed(entry.path()) ? " ended" : ""));
            }
        }
        std::ranges::sort(found);
        return found;
    }

    const vela::testing::TemporaryFolder folder;
    std::vector<std::string> complaints;
    StatisticsChannels channels{folder.path(), [this](const std::string& reason) { complaints.push_back(reason); }};

private:
    static bool isClosed(const std::filesystem::path& path) {
        constexpr std::size_t kClosed = 52; // of the file's layout
        std::ifstream file(path, std::ios::binary);
        const std::string bytes((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
        std::uint32_t closed = 0;
        EXPECT_GT(bytes.size(), kClosed + sizeof(closed));
        std::memcpy(&closed, bytes.data() + kClosed, sizeof(closed));
        return closed != 0;
    }
};

TEST_F(StatisticsChannelsTest, ASinkHasChannelsAsLongAsItIsThere) {
    EXPECT_THAT(sinks(), IsEmpty());
    channels.addSink("speaker");
    EXPECT_THAT(sinks(), ElementsAre("speaker"));
    channels.removeSink("speaker");
    EXPECT_THAT(sinks(), ElementsAre("speaker ended"));
    EXPECT_THAT(complaints, IsEmpty());
}

TEST_F(StatisticsChannelsTest, SinksOfOneNameShareTheirChannels) {
    channels.addSink("speaker");
    channels.addSink("speaker");
    EXPECT_THAT(sinks(), ElementsAre("speaker"));
    channels.removeSink("speaker");
    EXPECT_THAT(sinks(), ElementsAre("speaker")) << "the other one is still there";
    channels.removeSink("speaker");
    EXPECT_THAT(sinks(), ElementsAre("speaker ended"));
}

TEST_F(StatisticsChannelsTest, ASinkThatWasNeverAddedIsRemovedWithoutEffect) {
    channels.removeSink("speaker");
    channels.addSink("speaker");
    EXPECT_THAT(sinks(), ElementsAre("speaker"));
}

TEST_F(StatisticsChannelsTest, SinksBeyondTheBoundHaveNoChannels) {
    for (std::size_t i = 0; i < StatisticsChannels::kMostSinks; ++i) {
        channels.addSink("sink" + std::to_string(100 + i));
    }
    channels.addSink("twin");
    channels.addSink("twin");
    EXPECT_EQ(sinks().size(), 64);
    channels.removeSink("sink100");
    channels.addSink("other");
    const std::vector<std::string> names = sinks();
    EXPECT_EQ(names.size(), 65);
    EXPECT_EQ(names.front(), "other");
    EXPECT_EQ(names[1], "sink100 ended");
    channels.removeSink("twin");
    channels.sinkState("twin", 0);
    channels.removeSink("other");
    EXPECT_EQ(sinks().front(), "other ended");
}

} // namespace
} // namespace vela::reporter
