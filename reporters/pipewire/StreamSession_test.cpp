#include "common/VelaReportingVocabulary.h"
#include "reporters/pipewire/RecordedCalls_test.h"
#include "reporters/pipewire/StreamSession.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::reporter {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using Lines = std::vector<std::string>;

constexpr StatisticsSink::CycleTimes kTimes{40, 20};

class StreamSessionTest : public ::testing::Test {
protected:
    static SessionPlan plan(bool isCapture = false, bool hasStatistics = false) {
        SessionPlan plan;
        plan.description.reporterID = 7;
        plan.description.serviceType = isCapture ? AudioServiceTypeAudioDeviceUsage : AudioServiceTypeLongFormAudio;
        plan.description.application = "Player";
        plan.isCapture = isCapture;
        plan.hasStatistics = hasStatistics;
        return plan;
    }
    static std::vector<DeviceFacts> devices(const std::string& name, std::uint32_t rate = 48000) {
        return {{name, NodeState::Running, Format{"F32P", rate, 2}, Volume{1, {1, 1}, false}}};
    }
    /// A session whose stream runs from 100 ms on, and of which nothing is recorded yet.
    StreamSession running(bool isCapture = false, bool hasStatistics = false) {
        StreamSession session(plan(isCapture, hasStatistics), reports, statistics, at(0));
        session.setVolume({1, {1, 1}, false}, at(10));
        session.setFormat({"F32LE", 48000, 2}, at(10));
        session.setDevices(devices("speaker"), at(10));
        session.setState(NodeState::Running, "", at(100));
        reports.take();
        statistics.take();
        return session;
    }
    static void passTime(StreamSession& session, double until) {
        while (const auto deadline = session.deadline()) {
            if (*deadline > at(until).monotonic) {
                return;
            }
            session.onTime(at(static_cast<double>(deadline->count()) / 1e6));
        }
    }
    static void silence(StreamSession& session, double from, double to) {
        session.setState(NodeState::Idle, "", at(from));
        session.setState(NodeState::Running, "", at(to));
        passTime(session, to + 100);
    }

    RecordedReports reports;
    RecordedStatistics statistics;
};

TEST_F(StreamSessionTest, IsCreatedWithTheNode) {
    const StreamSession session(plan(), reports, statistics, at(0));
    EXPECT_THAT(reports.take(), ElementsAre("create 7 longformaudio Player"));
    EXPECT_FALSE(session.deadline());
}

TEST_F(StreamSessionTest, AStartTellsAllConditionsBeforeIt) {
    StreamSession session(plan(), reports, statistics, at(0));
    session.setVolume({1, {0.125, 0.125}, false}, at(10));
    session.setFormat({"F32LE", 48000, 2}, at(10));
    session.setDevices(devices("speaker"), at(10));
    reports.take();
    session.setState(NodeState::Running, "", at(100));
    EXPECT_THAT(reports.take(),
                ElementsAre("start 7",
                            "send 7 Setup/State @1000.100 session_selected_format=\"F32LE 48000 Hz 2 ch\" "
                            "mChannelsPerFrame=2 sample_rate=48000",
                            "send 7 RouteChange/State @1000.100 active_devices=\"speaker\" device_count=1",
                            "send 7 Output/State @1000.100 device=\"speaker\" device_state=\"running\" "
                            "device_format=\"F32P 48000 Hz 2 ch\" device_volume=1 device_muted=false",
                            "send 7 Volume/State @1000.100 NexoSessionVolume=0.5 muted=false",
                            "send 7 Playback/Start @1000.100 start_count=1 direction=\"playback\" "
                            "session_output_running=true spatializationEnabled=false"));
    EXPECT_THAT(statistics.take(), ElementsAre("start 100"));
}

