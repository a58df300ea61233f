#include "reporters/pipewire/GraphModel.h"
#include "reporters/pipewire/RecordedCalls_test.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::reporter {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

constexpr std::uint32_t kSpeaker = 30;
constexpr std::uint32_t kHeadphones = 31;
constexpr std::uint32_t kStream = 50;
constexpr std::int64_t kMillisecond = 1'000'000;

NodeProperties node(const std::string& mediaClass, const std::string& name, std::uint64_t serial) {
    NodeProperties properties;
    properties.mediaClass = mediaClass;
    properties.name = name;
    properties.serial = serial;
    return properties;
}
NodeProperties player(std::uint64_t serial = 7) {
    NodeProperties properties = node("Stream/Output/Audio", "player", serial);
    properties.application = "Player";
    properties.role = "Music";
    return properties;
}

/// A cycle that began at `milliseconds`, in which the node began after 40 us and worked 20 us.
NodeCycle cycleOf(std::uint32_t id, const std::string& name, std::int64_t milliseconds, int status = 3) {
    const std::int64_t signal = milliseconds * kMillisecond;
    return {id, name, signal, signal + 40'000, signal + 60'000, status};
}

class GraphModelTest : public ::testing::Test {
protected:
    GraphModel model(ReportingRules rules = {}) {
        GraphModel model(std::move(rules), reports, statistics);
        model.connected(1000);
        return model;
    }
    static void addSinks(GraphModel& model) {
        model.addNode(kSpeaker, node("Audio/Sink", "speaker", 1), at(0));
        model.addNode(kHeadphones, node("Audio/Sink", "headphones", 2), at(0));
    }
    static void play(GraphModel& model, double from) {
        model.addNode(kStream, player(), at(from));
        model.addLink(60, {kStream, kSpeaker}, at(from + 1));
        model.addLink(61, {kStream, kSpeaker}, at(from + 1));
        model.setNodeVolume(kStream, {1, {1}, false}, at(from + 2));
        model.setNodeState(kSpeaker, NodeState::Running, "", at(from + 3));
        model.setNodeFormat(kStream, {"F32LE", 48000, 1}, at(from + 3));
        model.setNodeState(kStream, NodeState::Running, "", at(from + 3));
    }
    static void passTime(GraphModel& model, double until) {
        while (const auto deadline = model.deadline()) {
            if (*deadline > at(until).monotonic) {
                return;
            }
            model.onTime(at(static_cast<double>(deadline->count()) / 1e6));
        }
    }

    RecordedReports reports;
    RecordedStatistics statistics;
};

TEST_F(GraphModelTest, AStreamsSessionBearsItsSerialNumber) {
    GraphModel graph = model();
    graph.addNode(kStream, player(7), at(0));
    EXPECT_THAT(reports.take(), ElementsAre("create 1007 longformaudio Player media_role=\"Music\""));
    EXPECT_EQ(graph.sessionCount(), 1);
}

TEST_F(GraphModelTest, AnIDThatIsUsedAgainIsAnotherSession) {
    GraphModel graph = model();
    graph.addNode(kStream, player(7), at(0));
    graph.remove(kStream, at(1));
    graph.addNode(kStream, player(8), at(1));
    EXPECT_THAT(reports.take(), ElementsAre(HasSubstr("create 1007"), "destroy 1007", HasSubstr("create 1008")));
}

TEST_F(GraphModelTest, OtherNodesHaveNoSession) {
    GraphModel graph = model();
    addSinks(graph);
    graph.addNode(5, node("Stream/Output/Video", "film", 9), at(0));
    EXPECT_THAT(reports.take(), IsEmpty());
    EXPECT_EQ(graph.sessionCount(), 0);
}

