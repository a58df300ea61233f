// Which changes of conditions end a stretch, and how each is compared.
#include "shaping/Shaping_test.h"
#include "shaping/VolumeMessages.h"

#include <cmath>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>

namespace vela {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr const char* kFormat = "session_selected_format";
constexpr const char* kDevices = "active_devices";
constexpr const char* kSpatialization = "spatializationEnabled";
constexpr const char* kRinger = "ringerstate";
constexpr const char* kVolume = "NexoSessionVolume";

std::vector<Dictionary> create(const std::vector<Dictionary>& messages) {
    return createVolumeMessages(storedMessages(messages), "com.example.player", 0.5);
}

/// Whether `after` ends a stretch that runs with `before` under the same key.
bool isChange(const char* key, const Value& before, const Value& after) {
    const std::vector<Dictionary> output =
        create({messageAt(100.0, {{"session_output_running", true}, {kVolume, 0.5}, {key, before}}),
                messageAt(110.0, {{key, after}}), messageAt(130.0, {{"session_output_running", false}})});
    const bool two = output.size() == 2;
    if (two) {
        EXPECT_THAT(playSecondsOf(output), ElementsAre(10.0, 20.0));
    } else {
        EXPECT_THAT(playSecondsOf(output), ElementsAre(30.0));
    }
    return two;
}

/// Whether `first`, said while output runs and never before, ends a stretch.
bool isChangeAtFirst(const char* key, const Value& first) {
    return create({messageAt(100.0, {{"session_output_running", true}}), messageAt(105.0, {{kVolume, 0.5}}),
                   messageAt(110.0, {{key, first}}), messageAt(130.0, {{"session_output_running", false}})})
               .size() == 2;
}

TEST(VolumeMessagesConditionsTest, FormatAndDevicesEndAStretchWhenTheirTextDiffers) {
    for (const char* key : {kFormat, kDevices}) {
        EXPECT_FALSE(isChange(key, "AAC, 2 ch, 48000 Hz", "AAC, 2 ch, 48000 Hz")) << key;
        EXPECT_TRUE(isChange(key, "AAC", "aac")) << key;
        EXPECT_TRUE(isChange(key, "AAC", "")) << key;
        EXPECT_FALSE(isChange(key, "", "")) << key;
    }
}

TEST(VolumeMessagesConditionsTest, FormatAndDevicesOfOtherKindsAreComparedByTheirTextualForm) {
    for (const char* key : {kFormat, kDevices}) {
        EXPECT_FALSE(isChange(key, Array{"Speaker", "Receiver"}, Array{"Speaker", "Receiver"})) << key;
        EXPECT_TRUE(isChange(key, Array{"Speaker", "Receiver"}, Array{"Receiver", "Speaker"})) << key;
        EXPECT_TRUE(isChange(key, "Speaker", Array{"Speaker"})) << key;
        EXPECT_FALSE(isChange(key, 48000, "48000")) << key;
        EXPECT_FALSE(isChange(key, true, 1)) << key;
    }
}

TEST(VolumeMessagesConditionsTest, TheFirstFormatOrDeviceWhileRunningDiffersFromUnknown) {
    for (const char* key : {kFormat, kDevices}) {
        EXPECT_TRUE(isChangeAtFirst(key, "AAC")) << key;
        EXPECT_FALSE(isChangeAtFirst(key, "unknown")) << key;
    }
    const std::vector<Dictionary> output =
        create({messageAt(100.0, {{"session_output_running", true}, {kVolume, 0.5}}),
                messageAt(110.0, {{kFormat, "AAC"}}), messageAt(130.0, {{"session_output_running", false}})});
    ASSERT_EQ(output.size(), 2U);
    EXPECT_EQ(output[0].find(kFormat).text(), "unknown");
    EXPECT_EQ(output[1].find(kFormat).text(), "AAC");
}

TEST(VolumeMessagesConditionsTest, SpatializationAndRingerEndAStretchWhenTheirNumbersDiffer) {
    for (const char* key : {kSpatialization, kRinger}) {
        EXPECT_TRUE(isChange(key, false, true)) << key;
        EXPECT_TRUE(isChange(key, 1, 0)) << key;
        EXPECT_TRUE(isChange(key, true, 2)) << key;
        EXPECT_TRUE(isChange(key, 0.0, 0.25)) << key;
        EXPECT_TRUE(isChange(key, std::int64_t{9007199254740993}, 9007199254740992.0)) << key;
    }
}

TEST(VolumeMessagesConditionsTest, SpatializationAndRingerOfOtherKindsAreTheSameNumber) {
    for (const char* key : {kSpatialization, kRinger}) {
        for (const Value& before : {Value(true), Value(1), Value(1.0), Value(1.0F)}) {
            for (const Value& after : {Value(true), Value(1), Value(1.0), Value(1.0F)}) {
                EXPECT_FALSE(isChange(key, before, after)) << key;
            }
        }
        EXPECT_FALSE(isChange(key, false, 0)) << key;
        EXPECT_FALSE(isChange(key, 0, -0.0)) << key;
    }
}

TEST(VolumeMessagesConditionsTest, SpatializationAndRingerThatAreNoNumbersAreZero) {
    for (const char* key : {kSpatialization, kRinger}) {
        EXPECT_FALSE(isChange(key, "on", "off")) << key;
        EXPECT_FALSE(isChange(key, false, "on")) << key;
        EXPECT_TRUE(isChange(key, true, "on")) << key;
        EXPECT_TRUE(isChange(key, "1", 1)) << key;
    }
}

TEST(VolumeMessagesConditionsTest, SpatializationAndRingerAreFalseAtFirst) {
    for (const char* key : {kSpatialization, kRinger}) {
        EXPECT_TRUE(isChangeAtFirst(key, true)) << key;
        EXPECT_FALSE(isChangeAtFirst(key, false)) << key;
        EXPECT_FALSE(isChangeAtFirst(key, 0)) << key;
    }
}

TEST(VolumeMessagesConditionsTest, TheFirstVolumeEndsNothing) {
    const std::vector<Dictionary> output =
        create({messageAt(100.0, {{"session_output_running", true}}), messageAt(110.0, {{kVolume, 0.25}}),
                messageAt(130.0, {{"session_output_running", false}})});
    EXPECT_THAT(playSecondsOf(output), ElementsAre(30.0));
    EXPECT_EQ(output[0].find(kVolume).doubleValue(), 0.25);
}

TEST(VolumeMessagesConditionsTest, VolumesAreComparedByNumber) {
    EXPECT_FALSE(isChange(kVolume, 1, 1.0));
    EXPECT_FALSE(isChange(kVolume, 0.5F, 0.5));
    EXPECT_FALSE(isChange(kVolume, 0.1, 0.1));
    EXPECT_TRUE(isChange(kVolume, 0.1F, 0.1));
    EXPECT_TRUE(isChange(kVolume, 0.5, 0.5000001));
    EXPECT_TRUE(isChange(kVolume, 0, 1));
}

TEST(VolumeMessagesConditionsTest, AVolumeThatIsABooleanOrNoNumberIsAnotherValue) {
    EXPECT_TRUE(isChange(kVolume, 1, true));
    EXPECT_TRUE(isChange(kVolume, false, 0.0));
    EXPECT_FALSE(isChange(kVolume, true, true));
    EXPECT_TRUE(isChange(kVolume, 0.5, "0.5"));
    EXPECT_FALSE(isChange(kVolume, "0.5", "0.5"));
    EXPECT_TRUE(isChange(kVolume, "half", "full"));
}

TEST(VolumeMessagesConditionsTest, WhatIsNotANumberIsTheSameAsBefore) {
    const double notANumber = std::numeric_limits<double>::quiet_NaN();
    EXPECT_FALSE(isChange(kVolume, notANumber, notANumber));
    EXPECT_FALSE(isChange(kRinger, notANumber, notANumber));
    EXPECT_TRUE(isChange(kVolume, notANumber, 0.5));
    EXPECT_TRUE(isChange(kRinger, notANumber, 0));
}

TEST(VolumeMessagesConditionsTest, TheAccessoryFeatureAndTheChannelsEndNothingButAreReported) {
    for (const char* key : {"spatial-audio-accessory-feature", "mChannelsPerFrame"}) {
        const std::vector<Dictionary> output =
            create({messageAt(100.0, {{"session_output_running", true}, {kVolume, 0.5}, {key, 1}}),
                    messageAt(110.0, {{key, 2}}), messageAt(120.0, {{key, 6}}),
                    messageAt(130.0, {{"session_output_running", false}})});
        EXPECT_THAT(playSecondsOf(output), ElementsAre(30.0)) << key;
        EXPECT_EQ(output[0].find(key), Value(6).ref());
    }
}

TEST(VolumeMessagesConditionsTest, OtherKeysEndNothing) {
    EXPECT_FALSE(isChange("HostApplicationDisplayID", "com.example.player", "com.example.other"));
    EXPECT_FALSE(isChange("sample_rate", 44100, 48000));
    EXPECT_FALSE(isChange("audiotag", "PlaybackStart", "PlaybackStop"));
}

TEST(VolumeMessagesConditionsTest, AChangeWhileOutputIsNotRunningEndsNothing) {
    const std::vector<Dictionary::Initial> changes = {
        {kFormat, "AAC"}, {kDevices, "Speaker"}, {kSpatialization, true}, {kRinger, true}, {kVolume, 0.25}};
    for (const Dictionary::Initial& change : changes) {
        EXPECT_THAT(playSecondsOf(create({messageAt(10.0, {{kVolume, 0.5}}), messageAt(20.0, {change}),
                                          messageAt(100.0, {{"session_output_running", true}}),
                                          messageAt(110.0, {{"session_output_running", false}}),
                                          messageAt(120.0, {change}), messageAt(125.0, {{kVolume, 0.75}})})),
                    ElementsAre(10.0))
            << change.key;
    }
    EXPECT_THAT(create({messageAt(10.0, {{kVolume, 0.5}, {kFormat, "AAC"}}),
                        messageAt(20.0, {{kVolume, 0.25}, {kFormat, "PCM"}})}),
                IsEmpty());
}

TEST(VolumeMessagesConditionsTest, SeveralChangesInOneMessageEndOneStretch) {
    EXPECT_THAT(playSecondsOf(create({messageAt(100.0, {{"session_output_running", true}, {kVolume, 0.5}}),
                                      messageAt(110.0, {{kVolume, 0.25}, {kFormat, "AAC"}, {kRinger, true}}),
                                      messageAt(130.0, {{"session_output_running", false}})})),
                ElementsAre(10.0, 20.0));
}

} // namespace

} // namespace vela