TEST_F(StreamSessionTest, AStartWaitsForConditionsThatComeLater) {
    StreamSession session(plan(), reports, statistics, at(0));
    reports.take();
    session.setState(NodeState::Running, "", at(100));
    session.setVolume({1, {1, 1}, false}, at(103));
    session.setDevices(devices("speaker"), at(104));
    EXPECT_THAT(reports.take(), IsEmpty());
    session.setFormat({"F32LE", 48000, 2}, at(105));
    const Lines lines = reports.take();
    ASSERT_EQ(lines.size(), 6);
    EXPECT_EQ(lines.back(), "send 7 Playback/Start @1000.100 start_count=1 direction=\"playback\" "
                            "session_output_running=true spatializationEnabled=false");
}

TEST_F(StreamSessionTest, AStartWaitsFiftyMillisecondsAtTheMost) {
    StreamSession session(plan(), reports, statistics, at(0));
    session.setState(NodeState::Running, "", at(100));
    reports.take();
    EXPECT_EQ(session.deadline(), at(150).monotonic);
    session.onTime(at(150));
    EXPECT_THAT(reports.take(), ElementsAre("start 7", "send 7 Playback/Start @1000.100 start_count=1 "
                                                       "direction=\"playback\" session_output_running=true "
                                                       "spatializationEnabled=false"));
}

TEST_F(StreamSessionTest, ASilenceOfFiftyMillisecondsBelongsToTheRun) {
    StreamSession session = running();
    session.setState(NodeState::Idle, "", at(200));
    session.onTime(at(250));
    session.setState(NodeState::Running, "", at(250));
    passTime(session, 1000);
    EXPECT_THAT(reports.take(), IsEmpty());
}

TEST_F(StreamSessionTest, ALongerSilenceEndsTheRunWhereItBegan) {
    StreamSession session = running();
    session.setState(NodeState::Idle, "", at(2100));
    passTime(session, 2150);
    EXPECT_THAT(reports.take(), IsEmpty());
    passTime(session, 2151);
    EXPECT_THAT(reports.take(), ElementsAre("send 7 Playback/Stop @1002.100 session_output_running=false "
                                            "session_duration=2 stop_count=1 reason=\"paused\"",
                                            "stop 7"));
}

TEST_F(StreamSessionTest, ATimerThatComesLateEndsTheRunAllTheSame) {
    StreamSession session = running();
    session.setState(NodeState::Idle, "", at(2100));
    session.setState(NodeState::Running, "", at(2180));
    const Lines lines = reports.take();
    ASSERT_EQ(lines.size(), 8);
    EXPECT_EQ(lines[0], "send 7 Playback/Stop @1002.100 session_output_running=false session_duration=2 "
                        "stop_count=1 reason=\"paused\"");
    EXPECT_EQ(lines[1], "stop 7");
    EXPECT_EQ(lines[2], "start 7");
    EXPECT_EQ(lines[7], "send 7 Playback/Start @1002.180 start_count=2 direction=\"playback\" "
                        "session_output_running=true spatializationEnabled=false");
}

TEST_F(StreamSessionTest, EveryRunHasAnotherCounter) {
    StreamSession session = running();
    for (int run = 1; run < 4; ++run) {
        session.setState(NodeState::Idle, "", at(run * 1000));
        passTime(session, run * 1000 + 100);
        session.setState(NodeState::Running, "", at(run * 1000 + 500));
    }
    EXPECT_THAT(reports.takeWith("_count="),
                ElementsAre(::testing::HasSubstr("stop_count=1"), ::testing::HasSubstr("device_count=1"),
                            ::testing::HasSubstr("start_count=2"), ::testing::HasSubstr("stop_count=2"),
                            ::testing::HasSubstr("device_count=1"), ::testing::HasSubstr("start_count=3"),
                            ::testing::HasSubstr("stop_count=3"), ::testing::HasSubstr("device_count=1"),
                            ::testing::HasSubstr("start_count=4")));
}

TEST_F(StreamSessionTest, ARemovedNodeEndsItsSession) {
    StreamSession session = running();
    session.remove(at(1100));
    EXPECT_THAT(reports.take(), ElementsAre("send 7 Playback/Stop @1001.100 session_output_running=false "
                                            "session_duration=1 stop_count=1 reason=\"ended\"",
                                            "stop 7", "destroy 7"));
    EXPECT_TRUE(session.isGone());
    EXPECT_FALSE(session.deadline());
}