TEST_F(GraphModelTest, DevicesHaveSessionsWhenTheRulesAskForThem) {
    ReportingRules rules;
    rules.devices = true;
    GraphModel graph = model(rules);
    graph.addNode(kSpeaker, node("Audio/Sink", "speaker", 1), at(0));
    graph.addNode(40, node("Audio/Source", "microphone", 3), at(0));
    EXPECT_THAT(reports.take(),
                ElementsAre("create 1001 audiodeviceusage speaker", "create 1003 audiodeviceusage microphone"));
    graph.setNodeVolume(kSpeaker, {1, {1, 1}, false}, at(5));
    graph.setNodeFormat(kSpeaker, {"F32P", 48000, 2}, at(5));
    graph.setNodeState(kSpeaker, NodeState::Running, "", at(10));
    EXPECT_THAT(reports.take(),
                ElementsAre("start 1001", HasSubstr("Setup/State"), HasSubstr("active_devices=\"speaker\""),
                            HasSubstr("Output/State"), HasSubstr("Volume/State"), HasSubstr("Playback/Start")));
}

TEST_F(GraphModelTest, ADeviceThatRestsIsNoError) {
    ReportingRules rules;
    rules.devices = true;
    GraphModel graph = model(rules);
    graph.addNode(kSpeaker, node("Audio/Sink", "speaker", 1), at(0));
    graph.addNode(40, node("Audio/Source", "microphone", 3), at(0));
    graph.setNodeState(kSpeaker, NodeState::Suspended, "", at(10));
    passTime(graph, 60000);
    EXPECT_THAT(reports.takeWith("Error"), IsEmpty());
    EXPECT_FALSE(graph.deadline());
}

TEST_F(GraphModelTest, TheApplicationIsTheNodesOrItsClientsOrTheNodesName) {
    GraphModel graph = model();
    graph.setClient(20, "Client");
    NodeProperties properties = player(1);
    properties.client = 20;
    graph.addNode(50, properties, at(0));
    properties.application.clear();
    properties.serial = 2;
    graph.addNode(51, properties, at(0));
    properties.client = 21;
    properties.serial = 3;
    graph.addNode(52, properties, at(0));
    EXPECT_THAT(reports.take(), ElementsAre(HasSubstr(" Player "), HasSubstr(" Client "), HasSubstr(" player ")));
}

TEST_F(GraphModelTest, StreamsAreLeftOutByApplicationRoleOrName) {
    for (const int way : {0, 1, 2}) {
        ReportingRules rules;
        (way == 0   ? rules.leftOutApplications
         : way == 1 ? rules.leftOutRoles
                    : rules.leftOutNodes) = {way == 0   ? "Play*"
                                             : way == 1 ? "Music"
                                                        : "play?r"};
        GraphModel graph = model(rules);
        addSinks(graph);
        play(graph, 0);
        graph.remove(kStream, at(1000));
        EXPECT_THAT(reports.take(), IsEmpty()) << way;
    }
}

TEST_F(GraphModelTest, NamesOfApplicationsAreLeftOutEverywhere) {
    ReportingRules rules;
    rules.names = NamePolicy(NameTreatment::Omit, "");
    GraphModel graph = model(rules);
    graph.addNode(kStream, player(), at(0));
    graph.addNode(51, node("Stream/Input/Audio", "Recorder", 8), at(0));
    graph.addLink(60, {kStream, 51}, at(1));
    graph.setNodeState(kStream, NodeState::Running, "", at(2));
    passTime(graph, 500);
    const auto lines = reports.take();
    EXPECT_EQ(lines[0], "create 1007 longformaudio - media_role=\"Music\"");
    for (const std::string& line : lines) {
        EXPECT_THAT(line, ::testing::Not(HasSubstr("Recorder"))) << line;
        EXPECT_THAT(line, ::testing::Not(HasSubstr("Player"))) << line;
    }
}

TEST_F(GraphModelTest, AStreamKnowsTheSinkThatItIsLinkedWith) {
    GraphModel graph = model();
    addSinks(graph);
    play(graph, 100);
    EXPECT_THAT(reports.takeWith("active_devices"),
                ElementsAre("send 1007 RouteChange/State @1000.103 active_devices=\"speaker\" device_count=1"));
}

TEST_F(GraphModelTest, ALinkMayBeKnownBeforeItsNodes) {
    GraphModel graph = model();
    graph.addLink(60, {kStream, kSpeaker}, at(0));
    graph.addNode(kStream, player(), at(1));
    graph.addNode(kSpeaker, node("Audio/Sink", "speaker", 1), at(2));
    graph.setNodeState(kStream, NodeState::Running, "", at(3));
    passTime(graph, 100);
    EXPECT_EQ(reports.takeWith("active_devices=\"speaker\"").size(), 1);
}

