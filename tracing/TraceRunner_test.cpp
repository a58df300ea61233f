// The runner on fakes: what it asks of the facilities, what it logs, what it writes.
#include "testing/FakeFileSystem.h"
#include "testing/FakeMetricsheet.h"
#include "testing/FakeProcessControl.h"
#include "testing/ManualClock.h"
#include "testing/ManualWorkQueues.h"
#include "tracing/TracePointBudget.h"
#include "tracing/TracePointList.h"
#include "tracing/TraceRunner.h"
#include "tracing/Trace_test.h"

#include <cerrno>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

namespace vela {

namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using testing::FakeMetricsheet;
using ::testing::IsEmpty;
using ::testing::Not;

constexpr const char* kFolder = "/private/var/mobile/Library/Logs/Wreckage/DiagnosticLogs/Audio/Traces";
constexpr const char* kResults =
    "/private/var/mobile/Library/Logs/Wreckage/DiagnosticLogs/Audio/Traces/tracing_results.msj";
constexpr const char* kTimeline =
    "/private/var/mobile/Library/Logs/Wreckage/DiagnosticLogs/Audio/Traces/tracing_results.json";

TraceParams makeParams(std::string name, std::int32_t type = kTraceTypeSpoor) {
    TraceParams params;
    params.name = std::move(name);
    params.type = type;
    return params;
}

void addPoint(TraceParams& params, std::string name, std::uint32_t begin, std::uint32_t end,
              bool matchedByThread = true) {
    auto point = std::make_unique<TraceDataParams>();
    point->name = std::move(name);
    point->kind = kTracePointInterval;
    point->beginCode = begin;
    point->endCode = end;
    point->matchedByThread = matchedByThread;
    params.dataParams.push_back(std::move(point));
}

CapturedLine runnerLine(LogLevel level, std::string message) {
    return traceLine(level, "TraceRunner", std::move(message));
}
CapturedLine info(std::string message) { return runnerLine(LogLevel::Info, std::move(message)); }

FakeMetricsheet::Value nanoseconds(std::string name, double value) { return {std::move(name), value, "nanoseconds"}; }

class TraceRunnerTest : public ::testing::Test {
protected:
    TraceRunner& runner() { return *runner_; }
    void create(const TraceParams& params) { runner_->createTraceFromTraceParams(&params); }
    /// One critical trace "start" with the interval "open".
    void createOne() {
        TraceParams params = makeParams("start");
        addPoint(params, "open", kBegin, kEnd);
        create(params);
    }
    void replay(const std::vector<trace_point>& events) {
        spoor_.replay(events);
        queues_.runUntilIdle();
    }
    void stop() { runner_->stopTracingandProcessResults(); }
    std::vector<FakeMetricsheet::Value> written() const { return metricsheet_.files().back().values; }
    nlohmann::json timeline() const { return nlohmann::json::parse(*files_.contentOf(kTimeline)); }

