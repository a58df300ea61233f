#include "common/VelaReportingVocabulary.h"
#include "reporters/pipewire/StreamRules.h"

#include <gtest/gtest.h>
#include <limits>

namespace vela::reporter {
namespace {

std::uint16_t typeOf(const std::string& mediaClass, const std::string& role, const std::string& event = "") {
    NodeProperties node;
    node.mediaClass = mediaClass;
    node.role = role;
    node.eventId = event;
    return serviceTypeOf(node);
}
std::uint16_t playbackType(const std::string& role, const std::string& event = "") {
    return typeOf("Stream/Output/Audio", role, event);
}

TEST(StreamRulesTest, MediaClassesTellKindsOfNodes) {
    EXPECT_EQ(nodeKind("Stream/Output/Audio"), NodeKind::PlaybackStream);
    EXPECT_EQ(nodeKind("Stream/Input/Audio"), NodeKind::CaptureStream);
    EXPECT_EQ(nodeKind("Audio/Sink"), NodeKind::Sink);
    EXPECT_EQ(nodeKind("Audio/Duplex"), NodeKind::Sink);
    EXPECT_EQ(nodeKind("Audio/Source"), NodeKind::Source);
    EXPECT_EQ(nodeKind("Audio/Source/Virtual"), NodeKind::Source);
    EXPECT_EQ(nodeKind("Stream/Output/Video"), NodeKind::Other);
    EXPECT_EQ(nodeKind("Midi/Bridge"), NodeKind::Other);
    EXPECT_EQ(nodeKind(""), NodeKind::Other);
}

TEST(StreamRulesTest, CallsAreTelephonyInBothDirections) {
    EXPECT_EQ(playbackType("Communication"), AudioServiceTypeTelephony);
    EXPECT_EQ(playbackType("phone"), AudioServiceTypeTelephony);
    EXPECT_EQ(typeOf("Stream/Input/Audio", "Communication"), AudioServiceTypeTelephony);
}

TEST(StreamRulesTest, MusicAndMoviesAreLongFormAudio) {
    for (const char* const role : {"Music", "music", "Movie", "video", "animation"}) {
        EXPECT_EQ(playbackType(role), AudioServiceTypeLongFormAudio) << role;
    }
}

TEST(StreamRulesTest, NotificationsThatCallForAttentionAreAlerts) {
    for (const char* const event :
         {"alarm-clock-elapsed", "phone-incoming-call", "message-new-instant", "dialog-warning"}) {
        EXPECT_EQ(playbackType("Notification", event), AudioServiceTypeAlerts) << event;
        EXPECT_EQ(playbackType("event", event), AudioServiceTypeAlerts) << event;
    }
}

TEST(StreamRulesTest, OtherNotificationsAreSystemSounds) {
    EXPECT_EQ(playbackType("Notification"), AudioServiceTypeSystemSounds);
    EXPECT_EQ(playbackType("event", "bell"), AudioServiceTypeSystemSounds);
    EXPECT_EQ(playbackType("event", "phone-outgoing-busy"), AudioServiceTypeSystemSounds);
}

TEST(StreamRulesTest, SpokenHelpAndTestsAreSystemSounds) {
    for (const char* const role : {"Accessibility", "a11y", "Test", "test"}) {
        EXPECT_EQ(playbackType(role), AudioServiceTypeSystemSounds) << role;
    }
}

TEST(StreamRulesTest, OtherPlaybackIsGeneric) {
    for (const char* const role : {"", "Game", "Production", "DSP", "something"}) {
        EXPECT_EQ(playbackType(role), AudioServiceTypeGeneric) << role;
    }
}

TEST(StreamRulesTest, OtherCaptureAndDevicesAreDeviceUsage) {
    EXPECT_EQ(typeOf("Stream/Input/Audio", ""), AudioServiceTypeAudioDeviceUsage);
    EXPECT_EQ(typeOf("Stream/Input/Audio", "Music"), AudioServiceTypeAudioDeviceUsage);
    EXPECT_EQ(typeOf("Audio/Sink", ""), AudioServiceTypeAudioDeviceUsage);
    EXPECT_EQ(typeOf("Audio/Source", "Communication"), AudioServiceTypeAudioDeviceUsage);
}

TEST(StreamRulesTest, VolumeIsTheCubeRootOfTheAmplitude) {
    EXPECT_DOUBLE_EQ(userVolume({1, {0.125, 0.125}, false}), 0.5);
    EXPECT_DOUBLE_EQ(userVolume({0.125, {1, 1}, false}), 0.5);
    EXPECT_DOUBLE_EQ(userVolume({1, {1}, false}), 1);
    EXPECT_DOUBLE_EQ(userVolume({1, {0, 0}, false}), 0);
}

TEST(StreamRulesTest, VolumeIsTheMeanOfTheChannels) { EXPECT_DOUBLE_EQ(userVolume({1, {0, 0.25}, false}), 0.5); }

TEST(StreamRulesTest, VolumeWithoutChannelsIsTheNodesOwn) { EXPECT_DOUBLE_EQ(userVolume({0.001, {}, false}), 0.1); }

TEST(StreamRulesTest, VolumeIsZeroWhenMuted) { EXPECT_DOUBLE_EQ(userVolume({1, {1, 1}, true}), 0); }

TEST(StreamRulesTest, VolumeStaysBetweenZeroAndOne) {
    EXPECT_DOUBLE_EQ(userVolume({1, {8, 8}, false}), 1);
    EXPECT_DOUBLE_EQ(userVolume({1, {-1}, false}), 0);
    EXPECT_DOUBLE_EQ(userVolume({std::numeric_limits<double>::quiet_NaN(), {1}, false}), 0);
    EXPECT_DOUBLE_EQ(userVolume({std::numeric_limits<double>::infinity(), {1}, false}), 1);
}

TEST(StreamRulesTest, FormatsReadAsText) { EXPECT_EQ(formatText({"F32LE", 48000, 2}), "F32LE 48000 Hz 2 ch"); }

TEST(StreamRulesTest, ListsAreInOrderAndWithoutRepeats) {
    EXPECT_EQ(listText({}), "");
    EXPECT_EQ(listText({"speaker"}), "speaker");
    EXPECT_EQ(listText({"speaker", "headphones", "speaker"}), "headphones, speaker");
}

TEST(StreamRulesTest, PatternsFitTheWholeText) {
    EXPECT_TRUE(matchesAny({"pw-*"}, "pw-play"));
    EXPECT_TRUE(matchesAny({"x", "p?-[a-p]lay"}, "pw-play"));
    EXPECT_FALSE(matchesAny({"pw"}, "pw-play"));
    EXPECT_FALSE(matchesAny({}, "pw-play"));
    EXPECT_FALSE(matchesAny({"?*"}, ""));
}

} // namespace
} // namespace vela::reporter
