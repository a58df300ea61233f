#include "reporters/pipewire/Pods.h"

#include <array>
#include <gtest/gtest.h>
#include <pipewire/keys.h>
#include <spa/param/audio/format-utils.h>
#include <spa/param/profiler.h>
#include <spa/param/props.h>
#include <spa/pod/builder.h>
#include <spa/utils/dict.h>

namespace vela::reporter {
namespace {

class PodsTest : public ::testing::Test {
protected:
    spa_pod_frame openObject(std::uint32_t type, std::uint32_t id) {
        spa_pod_frame frame{};
        spa_pod_builder_push_object(&builder, &frame, type, id);
        return frame;
    }
    const spa_pod* close(spa_pod_frame& frame) {
        return static_cast<const spa_pod*>(spa_pod_builder_pop(&builder, &frame));
    }
    void property(std::uint32_t key) { spa_pod_builder_prop(&builder, key, 0); }
    void block(std::uint32_t key, std::int32_t id, const char* name, std::int64_t signal, std::int32_t status) {
        property(key);
        spa_pod_frame frame{};
        spa_pod_builder_push_struct(&builder, &frame);
        spa_pod_builder_int(&builder, id);
        spa_pod_builder_string(&builder, name);
        spa_pod_builder_long(&builder, signal - 100);
        spa_pod_builder_long(&builder, signal);
        spa_pod_builder_long(&builder, signal + 10);
        spa_pod_builder_long(&builder, signal + 30);
        spa_pod_builder_int(&builder, status);
        spa_pod_builder_fraction(&builder, 1024, 48000);
        spa_pod_builder_pop(&builder, &frame);
    }
    void cycle(std::int64_t signal) {
        spa_pod_frame object = openObject(SPA_TYPE_OBJECT_Profiler, 0);
        property(SPA_PROFILER_info);
        spa_pod_frame info{};
        spa_pod_builder_push_struct(&builder, &info);
        spa_pod_builder_long(&builder, 1);
        for (int i = 0; i < 3; ++i) {
            spa_pod_builder_float(&builder, 0.5F);
        }
        spa_pod_builder_int(&builder, 4);
        spa_pod_builder_pop(&builder, &info);
        property(SPA_PROFILER_clock);
        spa_pod_frame clock{};
        spa_pod_builder_push_struct(&builder, &clock);
        spa_pod_builder_int(&builder, 0);
        spa_pod_builder_int(&builder, 1);
        spa_pod_builder_string(&builder, "clock");
        spa_pod_builder_long(&builder, signal);
        spa_pod_builder_fraction(&builder, 1, 48000);
        spa_pod_builder_long(&builder, 99);
        spa_pod_builder_long(&builder, 1024);
        spa_pod_builder_pop(&builder, &clock);
        block(SPA_PROFILER_driverBlock, 30, "speaker", signal, 3);
        block(SPA_PROFILER_followerBlock, 50, "player", signal, 1);
        close(object);
    }

    static constexpr std::uint32_t kRoom = 4096;