TEST_F(GraphModelTest, AMoveIsARouteChangeAndNoStop) {
    GraphModel graph = model();
    addSinks(graph);
    play(graph, 100);
    reports.take();
    graph.remove(60, at(1000));
    graph.remove(61, at(1000));
    graph.addLink(62, {kStream, kHeadphones}, at(1001));
    graph.setNodeState(kStream, NodeState::Idle, "", at(1001));
    graph.setNodeState(kHeadphones, NodeState::Running, "", at(1002));
    graph.setNodeState(kStream, NodeState::Running, "", at(1002));
    passTime(graph, 2000);
    const auto lines = reports.take();
    ASSERT_EQ(lines.size(), 2);
    EXPECT_EQ(lines[0], "send 1007 RouteChange/State @1001.002 active_devices=\"headphones\" device_count=1");
}

TEST_F(GraphModelTest, ADestroyedSinkIsARouteChange) {
    GraphModel graph = model();
    addSinks(graph);
    play(graph, 100);
    reports.take();
    graph.remove(60, at(1000));
    graph.remove(61, at(1000));
    graph.remove(kSpeaker, at(1000));
    graph.addLink(62, {kStream, kHeadphones}, at(1003));
    passTime(graph, 2000);
    EXPECT_THAT(reports.takeWith("active_devices"), ElementsAre(HasSubstr("@1001.000 active_devices=\"headphones\"")));
}

TEST_F(GraphModelTest, ASinksStateIsItsStreamsOutputState) {
    GraphModel graph = model();
    addSinks(graph);
    play(graph, 100);
    reports.take();
    graph.setNodeVolume(kSpeaker, {1, {0.125}, false}, at(500));
    passTime(graph, 1000);
    EXPECT_THAT(reports.take(), ElementsAre("send 1007 Output/State @1000.500 device=\"speaker\" "
                                            "device_state=\"running\" device_volume=0.5 device_muted=false"));
}

TEST_F(GraphModelTest, ALostServerEndsAllSessions) {
    GraphModel graph = model();
    addSinks(graph);
    play(graph, 100);
    graph.addNode(51, player(8), at(200));
    reports.take();
    graph.serverLost(at(1103));
    EXPECT_THAT(reports.take(), ElementsAre(HasSubstr("Playback/Stop @1001.103 session_output_running=false "
                                                      "session_duration=1 "),
                                            "stop 1007", "destroy 1007", "destroy 1008"));
    EXPECT_EQ(graph.sessionCount(), 0);
    EXPECT_FALSE(graph.deadline());
    graph.connected(2000);
    graph.addNode(kStream, player(7), at(5000));
    EXPECT_THAT(reports.take(), ElementsAre(HasSubstr("create 2007")));
}

TEST_F(GraphModelTest, RunningStreamsAreCounted) {
    GraphModel graph = model();
    addSinks(graph);
    play(graph, 100);
    EXPECT_EQ(statistics.running[0], 1);
    EXPECT_EQ(statistics.running[1], 0);
    graph.addNode(51, node("Stream/Input/Audio", "recorder", 8), at(200));
    graph.setNodeState(51, NodeState::Running, "", at(201));
    EXPECT_EQ(statistics.running[1], 1);
    graph.remove(kStream, at(300));
    EXPECT_EQ(statistics.running[0], 0);
}

class GraphModelCyclesTest : public GraphModelTest {
protected:
    GraphModel playing() {
        GraphModel graph = model();
        graph.cyclesBegin(at(0));
        addSinks(graph);
        play(graph, 100);
        reports.take();
        statistics.take();
        return graph;
    }
    static Cycle cycle(std::int64_t milliseconds, int status = 3, std::int64_t xruns = 0) {
        return {xruns,
                1024,
                cycleOf(kSpeaker, "speaker", milliseconds),
                {cycleOf(kStream, "player", milliseconds, status)}};
    }
};

