// When stretches begin, end, count and are logged. What ends them beside a stop is in
// VolumeMessagesConditions_test.cpp.
#include "common/VelaReportingUtility.h"
#include "shaping/Shaping_test.h"
#include "shaping/VolumeMessages.h"
#include "testing/CapturingLog.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela {

namespace {

using platform::LogLevel;
using testing::CapturedLine;
using testing::CapturingLog;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr const char* kRunning = "session_output_running";
constexpr const char* kVolume = "NexoSessionVolume";

std::vector<Dictionary> create(const std::vector<Dictionary>& messages, const Value& process = "com.example.player",
                               double minimumPlaytime = 0.5) {
    return createVolumeMessages(storedMessages(messages), process, minimumPlaytime);
}

std::vector<double> stretches(const std::vector<Dictionary>& messages) { return playSecondsOf(create(messages)); }

std::vector<std::int64_t> integersOf(const std::vector<Dictionary>& messages, const char* key) {
    std::vector<std::int64_t> integers;
    for (const Dictionary& message : messages) {
        integers.push_back(message.find(key).integerValue(-1));
    }
    return integers;
}

Dictionary startAt(double time) { return messageAt(time, {{kRunning, true}, {kVolume, 0.5}}); }
Dictionary stopAt(double time) { return messageAt(time, {{kRunning, false}}); }
Dictionary volumeAt(double time, double volume) { return messageAt(time, {{kVolume, volume}}); }
Dictionary sessionEndAt(double time) { return messageAt(time, {{"session_duration", 12.5}}); }

CapturedLine line(std::string text) { return {LogLevel::Debug, "velarr", "VelaReportingSession", std::move(text)}; }
CapturedLine entering() { return line("entering createVolumeMessages createVolumeMessages:process:minimumPlaytime:"); }
CapturedLine skipped(const std::string& count) {
    return line("skipped volume message, too short { func=createVolumeMessages:process:minimumPlaytime:, action=skip, "
                "count=" +
                count + " }");
}
CapturedLine added(const std::string& count) {
    return line(
        "added volume message { func=createVolumeMessages:process:minimumPlaytime:, action=add, count=" + count + " }");
}
CapturedLine returning(const std::string& count) {
    return line("returning volume message { func=createVolumeMessages:process:minimumPlaytime:, action=return, "
                "count=" +
                count + " }");
}

// Stretches.

TEST(VolumeMessagesTest, NoMessagesGiveNone) {
    const CapturingLog log;
    EXPECT_THAT(create({}), IsEmpty());
    EXPECT_THAT(log.lines(), ElementsAre(entering(), returning("0")));
}

TEST(VolumeMessagesTest, AChangeOfVolumeMakesTwoStretches) {
    const CapturingLog log;
    const std::vector<Dictionary> output = create({startAt(100.0), volumeAt(110.0, 0.75), stopAt(130.0)});
    EXPECT_THAT(playSecondsOf(output), ElementsAre(10.0, 20.0));
    EXPECT_THAT(integersOf(output, "msgidx"), ElementsAre(1, 2));
    EXPECT_THAT(integersOf(output, "msgcnt"), ElementsAre(2, 2));
    EXPECT_EQ(output[0].find(kVolume).doubleValue(), 0.5);
    EXPECT_EQ(output[1].find(kVolume).doubleValue(), 0.75);
    EXPECT_THAT(log.lines(), ElementsAre(entering(), added("1"), added("2"), returning("2")));
}

TEST(VolumeMessagesTest, AStretchMustLastLongerThanTheMinimum) {
    const CapturingLog log;
    EXPECT_THAT(stretches({startAt(100.0), stopAt(100.5)}), IsEmpty());
    EXPECT_THAT(log.lines(), ElementsAre(entering(), skipped("0"), returning("0")));
    EXPECT_THAT(stretches({startAt(100.0), stopAt(100.6)}), ElementsAre(static_cast<double>(0.6F)));
}

TEST(VolumeMessagesTest, TheMinimumIsTheArgument) {
    EXPECT_THAT(
        playSecondsOf(create({startAt(100.0), volumeAt(110.0, 0.75), stopAt(130.0)}, "com.example.player", 15.0)),
        ElementsAre(20.0));
    EXPECT_THAT(playSecondsOf(create({startAt(100.0), stopAt(99.0)}, "com.example.player", -2.0)), ElementsAre(-1.0));
}

TEST(VolumeMessagesTest, AStretchThatEndsBeforeItBeganIsSkipped) {
    const CapturingLog log;
    EXPECT_THAT(stretches({startAt(100.0), stopAt(90.0)}), IsEmpty());
    EXPECT_THAT(log.lines(), ElementsAre(entering(), skipped("0"), returning("0")));
}

TEST(VolumeMessagesTest, WithoutAProcessEveryStretchIsSkipped) {
    const CapturingLog log;
    EXPECT_THAT(create({startAt(100.0), volumeAt(110.0, 0.75), stopAt(130.0)}, Value()), IsEmpty());
    EXPECT_THAT(log.lines(), ElementsAre(entering(), skipped("0"), skipped("0"), returning("0")));
}

TEST(VolumeMessagesTest, WithoutAVolumeStretchesAreSkipped) {
    const CapturingLog log;
    EXPECT_THAT(stretches({messageAt(100.0, {{kRunning, true}}), stopAt(130.0)}), IsEmpty());
    EXPECT_THAT(log.lines(), ElementsAre(entering(), skipped("0"), returning("0")));
}

TEST(VolumeMessagesTest, AVolumeThatComesWithTheStopIsTooLate) {
    EXPECT_THAT(
        stretches({messageAt(100.0, {{kRunning, true}}), messageAt(130.0, {{kRunning, false}, {kVolume, 0.5}})}),
        IsEmpty());
}

TEST(VolumeMessagesTest, AnOpenStretchIsNotReported) {
    const CapturingLog log;
    EXPECT_THAT(stretches({startAt(100.0), volumeAt(110.0, 0.75)}), ElementsAre(10.0));
    EXPECT_THAT(log.lines(), ElementsAre(entering(), added("1"), returning("1")));
}

TEST(VolumeMessagesTest, OutputThatStartsAgainIsANewStretch) {
    EXPECT_THAT(stretches({startAt(100.0), stopAt(110.0), startAt(120.0), stopAt(125.0)}), ElementsAre(10.0, 5.0));
}

TEST(VolumeMessagesTest, ASecondStartOrStopChangesNothing) {
    EXPECT_THAT(
        stretches({stopAt(90.0), startAt(100.0), startAt(105.0), stopAt(110.0), stopAt(120.0), volumeAt(125.0, 0.1)}),
        ElementsAre(10.0));
}

TEST(VolumeMessagesTest, AChangeInTheStartingMessageEndsNothing) {
    EXPECT_THAT(stretches({volumeAt(90.0, 0.25), startAt(100.0), stopAt(110.0)}), ElementsAre(10.0));
}

TEST(VolumeMessagesTest, AChangeInTheStoppingMessageEndsOneStretchWithTheOldConditions) {
    const std::vector<Dictionary> output = create(
        {startAt(100.0),
         messageAt(110.0,
                   {{kRunning, false}, {kVolume, 0.875}, {"session_selected_format", "AAC"}, {"ringerstate", true}})});
    EXPECT_THAT(playSecondsOf(output), ElementsAre(10.0));
    EXPECT_EQ(output[0].find(kVolume).doubleValue(), 0.5);
    EXPECT_EQ(textualForm(output[0].find("session_selected_format")), "unknown");
    EXPECT_FALSE(output[0].find("ringerstate").booleanValue(true));
}

TEST(VolumeMessagesTest, ASkippedStretchMovesTheStartButNotTheIndex) {
    const CapturingLog log;
    const std::vector<Dictionary> output =
        create({startAt(100.0), volumeAt(110.0, 0.25), volumeAt(110.25, 0.375), stopAt(130.25)});
    EXPECT_THAT(playSecondsOf(output), ElementsAre(10.0, 20.0));
    EXPECT_THAT(integersOf(output, "msgidx"), ElementsAre(1, 2));
    EXPECT_THAT(integersOf(output, "msgcnt"), ElementsAre(2, 2));
    EXPECT_THAT(log.lines(), ElementsAre(entering(), added("1"), skipped("1"), added("2"), returning("2")));
}

TEST(VolumeMessagesTest, ADraggedVolumeCountsOnlyWhereItRests) {
    const std::vector<Dictionary> output =
        create({startAt(100.0), volumeAt(110.0, 0.6), volumeAt(110.25, 0.7), volumeAt(110.5, 0.8), stopAt(120.0)});
    EXPECT_THAT(playSecondsOf(output), ElementsAre(10.0, 9.5));
    EXPECT_EQ(output[1].find(kVolume).doubleValue(), 0.8);
}

TEST(VolumeMessagesTest, RunningIsReadAsABoolean) {
    for (const Value& running : {Value(1), Value(1.0), Value(-2), Value(0.25F)}) {
        for (const Value& stopped : {Value(0), Value(0.0), Value("yes"), Value(Array{true})}) {
            EXPECT_THAT(stretches({messageAt(100.0, {{kRunning, running}, {kVolume, 0.5}}),
                                   messageAt(130.0, {{kRunning, stopped}})}),
                        ElementsAre(30.0));
        }
    }
    EXPECT_THAT(stretches({messageAt(100.0, {{kRunning, "true"}, {kVolume, 0.5}}), stopAt(130.0)}), IsEmpty());
}

// The end of a session.

TEST(VolumeMessagesTest, TheEndOfTheSessionEndsTheRunningStretch) {
    EXPECT_THAT(stretches({startAt(100.0), sessionEndAt(130.0)}), ElementsAre(30.0));
}

TEST(VolumeMessagesTest, TheEndOfTheSessionCountsWhateverItsValue) {
    for (const Value& duration : {Value(0), Value(false), Value(""), Value(-1.0)}) {
        EXPECT_THAT(stretches({startAt(100.0), messageAt(130.0, {{"session_duration", duration}})}), ElementsAre(30.0));
    }
}

TEST(VolumeMessagesTest, TheEndOfTheSessionWithoutOutputEndsNothing) {
    const CapturingLog log;
    EXPECT_THAT(stretches({volumeAt(90.0, 0.5), sessionEndAt(130.0), sessionEndAt(131.0)}), IsEmpty());
    EXPECT_THAT(log.lines(), ElementsAre(entering(), returning("0")));
}

TEST(VolumeMessagesTest, TheEndOfTheSessionThatSaysRunningBeginsTheNextStretch) {
    EXPECT_THAT(
        stretches({startAt(100.0), messageAt(110.0, {{"session_duration", 10}, {kRunning, true}}), stopAt(130.0)}),
        ElementsAre(10.0, 20.0));
}

TEST(VolumeMessagesTest, TheEndOfTheSessionThatSaysStoppedIsOneStop) {
    EXPECT_THAT(stretches({startAt(100.0), messageAt(110.0, {{"session_duration", 10}, {kRunning, false}}),
                           startAt(120.0), stopAt(125.0)}),
                ElementsAre(10.0, 5.0));
}

TEST(VolumeMessagesTest, AfterABareSessionEndTheNextStartDoesNotCount) {
    EXPECT_THAT(stretches({startAt(100.0), sessionEndAt(110.0), startAt(112.0), stopAt(130.0)}),
                ElementsAre(10.0, 130.0));
}

TEST(VolumeMessagesTest, AfterABareSessionEndAStartWithAnotherVolumeEndsAStretch) {
    EXPECT_THAT(stretches({startAt(100.0), sessionEndAt(110.0), messageAt(112.0, {{kRunning, true}, {kVolume, 0.25}}),
                           stopAt(130.0)}),
                ElementsAre(10.0, 112.0, 18.0));
}

TEST(VolumeMessagesTest, ASecondBareSessionEndCountsFromTheEpoch) {
    EXPECT_THAT(stretches({startAt(100.0), sessionEndAt(110.0), sessionEndAt(112.0)}), ElementsAre(10.0, 112.0));
}

TEST(VolumeMessagesTest, AfterABareSessionEndChangesEndNothing) {
    EXPECT_THAT(stretches({startAt(100.0), sessionEndAt(110.0), volumeAt(120.0, 0.25)}), ElementsAre(10.0));
}

// Times.

TEST(VolumeMessagesTest, AMissingTimeIsZero) {
    const Dictionary start = {{kRunning, true}, {kVolume, 0.5}};
    EXPECT_THAT(stretches({start, stopAt(30.0)}), ElementsAre(30.0));
    EXPECT_THAT(stretches({startAt(100.0), {{kRunning, false}}}), IsEmpty());
    EXPECT_THAT(stretches({startAt(100.0), {{kVolume, 0.75}}, stopAt(130.0)}), ElementsAre(130.0));
}

TEST(VolumeMessagesTest, TimesOfOtherKindsAreNumbersOrZero) {
    const auto stop = [](const Value& time) {
        return Dictionary{{"velareporting_timestamp", time}, {kRunning, false}};
    };
    EXPECT_THAT(stretches({startAt(100.0), stop(103)}), ElementsAre(3.0));
    EXPECT_THAT(stretches({startAt(100.0), stop("103")}), IsEmpty());
    EXPECT_THAT(stretches({startAt(-7.0), stop("103")}), ElementsAre(7.0));
}

TEST(VolumeMessagesTest, OtherMessagesMoveNothing) {
    EXPECT_THAT(stretches({startAt(100.0),
                           {{"underruns", 3}, {"driver", "codec"}},
                           Dictionary(),
                           messageAt(120.0, {{"underruns", 4}}),
                           stopAt(130.0)}),
                ElementsAre(30.0));
}

// Together with the combining of rapid messages.

TEST(VolumeMessagesTest, RapidSpatialChangesEndAtMostOneStretch) {
    const auto spatialAt = [](double time, bool enabled) {
        return messageAt(time, {{"spatializationEnabled", enabled}});
    };
    EXPECT_THAT(stretches({startAt(100.0), spatialAt(110.0, true), spatialAt(110.5, false), spatialAt(111.0, true),
                           stopAt(130.0)}),
                ElementsAre(11.0, 19.0));
    EXPECT_THAT(stretches({startAt(100.0), spatialAt(110.0, true), spatialAt(112.0, false), stopAt(130.0)}),
                ElementsAre(30.0));
    EXPECT_THAT(stretches({startAt(100.0), spatialAt(110.0, true), spatialAt(112.5, false), stopAt(130.0)}),
                ElementsAre(10.0, 2.5, 17.5));
}

TEST(VolumeMessagesTest, BothSpatialKeysAreCombined) {
    EXPECT_THAT(stretches({startAt(100.0), messageAt(110.0, {{"spatial-audio-accessory-feature", 1}}),
                           messageAt(111.5, {{"spatializationEnabled", true}}), stopAt(130.0)}),
                ElementsAre(11.5, 18.5));
    // The ringer stands in the first of the two, and ends the stretch at the time of the second.
    EXPECT_THAT(
        stretches({startAt(100.0), messageAt(110.0, {{"spatial-audio-accessory-feature", 1}, {"ringerstate", true}}),
                   messageAt(111.5, {{"spatial-audio-accessory-feature", 0}}), stopAt(130.0)}),
        ElementsAre(11.5, 18.5));
}

TEST(VolumeMessagesTest, ACombinedStartBearsTheTimeOfItsLastMember) {
    EXPECT_THAT(stretches({messageAt(100.0, {{kRunning, true}, {kVolume, 0.5}, {"spatializationEnabled", false}}),
                           volumeAt(100.5, 0.25), messageAt(101.5, {{"spatializationEnabled", true}}), stopAt(110.0)}),
                ElementsAre(9.5)); // the stretch from 101.5 to 100.5 was too short
}

TEST(VolumeMessagesTest, AFeatureMessageBeforeTheStartIsReported) {
    const std::vector<Dictionary> output =
        create({messageAt(99.0, {{"spatial-audio-accessory-feature", 3}}), startAt(100.0), stopAt(110.0)});
    ASSERT_THAT(playSecondsOf(output), ElementsAre(10.0));
    EXPECT_EQ(output[0].find("spatial-audio-accessory-feature"), Value(3).ref());
}

// Purity and log lines.

TEST(VolumeMessagesTest, TwoCallsGiveTheSameAndLeaveTheInputAlone) {
    const std::vector<Dictionary> messages = {startAt(100.0), messageAt(105.0, {{"spatializationEnabled", true}}),
                                              stopAt(130.0)};
    const std::vector<StoredMessage> stored = storedMessages(messages);
    const std::vector<Dictionary> first = createVolumeMessages(stored, "com.example.player", 0.5);
    EXPECT_EQ(createVolumeMessages(stored, "com.example.player", 0.5), first);
    EXPECT_THAT(playSecondsOf(first), ElementsAre(5.0, 25.0));
    for (std::size_t index = 0; index < messages.size(); ++index) {
        EXPECT_TRUE(stored[index].message.isSameObject(messages[index]));
    }
    EXPECT_EQ(messages[1], messageAt(105.0, {{"spatializationEnabled", true}}));
}

TEST(VolumeMessagesTest, TheMinimumOfEveryServiceTypeSkipsHalfASecond) {
    const double minimum = VelaReportingUtilityVolumeMinimumPlayingTime(AudioServiceTypeMuse);
    EXPECT_THAT(create({startAt(100.0), stopAt(100.5)}, "com.example.player", minimum), IsEmpty());
}

TEST(VolumeMessagesTest, LinesBearTheSessionsNameInTheirPrefix) {
    const CapturingLog log;
    create({startAt(100.0), volumeAt(110.0, 0.75), stopAt(110.25)});
    std::vector<std::string> starts;
    for (const testing::CapturedRecord& record : log.records()) {
        starts.push_back(record.text.substr(0, 26));
    }
    EXPECT_EQ(starts.size(), 4U);
    EXPECT_THAT(starts, Each(std::string("     VelaReportingSession:")));
}

} // namespace

} // namespace vela
