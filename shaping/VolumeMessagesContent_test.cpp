// What a volume message holds.
#include "shaping/Shaping_test.h"
#include "shaping/VolumeMessages.h"

#include <clocale>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <utility>

namespace vela {

namespace {

using ::testing::ElementsAre;

/// The message of one stretch of `seconds` whose start held `conditions`.
Dictionary contentOf(std::initializer_list<Dictionary::Initial> conditions, double seconds = 10.0,
                     const Value& process = "com.example.player") {
    const Dictionary start = Dictionary{{"velareporting_timestamp", 0.0}, {"session_output_running", true}};
    const std::vector<StoredMessage> stored =
        storedMessages({start.merging(Dictionary(conditions)),
                        {{"velareporting_timestamp", seconds}, {"session_output_running", false}}});
    const std::vector<Dictionary> output = createVolumeMessages(stored, process, 0.5);
    EXPECT_EQ(output.size(), 1U);
    return output.empty() ? Dictionary() : output.front();
}

std::string volumeBucket(const Value& volume) {
    return textualForm(contentOf({{"NexoSessionVolume", volume}}).find("NexoSessionVolumeBucketed"));
}

std::string timeBucket(double seconds) {
    return textualForm(contentOf({{"NexoSessionVolume", 0.5}}, seconds).find("play_secondsBucketed"));
}

TEST(VolumeMessagesContentTest, WhatWasNeverSaidHasItsInitialValue) {
    EXPECT_EQ(contentOf({{"NexoSessionVolume", 0.5}}), (Dictionary{{"session_selected_format", "unknown"},
                                                                   {"active_devices", "unknown"},
                                                                   {"HostApplicationDisplayID", "com.example.player"},
                                                                   {"NexoSessionVolume", 0.5},
                                                                   {"NexoSessionVolumeBucketed", "0.5"},
                                                                   {"play_seconds", 10.0F},
                                                                   {"spatial-audio-accessory-feature", false},
                                                                   {"spatializationEnabled", false},
                                                                   {"ringerstate", false},
                                                                   {"mChannelsPerFrame", -1},
                                                                   {"play_secondsBucketed", "10"},
                                                                   {"msgidx", 1},
                                                                   {"msgcnt", 1}}));
}

TEST(VolumeMessagesContentTest, WhatWasSaidIsReportedAsItIs) {
    EXPECT_EQ(contentOf({{"NexoSessionVolume", 1},
                         {"session_selected_format", Array{"AAC", 2}},
                         {"active_devices", "Speaker,Receiver"},
                         {"spatial-audio-accessory-feature", 3},
                         {"spatializationEnabled", 1},
                         {"ringerstate", 1.0},
                         {"mChannelsPerFrame", "two"},
                         {"sample_rate", 48000},
                         {"audiotag", "PlaybackStart"}},
                        30.0, 7),
              (Dictionary{{"session_selected_format", Array{"AAC", 2}},
                          {"active_devices", "Speaker,Receiver"},
                          {"HostApplicationDisplayID", 7},
                          {"NexoSessionVolume", 1},
                          {"NexoSessionVolumeBucketed", "1.0"},
                          {"play_seconds", 30.0F},
                          {"spatial-audio-accessory-feature", 3},
                          {"spatializationEnabled", 1},
                          {"ringerstate", 1.0},
                          {"mChannelsPerFrame", "two"},
                          {"play_secondsBucketed", "30"},
                          {"msgidx", 1},
                          {"msgcnt", 1}}));
}

TEST(VolumeMessagesContentTest, TheKeysStandInThisOrder) {
    EXPECT_THAT(keysOf(contentOf({{"mChannelsPerFrame", 2}, {"NexoSessionVolume", 0.5}})),
                ElementsAre("session_selected_format", "active_devices", "HostApplicationDisplayID",
                            "NexoSessionVolume", "NexoSessionVolumeBucketed", "play_seconds",
                            "spatial-audio-accessory-feature", "spatializationEnabled", "ringerstate",
                            "mChannelsPerFrame", "play_secondsBucketed", "msgidx", "msgcnt"));
}

TEST(VolumeMessagesContentTest, ALaterEqualValueOfAnotherKindIsTheOneReported) {
    const std::vector<StoredMessage> stored =
        storedMessages({messageAt(100.0, {{"session_output_running", true}, {"NexoSessionVolume", 1}}),
                        messageAt(110.0, {{"NexoSessionVolume", 1.0}, {"ringerstate", 0}}),
                        messageAt(130.0, {{"session_output_running", false}})});
    const std::vector<Dictionary> output = createVolumeMessages(stored, "com.example.player", 0.5);
    ASSERT_THAT(playSecondsOf(output), ElementsAre(30.0));
    EXPECT_EQ(output[0].find("NexoSessionVolume").kind(), ValueKind::Real);
    EXPECT_EQ(output[0].find("ringerstate").kind(), ValueKind::Integer);
}

TEST(VolumeMessagesContentTest, PlaySecondsIsA32BitFloat) {
    const std::vector<StoredMessage> stored =
        storedMessages({messageAt(100.0, {{"session_output_running", true}, {"NexoSessionVolume", 0.5}}),
                        messageAt(100.6, {{"session_output_running", false}})});
    const std::vector<Dictionary> output = createVolumeMessages(stored, "com.example.player", 0.5);
    ASSERT_EQ(output.size(), 1U);
    EXPECT_EQ(output[0].find("play_seconds").kind(), ValueKind::Real32);
    EXPECT_EQ(output[0].find("play_seconds").real(), static_cast<double>(0.6F));
    EXPECT_EQ(textualForm(output[0].find("play_seconds")), "0.6");
}

TEST(VolumeMessagesContentTest, IndexAndCountAreIntegers) {
    const Dictionary content = contentOf({{"NexoSessionVolume", 0.5}});
    EXPECT_EQ(content.find("msgidx").kind(), ValueKind::Integer);
    EXPECT_EQ(content.find("msgcnt").kind(), ValueKind::Integer);
}

TEST(VolumeMessagesContentTest, EveryVolumeHasItsBucket) {
    const std::vector<std::pair<double, std::string>> buckets = {
        {0, "0.0"},         {0.0625, "0.0625"}, {0.125, "0.125"},   {0.1875, "0.1875"}, {0.25, "0.25"},
        {0.3125, "0.3125"}, {0.375, "0.375"},   {0.4375, "0.4375"}, {0.5, "0.5"},       {0.5625, "0.5625"},
        {0.625, "0.625"},   {0.6875, "0.6875"}, {0.75, "0.75"},     {0.8125, "0.8125"}, {0.875, "0.875"},
        {0.9375, "0.9375"}, {1, "1.0"}};
    for (const auto& [volume, text] : buckets) {
        EXPECT_EQ(volumeBucket(volume), text);
        EXPECT_EQ(volumeBucket(volume + 0.03), text);
        EXPECT_EQ(volumeBucket(volume - 0.03), text);
    }
    EXPECT_EQ(buckets.size(), VelaReportingUtilityBucketNumberToStringVolumes.size());
}

TEST(VolumeMessagesContentTest, BetweenTwoBucketsTheLaterIsTaken) {
    EXPECT_EQ(volumeBucket(0.53125), "0.5625");
    EXPECT_EQ(volumeBucket(0.03125), "0.0625");
    EXPECT_EQ(timeBucket(3.0), "5");
    EXPECT_EQ(timeBucket(7.5), "10");
    EXPECT_EQ(timeBucket(20.0), "30");
}

TEST(VolumeMessagesContentTest, VolumesOutsideTheRangeHaveTheBucketAtItsEnd) {
    EXPECT_EQ(volumeBucket(-3), "0.0");
    EXPECT_EQ(volumeBucket(17.5), "1.0");
    EXPECT_EQ(volumeBucket(true), "1.0");
    EXPECT_EQ(volumeBucket("loud"), "0.0");
}

TEST(VolumeMessagesContentTest, EveryTimeHasItsBucket) {
    EXPECT_EQ(timeBucket(0.75), "1");
    EXPECT_EQ(timeBucket(2.9), "1");
    EXPECT_EQ(timeBucket(5), "5");
    EXPECT_EQ(timeBucket(9), "10");
    EXPECT_EQ(timeBucket(44), "30");
    EXPECT_EQ(timeBucket(100), "60");
    EXPECT_EQ(timeBucket(1000), "300");
    EXPECT_EQ(timeBucket(1100), "1800");
    EXPECT_EQ(timeBucket(3000), "3600");
    EXPECT_EQ(timeBucket(7200), "7200");
    EXPECT_EQ(timeBucket(50000), "18000");
}

TEST(VolumeMessagesContentTest, TheTimeBucketIsOfTheExactTime) {
    // As a 32-bit float this is 7.5, which would be nearer to neither.
    EXPECT_EQ(timeBucket(7.4999999999), "5");
    EXPECT_EQ(contentOf({{"NexoSessionVolume", 0.5}}, 7.4999999999).find("play_seconds").real(), 7.5);
}

TEST(VolumeMessagesContentTest, ATimeBelowHalfASecondHasTheBucketZero) {
    const std::vector<StoredMessage> stored =
        storedMessages({messageAt(0.0, {{"session_output_running", true}, {"NexoSessionVolume", 0.5}}),
                        messageAt(0.25, {{"session_output_running", false}})});
    const std::vector<Dictionary> output = createVolumeMessages(stored, "com.example.player", 0.0);
    ASSERT_EQ(output.size(), 1U);
    EXPECT_EQ(output[0].find("play_secondsBucketed").text(), "0");
}

TEST(VolumeMessagesContentTest, TheLocaleDoesNotMatter) {
    const std::string before = std::setlocale(LC_ALL, nullptr);
    bool changed = false;
    for (const char* locale : {"de_DE.UTF-8", "fr_FR.UTF-8", "de_DE", "fr_FR"}) {
        changed = changed || std::setlocale(LC_ALL, locale) != nullptr;
    }
    EXPECT_EQ(volumeBucket(0.0625), "0.0625");
    EXPECT_EQ(timeBucket(18000), "18000");
    std::setlocale(LC_ALL, before.c_str());
    if (!changed) {
        GTEST_SKIP() << "no locale with a decimal comma is installed; tried in the one that is in force";
    }
}

} // namespace

} // namespace vela