TEST_F(StreamSessionTest, ANodeThatIsRemovedInASilenceEndedWhereItBegan) {
    StreamSession session = running();
    session.setState(NodeState::Suspended, "", at(1100));
    session.remove(at(1120));
    EXPECT_THAT(reports.take(), ElementsAre("send 7 Playback/Stop @1001.100 session_output_running=false "
                                            "session_duration=1 stop_count=1 reason=\"ended\"",
                                            "stop 7", "destroy 7"));
}

TEST_F(StreamSessionTest, ANodeThatNeverRanIsOnlyDestroyed) {
    StreamSession session(plan(), reports, statistics, at(0));
    reports.take();
    session.remove(at(50));
    EXPECT_THAT(reports.take(), ElementsAre("destroy 7"));
}

TEST_F(StreamSessionTest, ANodeThatIsRemovedWhileItStartsHasARun) {
    StreamSession session(plan(), reports, statistics, at(0));
    session.setState(NodeState::Running, "", at(100));
    reports.take();
    session.remove(at(120));
    const Lines lines = reports.take();
    ASSERT_EQ(lines.size(), 5);
    EXPECT_EQ(lines[0], "start 7");
    EXPECT_EQ(lines[2], "send 7 Playback/Stop @1000.120 session_output_running=false session_duration=0.02 "
                        "stop_count=1 reason=\"ended\"");
    EXPECT_EQ(lines[4], "destroy 7");
}

TEST_F(StreamSessionTest, NothingIsSaidAfterTheEnd) {
    StreamSession session = running();
    session.remove(at(1100));
    reports.take();
    session.setState(NodeState::Running, "", at(1200));
    session.setVolume({0.5, {}, false}, at(1200));
    session.remove(at(1300));
    session.lose(at(1300));
    session.onTime(at(9000));
    EXPECT_THAT(reports.take(), IsEmpty());
}

TEST_F(StreamSessionTest, AVolumeIsToldAtOnce) {
    StreamSession session = running();
    session.setVolume({1, {0.125, 0.125}, false}, at(300));
    session.setVolume({1, {0.125, 0.125}, true}, at(400));
    session.setVolume({1, {0.125, 0.125}, false}, at(500));
    EXPECT_THAT(reports.take(), ElementsAre("send 7 Volume/State @1000.300 NexoSessionVolume=0.5 muted=false",
                                            "send 7 Volume/State @1000.400 NexoSessionVolume=0 muted=true",
                                            "send 7 Volume/State @1000.500 NexoSessionVolume=0.5 muted=false"));
}

TEST_F(StreamSessionTest, AVolumeThatSoundsTheSameIsNotToldAgain) {
    StreamSession session = running();
    session.setVolume({1, {0.125, 0.125}, false}, at(300));
    session.setVolume({0.125, {1, 1}, false}, at(400));
    EXPECT_EQ(reports.take().size(), 1);
}

TEST_F(StreamSessionTest, AFormatIsToldAtOnce) {
    StreamSession session = running();
    session.setFormat({"S16LE", 44100, 1}, at(300));
    session.setFormat({"S16LE", 44100, 1}, at(400));
    EXPECT_THAT(reports.take(), ElementsAre("send 7 Setup/State @1000.300 session_selected_format=\"S16LE 44100 Hz 1 "
                                            "ch\" mChannelsPerFrame=1 sample_rate=44100"));
}