    alignas(8) std::array<std::uint8_t, kRoom> room{};
    spa_pod_builder builder = [this] {
        spa_pod_builder made{};
        spa_pod_builder_init(&made, room.data(), kRoom);
        return made;
    }();
};

TEST_F(PodsTest, VolumeHasChannelsAndMute) {
    spa_pod_frame frame = openObject(SPA_TYPE_OBJECT_Props, SPA_PARAM_Props);
    property(SPA_PROP_volume);
    spa_pod_builder_float(&builder, 0.5F);
    property(SPA_PROP_mute);
    spa_pod_builder_bool(&builder, true);
    property(SPA_PROP_channelVolumes);
    const std::array<float, 2> channels{0.25F, 0.75F};
    spa_pod_builder_array(&builder, sizeof(float), SPA_TYPE_Float, channels.size(), channels.data());
    EXPECT_EQ(readVolume(close(frame)), (Volume{0.5, {0.25, 0.75}, true}));
}

TEST_F(PodsTest, ParametersThatSayNothingOfVolumeAreNone) {
    spa_pod_frame frame = openObject(SPA_TYPE_OBJECT_Props, SPA_PARAM_Props);
    EXPECT_EQ(readVolume(close(frame)), std::nullopt);
    EXPECT_EQ(readVolume(nullptr), std::nullopt);
    frame = openObject(SPA_TYPE_OBJECT_Format, SPA_PARAM_Format);
    EXPECT_EQ(readVolume(close(frame)), std::nullopt);
}

TEST_F(PodsTest, FormatsArePlainOrChoicesOfOne) {
    spa_audio_info_raw info{};
    info.format = SPA_AUDIO_FORMAT_S16_LE;
    info.rate = 44100;
    info.channels = 1;
    EXPECT_EQ(readFormat(spa_format_audio_raw_build(&builder, SPA_PARAM_Format, &info)), (Format{"S16LE", 44100, 1}));

    spa_pod_frame frame = openObject(SPA_TYPE_OBJECT_Format, SPA_PARAM_Format);
    const auto choice = [this](std::uint32_t key, bool isID, std::int32_t value) {
        property(key);
        spa_pod_frame inner{};
        spa_pod_builder_push_choice(&builder, &inner, SPA_CHOICE_None, 0);
        if (isID) {
            spa_pod_builder_id(&builder, static_cast<std::uint32_t>(value));
        } else {
            spa_pod_builder_int(&builder, value);
        }
        spa_pod_builder_pop(&builder, &inner);
    };
    choice(SPA_FORMAT_AUDIO_format, true, SPA_AUDIO_FORMAT_F32_LE);
    choice(SPA_FORMAT_AUDIO_rate, false, 48000);
    choice(SPA_FORMAT_AUDIO_channels, false, 2);
    EXPECT_EQ(readFormat(close(frame)), (Format{"F32LE", 48000, 2}));
}

TEST_F(PodsTest, FormatsThatAreNotSettledAreNone) {
    spa_pod_frame frame = openObject(SPA_TYPE_OBJECT_Format, SPA_PARAM_EnumFormat);
    property(SPA_FORMAT_AUDIO_format);
    spa_pod_builder_id(&builder, SPA_AUDIO_FORMAT_F32_LE);
    property(SPA_FORMAT_AUDIO_channels);
    spa_pod_builder_int(&builder, 2);
    property(SPA_FORMAT_AUDIO_rate);
    spa_pod_frame inner{};
    spa_pod_builder_push_choice(&builder, &inner, SPA_CHOICE_Range, 0);
    for (const int rate : {48000, 8000, 96000}) {
        spa_pod_builder_int(&builder, rate);
    }
    spa_pod_builder_pop(&builder, &inner);
    EXPECT_EQ(readFormat(close(frame)), std::nullopt);
    EXPECT_EQ(readFormat(nullptr), std::nullopt);
}

TEST_F(PodsTest, CyclesHaveDriverAndFollowers) {
    spa_pod_frame batch{};
    spa_pod_builder_push_struct(&builder, &batch);
    cycle(1000);
    cycle(2000);
    const std::vector<Cycle> cycles = readCycles(close(batch));
    ASSERT_EQ(cycles.size(), 2);
    const Cycle& second = cycles[1];
    EXPECT_EQ(second.xruns, 4);
    EXPECT_EQ(second.frames, 1024);
    EXPECT_EQ(second.driver.id, 30);
    EXPECT_EQ(second.driver.name, "speaker");
    EXPECT_EQ(second.driver.signal, 2000);
    EXPECT_EQ(second.driver.awake, 2010);
    EXPECT_EQ(second.driver.finish, 2030);
    EXPECT_EQ(second.driver.status, 3);
    ASSERT_EQ(second.followers.size(), 1);
    EXPECT_EQ(second.followers[0].name, "player");
    EXPECT_EQ(second.followers[0].status, 1);
}

TEST_F(PodsTest, WhatIsNoBatchHasNoCycles) {
    EXPECT_TRUE(readCycles(nullptr).empty());
    spa_pod_frame object = openObject(SPA_TYPE_OBJECT_Props, 0);
    EXPECT_TRUE(readCycles(close(object)).empty());
    spa_pod_frame batch{};
    spa_pod_builder_push_struct(&builder, &batch);
    spa_pod_builder_int(&builder, 3);
    spa_pod_frame empty = openObject(SPA_TYPE_OBJECT_Profiler, 0);
    close(empty);
    EXPECT_TRUE(readCycles(close(batch)).empty());
}

TEST_F(PodsTest, PropertiesOfNodesAndLinks) {
    const std::array<spa_dict_item, 6> items{{{PW_KEY_OBJECT_SERIAL, "77"},
                                              {PW_KEY_MEDIA_CLASS, "Stream/Output/Audio"},
                                              {PW_KEY_NODE_NAME, "player"},
                                              {PW_KEY_CLIENT_ID, "20"},
                                              {PW_KEY_LINK_OUTPUT_NODE, "50"},
                                              {PW_KEY_LINK_INPUT_NODE, "x"}}};
    const spa_dict dictionary{0, items.size(), items.data()};
    const NodeProperties node = readNodeProperties(&dictionary);
    EXPECT_EQ(node.serial, 77);
    EXPECT_EQ(node.mediaClass, "Stream/Output/Audio");
    EXPECT_EQ(node.name, "player");
    EXPECT_EQ(node.client, 20);
    EXPECT_EQ(node.role, "");
    EXPECT_FALSE(readLink(&dictionary));
    EXPECT_EQ(readNodeProperties(nullptr), NodeProperties{});
}

} // namespace
} // namespace vela::reporter
