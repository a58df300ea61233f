#include "platform/hwstats/ChannelFileFormat.h"
#include "platform/hwstats/ChannelFileNames.h"
#include "platform/hwstats/ChannelTables_test.h"
#include "testing/TemporaryFolder.h"

#include <filesystem>
#include <gtest/gtest.h>
#include <limits>
#include <sys/stat.h>
#include <unistd.h>

namespace vela::platform::hwstats {
namespace {

std::string refusalOf(const ChannelTable& table) {
    const auto description = encodeDescription(table);
    return description ? "" : description.failure().description;
}

std::string refusalOf(const std::string& description, std::uint32_t channels) {
    const auto table = decodeDescription(description, channels);
    return table ? "" : table.failure().description;
}

ChannelTable tableOf(ChannelDescription channel) { return {"d", "g", std::nullopt, {std::move(channel)}}; }

constexpr const char* kNoHistogram = "a histogram has 1 to 512 buckets with rising bounds";
constexpr const char* kStrange = "a channel is of no known format or has parts that do not suit it";
constexpr const char* kCut = "its description ends too early";

TEST(ChannelFileFormatTest, ADescriptionIsReadBack) {
    const ChannelTable table = exampleTable();
    const std::string description = *encodeDescription(table);
    const auto back = decodeDescription(description, 3);
    ASSERT_TRUE(static_cast<bool>(back));
    EXPECT_EQ(**back, table);
}

TEST(ChannelFileFormatTest, AbsentPartsStayAbsent) {
    const ChannelTable table{std::nullopt, std::nullopt, "MCA", {{HwStatsFormat::Simple, "n", std::nullopt, {}, {}}}};
    EXPECT_EQ(**decodeDescription(*encodeDescription(table), 1), table);
}

TEST(ChannelFileFormatTest, TheLayoutIsThatOfTheDocument) {
    const std::string description = *encodeDescription(exampleTable());
    // "Driver", "Speaker", "Stats"; frames; busy in us with three bounds; stream with two states.
    EXPECT_EQ(description.size(),
              8U + 9U + 7U + (1U + 8U + 2U + 2U) + (1U + 6U + 4U + 2U + 24U) + (1U + 8U + 2U + 2U + 6U + 9U));
    EXPECT_EQ(description.substr(0, 8), std::string("\x06\x00"
                                                    "Driver",
                                                    8));
    EXPECT_EQ(valuesOffset(115), 192U);
    EXPECT_EQ(valuesOffset(64), 128U);
    const ChannelTable table = exampleTable();
    EXPECT_EQ(blockBytes(table.channels[0]), 64U);  // 16 + 2 x 1 word
    EXPECT_EQ(blockBytes(table.channels[1]), 128U); // 16 + 2 x 4 words
    EXPECT_EQ(blockBytes(table.channels[2]), 128U); // 16 + 2 x 6 words
    EXPECT_EQ(valuesBytes(table), 320U);
}

TEST(ChannelFileFormatTest, ANameThatCannotBeIsRefusedInWords) {
    const auto named = [](const std::string& name) {
        return refusalOf(tableOf({HwStatsFormat::Simple, name, {}, {}, {}}));
    };
    EXPECT_EQ(named(""), "a channel's name is empty");
    EXPECT_EQ(named(std::string(256, 'x')), "");
    EXPECT_EQ(named(std::string(257, 'x')), "a channel's name has 257 bytes, more than 256");
    EXPECT_EQ(named("line\nend"), "a channel's name has control characters");
    EXPECT_EQ(named("\x7F"), "a channel's name has control characters");
    EXPECT_EQ(named("\xFF"), "a channel's name is no UTF-8");
}

TEST(ChannelFileFormatTest, AUnitThatCannotBeIsRefusedInWords) {
    const auto measured = [](const std::string& unit) {
        return refusalOf(tableOf({HwStatsFormat::Simple, "x", unit, {}, {}}));
    };
    EXPECT_EQ(measured(""), "");
    EXPECT_EQ(measured(std::string(300, 'x')), "a channel's unit has 300 bytes, more than 256");
    EXPECT_EQ(measured("\t"), "a channel's unit has control characters");
    EXPECT_EQ(measured("\xC0"), "a channel's unit is no UTF-8");
}

TEST(ChannelFileFormatTest, ADriverThatCannotBeIsRefusedInWords) {
    const auto channels = exampleTable().channels;
    EXPECT_EQ(refusalOf(ChannelTable{"", "g", {}, channels}), "the driver's name is empty");
    EXPECT_EQ(refusalOf(ChannelTable{std::string(257, 'x'), "g", {}, channels}),
              "the driver's name has 257 bytes, more than 256");
    EXPECT_EQ(refusalOf(ChannelTable{"d", "", {}, channels}), "the group is empty");
    EXPECT_EQ(refusalOf(ChannelTable{"d", "g", "\n", channels}), "the subgroup has control characters");
    EXPECT_EQ(refusalOf(ChannelTable{"d", "g", {}, {}}), "a driver has 1 to 4096 channels");
}

TEST(ChannelFileFormatTest, PartsThatCannotBeAreRefusedInWords) {
    EXPECT_EQ(refusalOf(tableOf({HwStatsFormat::Simple, "x", {}, {1, 2}, {}})),
              "a counter has neither buckets nor states");
    EXPECT_EQ(refusalOf(tableOf({HwStatsFormat::Histogram, "x", {}, {}, {}})), kNoHistogram);
    EXPECT_EQ(refusalOf(tableOf({HwStatsFormat::Histogram, "x", {}, {1}, {}})), kNoHistogram);
    EXPECT_EQ(refusalOf(tableOf({HwStatsFormat::Histogram, "x", {}, {1, 1}, {}})), kNoHistogram);
    EXPECT_EQ(refusalOf(tableOf({HwStatsFormat::Histogram, "x", {}, {2, 1}, {}})), kNoHistogram);
    EXPECT_EQ(refusalOf(tableOf({HwStatsFormat::Histogram, "x", {}, {1, 2}, {"a"}})), kStrange);
    EXPECT_EQ(refusalOf(tableOf({HwStatsFormat::State, "x", {}, {}, {}})), "a state channel has 1 to 512 states");
    EXPECT_EQ(refusalOf(tableOf({HwStatsFormat::State, "x", {}, {}, std::vector<std::string>(513, "s")})),
              "a state channel has 1 to 512 states");
    EXPECT_EQ(refusalOf(tableOf({HwStatsFormat::State, "x", {}, {}, {"a", ""}})), "a state's name is empty");
    EXPECT_EQ(refusalOf(tableOf({HwStatsFormat::State, "x", {}, {}, {"a", std::string(257, 's')}})),
              "a state's name has 257 bytes, more than 256");
    EXPECT_EQ(refusalOf(tableOf({HwStatsFormat::State, "x", {}, {1, 2}, {"a"}})), kStrange);
    EXPECT_EQ(refusalOf(tableOf({HwStatsFormat::SimpleArray, "x", {}, {}, {}})), kStrange);
}

TEST(ChannelFileFormatTest, AFileThatWouldBeTooLargeIsRefused) {
    ChannelDescription histogram{HwStatsFormat::Histogram, "h", {}, {}, {}};
    for (std::int64_t bound = 0; bound <= 512; ++bound) {
        histogram.bounds.push_back(bound);
    }
    const ChannelTable table{"d", "g", std::nullopt, std::vector<ChannelDescription>(400, histogram)};
    EXPECT_EQ(refusalOf(table), "the channels need more than 4194304 bytes");
}

TEST(ChannelFileFormatTest, ADescriptionEndsWhereItsChannelsEnd) {
    const std::string description = *encodeDescription(exampleTable());
    EXPECT_EQ(refusalOf(description, 3), "");
    EXPECT_EQ(refusalOf(description, 2), "its description is too long");
    EXPECT_EQ(refusalOf(description, 4), kCut);
    EXPECT_EQ(refusalOf(description + "x", 3), "its description is too long");
    for (std::size_t size = 0; size < description.size(); ++size) {
        EXPECT_EQ(refusalOf(description.substr(0, size), 3), kCut) << size;
    }
}

TEST(ChannelFileFormatTest, CountsThatAreNotThereCostNothing) {
    std::string description = *encodeDescription(tableOf({HwStatsFormat::Histogram, "x", {}, {1, 2}, {}}));
    putAt(description, description.size() - 18, std::uint16_t{0xFFFF});
    EXPECT_EQ(refusalOf(description, 1), kCut);
}

TEST(ChannelFileFormatTest, AWrongChannelIsNamedByItsNumber) {
    std::string description = *encodeDescription(exampleTable());
    description[description.find("busy")] = '\xFF';
    EXPECT_EQ(refusalOf(description, 3), "channel 1: a channel's name is no UTF-8");
}

TEST(ChannelFileFormatTest, AHeaderIsChecked) {
    const auto refusal = [](auto change) {
        ChannelFileHeader header;
        header.fileBytes = 256;
        header.channelCount = 1;
        header.descriptionBytes = 60;
        change(header);
        const auto checked = checkHeader(header, 256);
        return checked ? std::string() : checked.failure().description;
    };
    EXPECT_EQ(refusal([](auto&) {}), "");
    EXPECT_EQ(refusal([](auto& header) { header.magic[0] = 'V'; }), "it is no channel file");
    EXPECT_EQ(refusal([](auto& header) { header.byteOrder = 0x04030201; }),
              "it comes from a machine of another byte order");
    EXPECT_EQ(refusal([](auto& header) { header.version = 2; }), "its version is 2, not 1");
    EXPECT_EQ(refusal([](auto& header) { header.fileBytes = 257; }), "it is shorter than it says");
    EXPECT_EQ(refusal([](auto& header) { header.fileBytes = kMostFileBytes + 1; }), "it is larger than 4194304 bytes");
    EXPECT_EQ(refusal([](auto& header) { header.channelCount = 0; }), "it has 0 channels, not 1 to 4096");
    EXPECT_EQ(refusal([](auto& header) { header.channelCount = 4097; }), "it has 4097 channels, not 1 to 4096");
    EXPECT_EQ(refusal([](auto& header) { header.descriptionBytes = 129; }),
              "its description leaves no room for values");
    EXPECT_EQ(refusal([](auto& header) { header.descriptionBytes = std::numeric_limits<std::uint32_t>::max(); }),
              "its description leaves no room for values");
}

TEST(ChannelFileNamesTest, AFileIsNamedByItsPublisherDriverAndGroups) {
    EXPECT_EQ(channelFileStem("player", exampleTable()), "player-Driver-Speaker-Stats");
    EXPECT_EQ(channelFileStem("a/b-c", {"D r", std::nullopt, "MCA", {}}), "a%2Fb%2Dc-D%20r--MCA");
    EXPECT_EQ(channelFileStem(".hidden", {"d", "g", {}, {}}), "%2Ehidden-d-g-");
    EXPECT_EQ(channelFolder("/run/vela"), "/run/vela/hwstats");
}

TEST(ChannelFileNamesTest, LongNamesAreCutAndStayApart) {
    const std::string one = channelFileStem("p", {std::string(250, 'x') + "1", "g", {}, {}});
    const std::string other = channelFileStem("p", {std::string(250, 'x') + "2", "g", {}, {}});
    EXPECT_EQ(one.size(), 200U);
    EXPECT_EQ(other.size(), 200U);
    EXPECT_NE(one, other);
}

class ChannelFolderPlaceTest : public ::testing::Test {
protected:
    const testing::TemporaryFolder folder_;
};

TEST_F(ChannelFolderPlaceTest, TheEnvironmentsFolderComesFirst) {
    EXPECT_EQ(makeChannelFolder({folder_ / "own", folder_ / "home", folder_ / "system"}), folder_ / "own/hwstats");
    EXPECT_TRUE(std::filesystem::is_directory(folder_ / "own/hwstats"));
}

TEST_F(ChannelFolderPlaceTest, TheUsersServiceComesBeforeTheSystems) {
    std::filesystem::create_directories(folder_ / "system");
    EXPECT_EQ(makeChannelFolder({"", folder_ / "home", folder_ / "system"}), folder_ / "system/hwstats");
    std::filesystem::create_directories(folder_ / "home/vela");
    EXPECT_EQ(makeChannelFolder({"", folder_ / "home", folder_ / "system"}), folder_ / "home/vela/hwstats");
}

TEST_F(ChannelFolderPlaceTest, WithoutAnyServiceTheUsersFolderIsMade) {
    EXPECT_EQ(makeChannelFolder({"", folder_ / "home", folder_ / "system"}), folder_ / "home/vela/hwstats");
    EXPECT_EQ(makeChannelFolder({"", "", folder_ / "system"}), folder_ / "system/hwstats");
}

TEST_F(ChannelFolderPlaceTest, AFileInTheWayIsAnError) {
    std::filesystem::create_directories(folder_ / "own");
    ASSERT_EQ(mkfifo((folder_ / "own/hwstats").c_str(), 0600), 0);
    EXPECT_EQ(makeChannelFolder({folder_ / "own", "", ""}), "");
    EXPECT_EQ(errno, ENOTDIR);
}

} // namespace
} // namespace vela::platform::hwstats