TEST_F(StreamSessionTest, AMoveIsOneRouteChange) {
    StreamSession session = running();
    session.setDevices({}, at(300));
    session.setDevices(devices("headphones"), at(301));
    session.setState(NodeState::Idle, "", at(301));
    session.setState(NodeState::Running, "", at(304));
    session.setDevices(devices("headphones"), at(305));
    passTime(session, 1000);
    EXPECT_THAT(reports.take(),
                ElementsAre("send 7 RouteChange/State @1000.304 active_devices=\"headphones\" device_count=1",
                            "send 7 Output/State @1000.304 device=\"headphones\" device_state=\"running\" "
                            "device_format=\"F32P 48000 Hz 2 ch\" device_volume=1 device_muted=false"));
    EXPECT_THAT(statistics.take(), ElementsAre("move 3"));
}

TEST_F(StreamSessionTest, ASilenceAfterAMoveThatWasToldIsOfTheMove) {
    StreamSession session = running();
    session.setDevices({}, at(300));
    session.setDevices(devices("headphones"), at(301));
    passTime(session, 434);
    EXPECT_THAT(reports.takeWith("RouteChange"),
                ElementsAre("send 7 RouteChange/State @1000.300 active_devices=\"headphones\" device_count=1"));
    silence(session, 434, 445);
    EXPECT_THAT(statistics.take(), ElementsAre("move 11"));
}

TEST_F(StreamSessionTest, ASilenceFiveSecondsAfterAMoveIsOfTheMove) {
    StreamSession session = running();
    session.setDevices(devices("headphones"), at(300));
    passTime(session, 5300);
    silence(session, 5300, 5304);
    EXPECT_THAT(statistics.take(), ElementsAre("move 4"));
}

TEST_F(StreamSessionTest, ASilenceLaterThanThatIsNotOfTheMove) {
    StreamSession session = running();
    session.setDevices(devices("headphones"), at(300));
    passTime(session, 5301);
    silence(session, 5301, 5304);
    EXPECT_THAT(statistics.take(), IsEmpty());
}

TEST_F(StreamSessionTest, AMoveHasOneSilence) {
    StreamSession session = running();
    session.setDevices(devices("headphones"), at(300));
    passTime(session, 400);
    silence(session, 400, 404);
    silence(session, 600, 607);
    EXPECT_THAT(statistics.take(), ElementsAre("move 4"));
}

TEST_F(StreamSessionTest, AMoveOfTheRunBeforeHasNoSilenceInThisOne) {
    StreamSession session = running();
    session.setDevices(devices("headphones"), at(300));
    passTime(session, 400);
    session.setState(NodeState::Idle, "", at(400));
    passTime(session, 600);
    session.setState(NodeState::Running, "", at(600));
    silence(session, 700, 704);
    EXPECT_THAT(statistics.take(), IsEmpty());
}

TEST_F(StreamSessionTest, AMoveWithoutSilenceIsDatedToItsBegin) {
    StreamSession session = running();
    session.setDevices({}, at(300));
    session.setDevices(devices("headphones"), at(302));
    passTime(session, 319);
    EXPECT_THAT(reports.take(), IsEmpty());
    passTime(session, 320);
    EXPECT_THAT(reports.takeWith("RouteChange"),
                ElementsAre("send 7 RouteChange/State @1000.300 active_devices=\"headphones\" device_count=1"));
}

TEST_F(StreamSessionTest, ASecondDeviceIsARouteChange) {
    StreamSession session = running();
    std::vector<DeviceFacts> both = devices("speaker");
    both.push_back(devices("headphones").front());
    session.setDevices(both, at(300));
    passTime(session, 1000);
    EXPECT_THAT(
        reports.takeWith("RouteChange"),
        ElementsAre("send 7 RouteChange/State @1000.300 active_devices=\"headphones, speaker\" device_count=2"));
}

TEST_F(StreamSessionTest, WhatHappensAfterARouteChangeIsToldAfterIt) {
    StreamSession session = running();
    session.setDevices(devices("headphones"), at(300));
    session.setVolume({0.001, {}, false}, at(310));
    const Lines lines = reports.take();
    ASSERT_EQ(lines.size(), 3);
    EXPECT_EQ(lines[0], "send 7 RouteChange/State @1000.300 active_devices=\"headphones\" device_count=1");
    EXPECT_EQ(lines[2], "send 7 Volume/State @1000.310 NexoSessionVolume=0.1 muted=false");
}