    testing::CapturingLog log_;
    testing::ManualClock clock_;
    testing::ManualWorkQueues queues_{clock_};
    testing::FakeFileSystem files_;
    testing::FakeMetricsheet metricsheet_;
    testing::FakeProcessControl process_;
    testing::FakeSpoor spoor_;
    std::unique_ptr<TraceRunner> runner_ =
        std::make_unique<TraceRunner>(TraceRunnerPlatform{files_, metricsheet_, process_, spoor_, queues_, ""});
};

// Creating.

TEST_F(TraceRunnerTest, ANewRunnerHasNoTraces) {
    EXPECT_EQ(runner().getNumTraces(), 0U);
    EXPECT_EQ(runner().getResultsVersion(), 4);
    EXPECT_THAT(log_.lines(), IsEmpty());
    EXPECT_THAT(spoor_.calls(), IsEmpty());
}

TEST_F(TraceRunnerTest, NoRecordAddsNothing) {
    runner().createTraceFromTraceParams(nullptr);
    EXPECT_EQ(runner().getNumTraces(), 0U);
    EXPECT_THAT(log_.lines(), ElementsAre(runnerLine(LogLevel::Default, "Attempted to add nullptr to trace runner")));
}

TEST_F(TraceRunnerTest, EveryRecordIsATrace) {
    createOne();
    create(makeParams(""));
    EXPECT_EQ(runner().getNumTraces(), 2U);
    EXPECT_THAT(log_.lines(), IsEmpty());
    EXPECT_THAT(spoor_.calls(), IsEmpty());
}

// Running.

TEST_F(TraceRunnerTest, ACriticalTraceIsSetUpAndStarted) {
    createOne();
    runner().runTraces();
    EXPECT_THAT(spoor_.calls(), ElementsAre("create", "completion handler", "wall times on",
                                            "range 0x21040000-0x2104408a", "start Tracing Queue"));
    EXPECT_THAT(log_.lines(), ElementsAre(info("Number of traces to perform: 1"), info("Performing trace : start"),
                                          info("Setting up tracing: start"), info("Starting tracing: start")));
}

TEST_F(TraceRunnerTest, ATraceOfAnyOtherTypeIsNeitherSetUpNorStarted) {
    create(makeParams("signposts", kTraceTypeMilestone));
    create(makeParams("other", 7));
    runner().runTraces();
    EXPECT_THAT(spoor_.calls(), IsEmpty());
    EXPECT_THAT(log_.lines(), ElementsAre(info("Number of traces to perform: 2"), info("Performing trace : signposts"),
                                          info("Performing trace : other")));
}

TEST_F(TraceRunnerTest, WithoutTracesOnlyTheNumberIsSaid) {
    runner().runTraces();
    EXPECT_THAT(log_.lines(), ElementsAre(info("Number of traces to perform: 0")));
}

TEST_F(TraceRunnerTest, RunningWaitsForNothing) {
    createOne();
    runner().runTraces();
    EXPECT_EQ(queues_.pendingItems(), 0U);
    EXPECT_EQ(queues_.pendingTimers(), 0U);
}

TEST_F(TraceRunnerTest, BothEndsOfTheRangeAreCollectedAndTheirNeighboursAreNot) {
    TraceParams params = makeParams("range");
    addPoint(params, "inside", 0x21040000, 0x2104408A);
    addPoint(params, "below", 0x2103FFFF, 0x21040000);
    addPoint(params, "above", 0x21040000, 0x2104408B);
    create(params);
    runner().runTraces();
    replay({eventAt(1, 0x2103FFFF), eventAt(2, 0x21040000), eventAt(3, 0x2104408B), eventAt(4, 0x2104408A)});
    stop();
    EXPECT_THAT(written(), ElementsAre(nanoseconds("inside", 2)));
}

TEST_F(TraceRunnerTest, TheServicesOwnStepsAreNotCollected) {
    TraceParams params = makeParams("own");
    addPoint(params, "session", 0x21044828, 0x21044838);
    create(params);
    runner().runTraces();
    spoor_.emit(0x21044828);
    spoor_.emit(0x21044838);
    stop();
    EXPECT_THAT(written(), IsEmpty());
}

TEST_F(TraceRunnerTest, ARangeThatFailsIsLoggedAndTheSessionStillStarted) {
    spoor_.failRange(22);
    createOne();
    runner().runTraces();
    EXPECT_THAT(spoor_.calls(), Contains("start Tracing Queue"));
    EXPECT_EQ(log_.lines().back(), runnerLine(LogLevel::Error, "Could not set up spoor range, error: 22"));
    replay({eventAt(1, kBegin), eventAt(2, kEnd)});
    stop();
    EXPECT_THAT(written(), IsEmpty());
}

TEST_F(TraceRunnerTest, AStartThatFailsIsLoggedAndTheStopStillCompletes) {
    spoor_.failStart(95);
    createOne();
    runner().runTraces();
    EXPECT_EQ(log_.lines().back(), runnerLine(LogLevel::Error, "Could not start spoor session, error: 95"));
    replay({eventAt(1, kBegin), eventAt(2, kEnd)});
    stop();
    EXPECT_THAT(written(), IsEmpty());
    EXPECT_THAT(log_.lines(), Contains(info("Completed trace.... 1,   1")));
    EXPECT_TRUE(metricsheet_.files().back().closed);
    EXPECT_EQ(spoor_.liveSessions(), 0U);
}

TEST_F(TraceRunnerTest, AFailedTraceDoesNotKeepTheNextFromStarting) {
    spoor_.failStart(1);
    createOne();
    createOne();
    runner().runTraces();
    EXPECT_EQ(spoor_.liveSessions(), 2U);
    stop();
    EXPECT_THAT(log_.lines(), Contains(info("Completed trace.... 2,   2")));
}

// Stopping.

TEST_F(TraceRunnerTest, DurationsAreWrittenInNanoseconds) {
    createOne();
    runner().runTraces();
    replay({eventAt(100, kBegin), eventAt(350, kEnd), eventAt(400, kBegin), eventAt(401, kEnd)});
    log_.clear();
    stop();
    EXPECT_THAT(log_.lines(), ElementsAre(info("Tearing down trace :  start"), info("Completed trace.... 1,   1"),
                                          info("Completed trace....In write perf data.... 1"),
                                          info("Writing out 2 result for open, min: 1, max: 250")));
    ASSERT_EQ(metricsheet_.files().size(), 1U);
    const FakeMetricsheet::File file = metricsheet_.files()[0];
    EXPECT_EQ(file.path, kResults);
    EXPECT_EQ(file.writerName, "VelaReporting");
    EXPECT_EQ(file.version, 4U);
    EXPECT_THAT(file.values, ElementsAre(nanoseconds("open", 250), nanoseconds("open", 1)));
    EXPECT_TRUE(file.closed);
    EXPECT_THAT(process_.statuses(), IsEmpty());
}

TEST_F(TraceRunnerTest, EventsThatWereEmittedBeforeTheStopCount) {
    createOne();
    runner().runTraces();
    spoor_.emit(kBegin);
    spoor_.emit(kEnd);
    stop();
    EXPECT_THAT(written(), ElementsAre(nanoseconds("open", 1)));
}

TEST_F(TraceRunnerTest, TimesAreConvertedByTheLiveSessionBeforeItIsDestroyed) {
    spoor_.setTimeUnit(125, 3);
    createOne();
    runner().runTraces();
    replay({eventAt(1, kBegin), eventAt(3, kEnd)});
    stop();
    EXPECT_THAT(written(), ElementsAre(nanoseconds("open", 84)));
    EXPECT_THAT(spoor_.calls(), ElementsAre("create", "completion handler", "wall times on",
                                            "range 0x21040000-0x2104408a", "start Tracing Queue", "end", "destroy"));
}

TEST_F(TraceRunnerTest, LargeDurationsAreRoundedToADouble) {
    createOne();
    runner().runTraces();
    replay({eventAt(200, kBegin), eventAt(100, kEnd)});
    stop();
    EXPECT_THAT(written(), ElementsAre(nanoseconds("open", 18446744073709551616.0)));
    EXPECT_THAT(log_.lines(), Contains(info("Writing out 1 result for open, min: 18446744073709551516, max: "
                                            "18446744073709551516")));
}

TEST_F(TraceRunnerTest, AMilestoneTraceCompletesAtOnceAndTheFileIsWrittenEmpty) {
    TraceParams params = makeParams("signposts", kTraceTypeMilestone);
    addPoint(params, "open", kBegin, kEnd);
    create(params);
    runner().runTraces();
    spoor_.emit(kBegin);
    spoor_.emit(kEnd);
    log_.clear();
    stop();
    EXPECT_THAT(log_.lines(), ElementsAre(info("Tearing down trace :  signposts"), info("Completed trace.... 1,   1"),
                                          info("Completed trace....In write perf data.... 0")));
    EXPECT_THAT(written(), IsEmpty());
    EXPECT_TRUE(metricsheet_.files()[0].closed);
    EXPECT_THAT(spoor_.calls(), IsEmpty());
}

TEST_F(TraceRunnerTest, ACriticalTraceWithoutPairsCountsAsATraceWithResults) {
    createOne();
    runner().runTraces();
    stop();
    EXPECT_THAT(log_.lines(), Contains(info("Completed trace....In write perf data.... 1")));
    EXPECT_THAT(written(), IsEmpty());
}

TEST_F(TraceRunnerTest, ATraceWithoutANameOrPointsIsRunAsWell) {
    create(makeParams(""));
    runner().runTraces();
    stop();
    EXPECT_THAT(log_.lines(), Contains(info("Performing trace : ")));
    EXPECT_THAT(log_.lines(), Contains(info("Tearing down trace :  ")));
    EXPECT_THAT(log_.lines(), Contains(info("Completed trace.... 1,   1")));
    EXPECT_TRUE(metricsheet_.files()[0].closed);
}

TEST_F(TraceRunnerTest, WithoutTracesAnEmptyFileIsWritten) {
    runner().runTraces();
    log_.clear();
    stop();
    EXPECT_THAT(log_.lines(), ElementsAre(info("Completed trace....In write perf data.... 0")));
    EXPECT_TRUE(metricsheet_.files()[0].closed);
}

TEST_F(TraceRunnerTest, TracesAreStoppedAndWrittenInTheirOrder) {
    for (const char* const name : {"zebra", "ant"}) {
        TraceParams params = makeParams(name);
        addPoint(params, std::string(name) + "-b", kBegin, kEnd);
        addPoint(params, std::string(name) + "-a", kBegin, kEnd);
        create(params);
    }
    create(makeParams("signposts", kTraceTypeMilestone));
    runner().runTraces();
    replay({eventAt(1, kBegin), eventAt(4, kEnd)});
    log_.clear();
    stop();
    EXPECT_THAT(log_.lines(), ElementsAre(info("Tearing down trace :  zebra"), info("Completed trace.... 1,   3"),
                                          info("Tearing down trace :  ant"), info("Completed trace.... 2,   3"),
                                          info("Tearing down trace :  signposts"), info("Completed trace.... 3,   3"),
                                          info("Completed trace....In write perf data.... 2"),
                                          info("Writing out 1 result for zebra-a, min: 3, max: 3"),
                                          info("Writing out 1 result for zebra-b, min: 3, max: 3"),
                                          info("Writing out 1 result for ant-a, min: 3, max: 3"),
                                          info("Writing out 1 result for ant-b, min: 3, max: 3")));
    EXPECT_THAT(written(), ElementsAre(nanoseconds("zebra-a", 3), nanoseconds("zebra-b", 3), nanoseconds("ant-a", 3),
                                       nanoseconds("ant-b", 3)));
}

TEST_F(TraceRunnerTest, ATraceIsStoppedWhenTheOneBeforeItHasCompleted) {
    createOne();
    createOne();
    runner().runTraces();
    stop();
    const auto calls = spoor_.calls();
    const std::vector<std::string> ends(calls.end() - 4, calls.end());
    EXPECT_THAT(ends, ElementsAre("end", "destroy", "end", "destroy"));
}

TEST_F(TraceRunnerTest, IntervalsOfOneNameShareTheirValues) {
    TraceParams params = makeParams("start");
    addPoint(params, "same", kBegin, kEnd);
    addPoint(params, "same", kBegin + 1, kEnd + 1);
    create(params);
    runner().runTraces();
    replay({eventAt(1, kBegin + 1), eventAt(2, kBegin), eventAt(4, kEnd), eventAt(11, kEnd + 1)});
    stop();
    EXPECT_THAT(written(), ElementsAre(nanoseconds("same", 2), nanoseconds("same", 10)));
    EXPECT_THAT(log_.lines(), Contains(info("Writing out 2 result for same, min: 2, max: 10")));
}

TEST_F(TraceRunnerTest, NamesAreWrittenInByteOrder) {
    TraceParams params = makeParams("start");
    for (const char* const name : {"b", "\xC3\xA4", "B", "a"}) {
        addPoint(params, name, kBegin, kEnd);
    }
    create(params);
    runner().runTraces();
    replay({eventAt(1, kBegin), eventAt(2, kEnd)});
    stop();
    EXPECT_THAT(written(),
                ElementsAre(nanoseconds("B", 1), nanoseconds("a", 1), nanoseconds("b", 1), nanoseconds("\xC3\xA4", 1)));
}

TEST_F(TraceRunnerTest, DroppedPointsAreLoggedBeforeTheTraceIsDone) {
    TraceParams params = makeParams("start");
    addPoint(params, "open", kBegin, kEnd, false);
    create(params);
    runner().runTraces();
    replay({eventAt(1, kEnd)});
    log_.clear();
    stop();
    ASSERT_GE(log_.lines().size(), 3U);
    EXPECT_EQ(log_.lines()[1], intervalLine(LogLevel::Default, "DISCARDED 0 trace Stop points for interval open "
                                                               "because no start points found"));
    EXPECT_EQ(log_.lines()[2], info("Completed trace.... 1,   1"));
}

TEST_F(TraceRunnerTest, TheStopWaitsForACompletionWithoutALimit) {
    spoor_.setCompletes(false);
    createOne();
    runner().runTraces();
    bool late = false;
    queues_.background().postAfter(std::chrono::hours(24), [this, &late] {
        late = true;
        EXPECT_THAT(metricsheet_.files(), IsEmpty());
        spoor_.completeEndedSessions();
    });
    stop();
    EXPECT_TRUE(late);
    EXPECT_THAT(log_.lines(), Contains(info("Completed trace.... 1,   1")));
    EXPECT_TRUE(metricsheet_.files()[0].closed);
}

TEST_F(TraceRunnerTest, AnEndThatFailsIsLoggedAndCompletesTheTrace) {
    spoor_.failEnd(5);
    createOne();
    runner().runTraces();
    replay({eventAt(1, kBegin), eventAt(4, kEnd)});
    log_.clear();
    stop();
    EXPECT_EQ(log_.lines()[1], runnerLine(LogLevel::Error, "Could not end spoor session, error: 5"));
    EXPECT_EQ(log_.lines()[2], info("Completed trace.... 1,   1"));
    EXPECT_THAT(written(), ElementsAre(nanoseconds("open", 3)));
    EXPECT_EQ(spoor_.liveSessions(), 0U);
}

TEST_F(TraceRunnerTest, TracesThatWereNeverRunAreStoppedAsWell) {
    createOne();
    stop();
    EXPECT_THAT(log_.lines(), Contains(info("Completed trace.... 1,   1")));
    EXPECT_THAT(spoor_.calls(), IsEmpty());
}

TEST_F(TraceRunnerTest, AFurtherStopWritesTheResultsAgainDoubled) {
    createOne();
    runner().runTraces();
    replay({eventAt(1, kBegin), eventAt(4, kEnd)});
    stop();
    stop();
    EXPECT_THAT(written(), ElementsAre(nanoseconds("open", 3), nanoseconds("open", 3)));
    EXPECT_THAT(log_.lines(), Contains(info("Completed trace.... 2,   1")));
}

TEST_F(TraceRunnerTest, ANewRunnerShowsNothingOfTheOneBefore) {
    createOne();
    runner().runTraces();
    replay({eventAt(1, kBegin), eventAt(4, kEnd)});
    stop();
    runner_ = std::make_unique<TraceRunner>(TraceRunnerPlatform{files_, metricsheet_, process_, spoor_, queues_, ""});
    createOne();
    runner().runTraces();
    replay({eventAt(10, kBegin), eventAt(15, kEnd)});
    stop();
    EXPECT_THAT(written(), ElementsAre(nanoseconds("open", 5)));
    EXPECT_THAT(log_.lines(), Not(Contains(info("Completed trace.... 2,   1"))));
}

TEST_F(TraceRunnerTest, ARunnerThatIsDestroyedWhileItRunsEndsItsSessionsWithoutResults) {
    createOne();
    runner().runTraces();
    spoor_.replay({eventAt(1, kBegin), eventAt(4, kEnd)});
    runner_.reset();
    queues_.runUntilIdle();
    EXPECT_EQ(spoor_.liveSessions(), 0U);
    EXPECT_EQ(queues_.liveQueues(), 0U);
    EXPECT_THAT(metricsheet_.files(), IsEmpty());
}

// Writing.

TEST_F(TraceRunnerTest, TheFolderIsMadeForEverybody) {
    runner().runTraces();
    stop();
    EXPECT_EQ(files_.permissionsOf(kFolder), 0777U);
    EXPECT_EQ(files_.permissionsOf("/private/var"), 0777U);
}

TEST_F(TraceRunnerTest, PathsStandUnderThePathRoot) {
    TraceRunner rooted({files_, metricsheet_, process_, spoor_, queues_, "/root"});
    rooted.stopTracingandProcessResults();
    EXPECT_EQ(metricsheet_.files()[0].path, std::string("/root") + kResults);
    EXPECT_TRUE(files_.contentOf(std::string("/root") + kTimeline).has_value());
}

TEST_F(TraceRunnerTest, AFolderThatCannotBeMadeIsLoggedAndTheWriterStillOpened) {
    files_.failOn(kFolder, EACCES);
    createOne();
    runner().runTraces();
    log_.clear();
    stop();
    EXPECT_THAT(log_.lines(),
                Contains(runnerLine(LogLevel::Error, std::string("can't create logging directory at ") + kFolder +
                                                         ": create folder " + kFolder + ": Permission denied")));
    EXPECT_TRUE(metricsheet_.files()[0].closed);
}

TEST_F(TraceRunnerTest, AWriterThatCannotBeOpenedEndsTheProcessWithOne) {
    metricsheet_.setOpens(false);
    createOne();
    runner().runTraces();
    stop();
    EXPECT_EQ(log_.lines().back(), info("Failed to open metricsheet writer"));
    EXPECT_THAT(process_.statuses(), ElementsAre(1));
    EXPECT_THAT(files_.files(), IsEmpty());
}

TEST_F(TraceRunnerTest, ACloseThatFailsIsLoggedOnly) {
    metricsheet_.failClose(platform::Failure{EISDIR, "rename to x: Is a directory"});
    createOne();
    runner().runTraces();
    stop();
    EXPECT_EQ(log_.lines().back(), runnerLine(LogLevel::Error, std::string("can't write trace results at ") + kResults +
                                                                   ": rename to x: Is a directory"));
    EXPECT_THAT(process_.statuses(), IsEmpty());
    EXPECT_TRUE(files_.contentOf(kTimeline).has_value());
}

// Lost events.

TEST_F(TraceRunnerTest, LostEventsAreLoggedAndOneMoreLineOfTheResults) {
    spoor_.loseEvents(17);
    createOne();
    runner().runTraces();
    replay({eventAt(1, kBegin), eventAt(4, kEnd)});
    stop();
    EXPECT_THAT(written(), ElementsAre(nanoseconds("open", 3), FakeMetricsheet::Value{"lost events", 17, "events"}));
    EXPECT_EQ(log_.lines().back(), info("17 trace events were lost"));
    EXPECT_EQ(timeline()["otherData"]["lostEvents"], 17);
}

TEST_F(TraceRunnerTest, LostEventsOfAllTracesAreOneLine) {
    spoor_.loseEvents(2);
    createOne();
    createOne();
    runner().runTraces();
    stop();
    EXPECT_THAT(written(), ElementsAre(FakeMetricsheet::Value{"lost events", 4, "events"}));
}

TEST_F(TraceRunnerTest, EventsBeyondWhatAllRunnersMayKeepAreLostAndCounted) {
    const TraceRunnerPlatform shared{
        files_, metricsheet_, process_, spoor_, queues_, "", std::make_shared<TracePointBudget>(5)};
    runner_ = std::make_unique<TraceRunner>(shared);
    createOne();
    runner().runTraces();
    TraceRunner second(shared);
    TraceParams params = makeParams("second");
    addPoint(params, "open", kBegin, kEnd);
    second.createTraceFromTraceParams(&params);
    replay({eventAt(1, kBegin), eventAt(4, kEnd), eventAt(5, kBegin), eventAt(9, kEnd)});
    second.runTraces();
    replay({eventAt(10, kBegin), eventAt(20, kEnd)});
    stop();
    // The first runner took all that there was.
    EXPECT_THAT(written(), ElementsAre(nanoseconds("open", 3), nanoseconds("open", 4),
                                       FakeMetricsheet::Value{"lost events", 1, "events"}));
    replay({eventAt(30, kBegin), eventAt(40, kEnd)});
    second.stopTracingandProcessResults();
    EXPECT_THAT(written(), ElementsAre(nanoseconds("open", 10), FakeMetricsheet::Value{"lost events", 2, "events"}));
}

TEST_F(TraceRunnerTest, ForgottenResultsAreNotWrittenAgain) {
    createOne();
    runner().runTraces();
    replay({eventAt(1, kBegin), eventAt(4, kEnd)});
    stop();
    EXPECT_THAT(written(), ElementsAre(nanoseconds("open", 3)));
    EXPECT_EQ(timeline()["traceEvents"].size(), 1U);
    runner().forgetResults();
    stop();
    EXPECT_THAT(written(), IsEmpty());
    EXPECT_EQ(timeline()["traceEvents"].size(), 0U);
}

class TracePointListTest : public ::testing::Test {
protected:
    static void add(TracePointList& list, std::uint64_t count) {
        for (std::uint64_t time = 1; time <= count; ++time) {
            list.add(eventAt(time, kBegin));
        }
    }