TEST_F(GraphModelCyclesTest, CountForTheSinkAndForTheStreams) {
    GraphModel graph = playing();
    graph.addCycle(cycle(200));
    EXPECT_THAT(statistics.take(), ElementsAre("cycle speaker 40+20", "Tx 1024 40+20"));
}

TEST_F(GraphModelCyclesTest, ThoseOutsideTheRunAreTheSinksAlone) {
    GraphModel graph = playing();
    graph.addCycle(cycle(90));
    graph.remove(kStream, at(300));
    graph.addCycle(cycle(310));
    EXPECT_THAT(statistics.take(), ElementsAre("cycle speaker 40+20", "cycle speaker 40+20"));
}

TEST_F(GraphModelCyclesTest, ThoseFromBeforeTheBeginAreNotOurs) {
    GraphModel graph = playing();
    graph.cyclesBegin(at(500));
    graph.addCycle(cycle(499));
    EXPECT_THAT(statistics.take(), IsEmpty());
}

TEST_F(GraphModelCyclesTest, ThoseOfAFollowerThatWasNotDoneAreIncomplete) {
    GraphModel graph = playing();
    graph.addCycle(cycle(200, 1));
    EXPECT_THAT(statistics.take(), ElementsAre("cycle speaker 40+20", "Tx 1024 incomplete"));
}

TEST_F(GraphModelCyclesTest, AFollowerThatWasNotWokenDoesNotCount) {
    GraphModel graph = playing();
    Cycle idle = cycle(200);
    idle.followers[0] = cycleOf(kStream, "player", 150);
    graph.addCycle(idle);
    EXPECT_THAT(statistics.take(), ElementsAre("cycle speaker 40+20"));
}

TEST_F(GraphModelCyclesTest, TimesThatWereNeverMeasuredDoNotCount) {
    GraphModel graph = playing();
    Cycle odd = cycle(200);
    odd.followers[0].finish = odd.followers[0].awake - 1;
    graph.addCycle(odd);
    odd = cycle(201);
    odd.followers[0].awake = 0;
    graph.addCycle(odd);
    EXPECT_THAT(statistics.take(), ElementsAre("cycle speaker 40+20", "cycle speaker 40+20"));
}

TEST_F(GraphModelCyclesTest, AnotherNodesNameUnderTheSameIDDoesNotCount) {
    GraphModel graph = playing();
    Cycle other = cycle(200);
    other.followers[0].name = "another";
    graph.addCycle(other);
    EXPECT_THAT(statistics.take(), ElementsAre("cycle speaker 40+20"));
}

TEST_F(GraphModelCyclesTest, XrunsCountFromTheFirstNumberOn) {
    GraphModel graph = playing();
    graph.addCycle(cycle(200, 3, 5));
    graph.addCycle(cycle(221, 3, 5));
    graph.addCycle(cycle(242, 3, 8));
    std::vector<std::string> lines = statistics.take();
    std::erase_if(lines, [](const std::string& line) { return !line.starts_with("xruns"); });
    EXPECT_THAT(lines, ElementsAre("xruns speaker 3"));
}

TEST_F(GraphModelCyclesTest, TheLastOnesOfAnEndedStreamAreStillItsOwn) {
    GraphModel graph = playing();
    graph.remove(kStream, at(300));
    EXPECT_EQ(graph.sessionCount(), 1);
    graph.addNode(kStream, player(8), at(301)); // the ID is used again at once
    graph.addCycle(cycle(290));
    reports.take();
    Cycle next = cycle(310);
    next.followers.clear();
    graph.addCycle(next);
    EXPECT_THAT(reports.take(), ElementsAre(HasSubstr("Performance/Summary @1000.300 cycles=1"),
                                            HasSubstr("Performance/Histogram"), "stop 1007", "destroy 1007"));
    EXPECT_EQ(graph.sessionCount(), 1);
}

TEST_F(GraphModelCyclesTest, AnEndedStreamDoesNotWaitForEver) {
    GraphModel graph = playing();
    graph.remove(kStream, at(300));
    passTime(graph, 1500);
    EXPECT_THAT(reports.takeWith("destroy"), ElementsAre("destroy 1007"));
    EXPECT_EQ(graph.sessionCount(), 0);
}

} // namespace
} // namespace vela::reporter