TEST_F(StreamSessionTest, AnotherRateOfTheDeviceIsAnOutputState) {
    StreamSession session = running();
    session.setState(NodeState::Suspended, "", at(300));
    session.setState(NodeState::Running, "", at(309));
    session.setDevices(devices("speaker", 44100), at(312));
    passTime(session, 1000);
    EXPECT_THAT(reports.take(), ElementsAre("send 7 Output/State @1000.309 device=\"speaker\" device_state=\"running\" "
                                            "device_format=\"F32P 44100 Hz 2 ch\" device_volume=1 device_muted=false"));
    EXPECT_THAT(statistics.take(), ElementsAre("rate 9"));
}

TEST_F(StreamSessionTest, AFormatThatBecomesKnownInASilenceIsNoOtherRate) {
    StreamSession session = running();
    std::vector<DeviceFacts> unknown = devices("speaker");
    unknown.front().format.reset();
    session.setDevices(unknown, at(300));
    passTime(session, 400);
    session.setState(NodeState::Idle, "", at(400));
    session.setDevices(devices("speaker"), at(402));
    session.setState(NodeState::Running, "", at(404));
    passTime(session, 1000);
    EXPECT_THAT(statistics.take(), IsEmpty());
}

TEST_F(StreamSessionTest, ChangesInASilenceThatEndsTheRunAreOfTheNextOne) {
    StreamSession session = running();
    session.setState(NodeState::Idle, "", at(300));
    session.setVolume({0.001, {}, false}, at(320));
    session.setDevices(devices("headphones"), at(330));
    passTime(session, 500);
    EXPECT_THAT(reports.take(), ElementsAre(::testing::HasSubstr("Playback/Stop @1000.300"), "stop 7"));
    session.setState(NodeState::Running, "", at(600));
    EXPECT_THAT(reports.takeWith("@1000.600"),
                ElementsAre(::testing::HasSubstr("Setup/State"), ::testing::HasSubstr("active_devices=\"headphones\""),
                            ::testing::HasSubstr("Output/State"), ::testing::HasSubstr("NexoSessionVolume=0.1"),
                            ::testing::HasSubstr("Playback/Start")));
}

TEST_F(StreamSessionTest, CaptureIsRecordingAndNoOutput) {
    StreamSession session(plan(true), reports, statistics, at(0));
    session.setVolume({1, {1}, false}, at(10));
    session.setFormat({"S16LE", 48000, 1}, at(10));
    session.setDevices(devices("microphone"), at(10));
    session.setState(NodeState::Running, "", at(100));
    session.remove(at(1100));
    EXPECT_THAT(reports.takeWith("Record/"),
                ElementsAre("send 7 Record/Start @1000.100 start_count=1 direction=\"capture\" "
                            "session_input_running=true",
                            "send 7 Record/Stop @1001.100 session_output_running=false session_duration=1 "
                            "stop_count=1 reason=\"ended\" session_input_running=false"));
}

TEST_F(StreamSessionTest, CaptureTellsOfInput) {
    StreamSession session = running(true);
    session.setDevices(devices("other"), at(300));
    passTime(session, 1000);
    EXPECT_THAT(reports.takeWith("Input/State").size(), 1);
}

TEST_F(StreamSessionTest, AStopWaitsForTheLastCycles) {
    StreamSession session = running(false, true);
    session.remove(at(1100));
    EXPECT_EQ(reports.take().size(), 1);
    session.addCycle(at(1090).monotonic, kTimes);
    session.statisticsReach(at(1090).monotonic);
    EXPECT_FALSE(session.isGone());
    session.addCycle(at(1110).monotonic, kTimes); // somebody else's, as it were
    session.statisticsReach(at(1110).monotonic);
    EXPECT_TRUE(session.isGone());
    EXPECT_THAT(reports.take(),
                ElementsAre("send 7 Performance/Summary @1001.100 cycles=1 incomplete_cycles=0 wait_mean_us=40 "
                            "wait_max_us=40 busy_mean_us=20 busy_max_us=20",
                            "send 7 Performance/Histogram @1001.100 wait_us=\"0-50:1\" busy_us=\"0-50:1\"", "stop 7",
                            "destroy 7"));
}