    const std::shared_ptr<TracePointBudget> budget_ = std::make_shared<TracePointBudget>(20'000);
};

TEST_F(TracePointListTest, ThereIsMemoryForTenThousandEventsAtOnce) {
    const TracePointList list(budget_);
    EXPECT_EQ(list.capacity(), 10'000U);
    EXPECT_EQ(budget_->take(30'000), 20'000U) << "nothing is kept yet";
}

TEST_F(TracePointListTest, EventsBeyondItsRoomAreCounted) {
    TracePointList list(budget_, 2);
    add(list, 5);
    ASSERT_EQ(list.points().size(), 2U);
    EXPECT_EQ(list.points()[1].timestamp, 2U);
    EXPECT_EQ(list.lost(), 3U);
    list.clear();
    EXPECT_EQ(list.points().size(), 0U);
    EXPECT_EQ(list.lost(), 3U);
}

TEST_F(TracePointListTest, ItsMemoryIsThatOfItsRoomAtMost) {
    TracePointList list(budget_, 12'345);
    add(list, 12'345);
    EXPECT_EQ(list.points().size(), 12'345U);
    EXPECT_EQ(list.capacity(), 12'345U);
}

TEST_F(TracePointListTest, ListsShareWhatTheyMayKeep) {
    TracePointList first(budget_);
    TracePointList second(budget_);
    add(first, 15'000);
    add(second, 15'000);
    EXPECT_EQ(first.points().size(), 15'000U);
    EXPECT_EQ(first.lost(), 0U);
    // The first one took 15 times 1,024.
    EXPECT_EQ(second.points().size(), 4'640U);
    EXPECT_EQ(second.lost(), 10'360U);
    first.clear();
    add(second, 10);
    EXPECT_EQ(second.points().size(), 4'650U);
    EXPECT_EQ(second.lost(), 10'360U);
}

TEST_F(TracePointListTest, AListThatGoesGivesItsPartBack) {
    {
        TracePointList list(budget_);
        add(list, 20'000);
        EXPECT_EQ(list.points().size(), 20'000U);
        EXPECT_EQ(budget_->take(1), 0U);
    }
    EXPECT_EQ(budget_->take(30'000), 20'000U);
}

TEST_F(TracePointListTest, AServiceKeepsEightMillionEventsAndATraceHalfOfThem) {
    EXPECT_EQ(TracePointBudget().take(10'000'000), 8'388'608U);
    EXPECT_EQ(TracePointList::kMostPoints, 4'194'304U);
    EXPECT_EQ(sizeof(trace_point), 72U);
}

// The picture.

TEST_F(TraceRunnerTest, ThePictureStandsBesideTheResults) {
    TraceParams params = makeParams("start");
    addPoint(params, "open", kBegin, kEnd);
    create(params);
    create(makeParams("signposts", kTraceTypeMilestone));
    runner().runTraces();
    trace_point end = eventAt(4'500, kEnd, 9);
    end.processID = 12;
    replay({eventAt(1'000, kBegin, 9), end});
    stop();
    EXPECT_EQ(files_.permissionsOf(kTimeline), 0644U);
    EXPECT_EQ(timeline(), nlohmann::json::parse(R"({"displayTimeUnit": "ns",
        "otherData": {"writer": "VelaReporting", "version": 4, "intervalsLeftOut": 0, "lostEvents": 0},
        "traceEvents": [{"ph": "X", "name": "open", "cat": "start", "ts": 1.0, "dur": 3.5, "pid": 12, "tid": 9}]})"));
}

TEST_F(TraceRunnerTest, APictureThatCannotBeWrittenIsLoggedOnly) {
    files_.failOn(kTimeline, ENOSPC);
    createOne();
    runner().runTraces();
    stop();
    EXPECT_EQ(log_.lines().back(),
              runnerLine(LogLevel::Error, std::string("can't write trace timeline at ") + kTimeline + ": write " +
                                              kTimeline + ": No space left on device"));
    EXPECT_TRUE(metricsheet_.files()[0].closed);
    EXPECT_THAT(process_.statuses(), IsEmpty());
}

} // namespace

} // namespace vela