TEST_F(StreamSessionTest, AStopWaitsForCyclesAtMostSoLong) {
    StreamSession session = running(false, true);
    session.remove(at(1100));
    reports.take();
    passTime(session, 2299);
    EXPECT_THAT(reports.take(), IsEmpty());
    passTime(session, 2300);
    EXPECT_THAT(reports.take(), ElementsAre("stop 7", "destroy 7"));
}

TEST_F(StreamSessionTest, ARunThatFollowsSoonDoesNotWait) {
    StreamSession session = running(false, true);
    session.setState(NodeState::Idle, "", at(1100));
    passTime(session, 1200);
    reports.take();
    session.setState(NodeState::Running, "", at(1300));
    const Lines lines = reports.take();
    ASSERT_GE(lines.size(), 2);
    EXPECT_EQ(lines[0], "stop 7");
    EXPECT_EQ(lines[1], "start 7");
}

TEST_F(StreamSessionTest, CyclesBeforeTheRunDoNotCount) {
    StreamSession session = running(false, true);
    session.addCycle(at(99).monotonic, kTimes);
    session.remove(at(1100));
    session.lose(at(1200));
    EXPECT_THAT(reports.takeWith("Performance"), IsEmpty());
}

TEST_F(StreamSessionTest, ALostServerEndsEverythingAtOnce) {
    StreamSession session = running(false, true);
    session.lose(at(1100));
    EXPECT_THAT(reports.take(), ElementsAre("send 7 Playback/Stop @1001.100 session_output_running=false "
                                            "session_duration=1 stop_count=1 reason=\"ended\"",
                                            "stop 7", "destroy 7"));
    EXPECT_TRUE(session.isGone());
}

TEST_F(StreamSessionTest, ALostServerEndsWhatWaitsForCycles) {
    StreamSession session = running(false, true);
    session.remove(at(1100));
    reports.take();
    session.lose(at(1150));
    EXPECT_THAT(reports.take(), ElementsAre("stop 7", "destroy 7"));
}

TEST_F(StreamSessionTest, AFailedNodeIsAnError) {
    StreamSession session = running();
    session.setState(NodeState::Error, "no such format", at(300));
    EXPECT_THAT(reports.take(), ElementsAre("send 7 Error/Error @1000.300 error=\"no such format\" where=\"speaker\""));
    passTime(session, 400);
    EXPECT_THAT(reports.takeWith("Stop").size(), 1);
}

TEST_F(StreamSessionTest, AFailedNodeWithoutAReasonIsAnErrorToo) {
    StreamSession session = running();
    session.setState(NodeState::Error, "", at(300));
    EXPECT_THAT(reports.take(),
                ElementsAre("send 7 Error/Error @1000.300 error=\"the node failed\" where=\"speaker\""));
}

TEST_F(StreamSessionTest, ALinkedStreamThatDoesNotComeUpIsAnErrorOnce) {
    StreamSession session(plan(), reports, statistics, at(0));
    session.setState(NodeState::Suspended, "", at(5));
    session.setDevices(devices("speaker"), at(10));
    reports.take();
    passTime(session, 1010);
    EXPECT_THAT(reports.take(), IsEmpty());
    passTime(session, 1011);
    EXPECT_THAT(reports.take(),
                ElementsAre("send 7 Error/Error @1001.010 error=\"linked and not running for more than a second\" "
                            "where=\"speaker\""));
    passTime(session, 60000);
    EXPECT_THAT(reports.take(), IsEmpty());
}

TEST_F(StreamSessionTest, APauseIsNoError) {
    StreamSession session = running();
    session.setState(NodeState::Idle, "", at(300));
    passTime(session, 60000);
    EXPECT_THAT(reports.takeWith("Error"), IsEmpty());
}

TEST_F(StreamSessionTest, ADeviceThatRestsIsNoError) {
    SessionPlan device = plan();
    device.isDevice = true;
    StreamSession session(device, reports, statistics, at(0));
    session.setDevices(devices("speaker"), at(10));
    passTime(session, 60000);
    session.setState(NodeState::Suspended, "", at(60000));
    passTime(session, 120000);
    EXPECT_THAT(reports.takeWith("Error"), IsEmpty());
    EXPECT_FALSE(session.deadline());
}

TEST_F(StreamSessionTest, AFailedDeviceIsAnError) {
    SessionPlan device = plan();
    device.isDevice = true;
    StreamSession session(device, reports, statistics, at(0));
    session.setDevices(devices("speaker"), at(10));
    reports.take();
    session.setState(NodeState::Error, "unplugged", at(300));
    EXPECT_THAT(reports.take(), ElementsAre("send 7 Error/Error @1000.300 error=\"unplugged\" where=\"speaker\""));
}

TEST_F(StreamSessionTest, ABurstOfIncompleteCyclesIsAnErrorEveryTenSeconds) {
    StreamSession session = running(false, true);
    const auto burst = [&](double from, int count) {
        for (int i = 0; i < count; ++i) {
            session.addCycle(at(from + i).monotonic, std::nullopt);
        }
        return reports.takeWith("Error").size();
    };
    EXPECT_EQ(burst(200, 4), 0);
    EXPECT_EQ(burst(1500, 4), 0); // a second later these begin anew
    EXPECT_EQ(burst(1510, 1), 1);
    EXPECT_EQ(burst(3000, 100), 0);
    EXPECT_EQ(burst(13000, 5), 1);
}

TEST_F(StreamSessionTest, ABurstCountsWhereverItsSecondBegins) {
    StreamSession session = running(false, true);
    for (const double time : {200, 1100, 1150, 1190, 1250}) {
        session.addCycle(at(time).monotonic, std::nullopt);
    }
    EXPECT_THAT(reports.takeWith("Error"), IsEmpty());
    session.addCycle(at(1300).monotonic, std::nullopt);
    EXPECT_THAT(reports.takeWith("Error"), ElementsAre("send 7 Error/Error @1001.300 error=\"5 incomplete cycles "
                                                       "within a second\" where=\"speaker\""));
}

TEST_F(StreamSessionTest, ABurstIsFiveWithinExactlyASecond) {
    StreamSession session = running(false, true);
    for (const double time : {200, 300, 400, 500, 1201}) {
        session.addCycle(at(time).monotonic, std::nullopt);
    }
    EXPECT_THAT(reports.takeWith("Error"), IsEmpty());
    session.addCycle(at(1300).monotonic, std::nullopt);
    EXPECT_EQ(reports.takeWith("Error").size(), 1);
}

TEST_F(StreamSessionTest, ABurstIsOfOneRun) {
    StreamSession session = running(false, true);
    for (const double time : {300, 301, 302, 303}) {
        session.addCycle(at(time).monotonic, std::nullopt);
    }
    session.setState(NodeState::Idle, "", at(400));
    passTime(session, 451);
    session.setState(NodeState::Running, "", at(500));
    session.addCycle(at(510).monotonic, std::nullopt);
    EXPECT_THAT(reports.takeWith("Error"), IsEmpty());
}

TEST_F(StreamSessionTest, AClockThatIsSetDoesNotChangeTheLengthOfARun) {
    StreamSession session = running();
    Moment later = at(2100);
    later.epoch += 3600;
    session.remove(later);
    EXPECT_THAT(reports.takeWith("Stop"),
                ElementsAre("send 7 Playback/Stop @1002.100 session_output_running=false session_duration=2 "
                            "stop_count=1 reason=\"ended\""));
}

} // namespace
} // namespace vela::reporter
