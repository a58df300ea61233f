// A session's performance trace: which kind is chosen, its set-up, its end, and what the platform tells of it.
#include "session/SessionTracing_test.h"
#include "session/VelaReportingSessionTracing.h"

namespace vela {

namespace {

using namespace std::chrono_literals;
using platform::Failure;
using ::testing::AllOf;
using ::testing::Contains;
using ::testing::Each;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::Not;

using VelaReportingSessionTracingTest = SessionTracingTest;

constexpr const char* kTypeKey = "VelaReportingTraceType";
constexpr const char* kPathKey = "VelaReportingKilnPlistFilePath";

// Whether there is a trace.

TEST_F(VelaReportingSessionTracingTest, SessionsOfOtherTypesAreNotTraced) {
    for (const std::uint16_t type : std::vector<std::uint16_t>{0, 1, 2, 10, 12, 13, 14, 65535}) {
        testSession({{kTypeKey, "rtscope"}, {kPathKey, kPath}}).setServiceType(type);
        session().start();
        EXPECT_FALSE(tracing().startedTracing()) << type;
        session().stop();
        release();
    }
    EXPECT_FALSE(probeWasUsed());
    EXPECT_FALSE(kernelTraceRan());
}

TEST_F(VelaReportingSessionTracingTest, WithoutTheFeatureNothingIsTraced) {
    setFeature(false);
    testSession({{kTypeKey, VelaReportingTraceTypeSpoor}, {kPathKey, kPath}}).start();
    EXPECT_FALSE(tracing().startedTracing());
    EXPECT_FALSE(probeWasUsed());
    EXPECT_FALSE(kernelTraceRan());
    session().stop();
    EXPECT_THAT(linesOfTraces(), IsEmpty());
}

TEST_F(VelaReportingSessionTracingTest, ATraceThatRunsIsNotStartedAgain) {
    testSession().start();
    setFeature(false);
    session().stop(); // does not see it
    setFeature(true);
    probe_.clear();
    session().start();
    EXPECT_TRUE(tracing().startedTracing());
    EXPECT_FALSE(probeWasUsed());
}

TEST_F(VelaReportingSessionTracingTest, WithoutAPlatformForTracesThereAreNone) {
    platform_.tracing = nullptr;
    testSession().start();
    EXPECT_EQ(session().tracing(), nullptr);
    EXPECT_EQ(session().getProbeTraceFileURL(), std::nullopt);
    session().stop();
}

TEST_F(VelaReportingSessionTracingTest, ASecondStartOfASessionStartsNoTrace) {
    testSession().start();
    probe_.clear();
    session().start();
    EXPECT_FALSE(probeWasUsed());
}

TEST_F(VelaReportingSessionTracingTest, TheTraceStartsBehindTheRestOfTheStart) {
    testSession();
    spoor_.clear();
    bool observed = false;
    probe_.setObserver([&](const std::string& call) {
        if (call == "makeProbeTraceConfig 1") {
            observed = true;
            EXPECT_TRUE(session().started());
            EXPECT_TRUE(listExists(session()));
            EXPECT_THAT(spoor_.codes(), ElementsAre(0x2104482C));
            EXPECT_EQ(queues_.pendingItems(), 1U); // the set-up of real-time reporting
        }
    });
    session().start();
    EXPECT_TRUE(observed);
}

// Which trace.

TEST_F(VelaReportingSessionTracingTest, WithoutATypeAFileMeansTheKernelTrace) {
    kernelSession().start();
    EXPECT_TRUE(tracing().startedTracing());
    EXPECT_TRUE(kernelTraceRan());
    EXPECT_FALSE(probeWasUsed());
}

TEST_F(VelaReportingSessionTracingTest, TheServicesOwnConstantMeansTheKernelTrace) {
    testSession({{kTypeKey, VelaReportingTraceTypeSpoor}, {kPathKey, kPath}}).start();
    EXPECT_TRUE(kernelTraceRan());
    EXPECT_FALSE(probeWasUsed());
}

TEST_F(VelaReportingSessionTracingTest, TheConstantKeepsItsIdentityInAConfiguration) {
    testSession({{kTypeKey, VelaReportingTraceTypeSpoor}});
    session().updateConfigurationWithContentsOfConfiguration({{kPathKey, kPath}, {"other", 1}});
    session().start();
    EXPECT_TRUE(kernelTraceRan());
}

TEST_F(VelaReportingSessionTracingTest, TheSameTextFromElsewhereMeansThePlatformTrace) {
    testSession({{kTypeKey, "spoor"}, {kPathKey, kPath}}).start();
    EXPECT_TRUE(probeWasUsed());
    EXPECT_FALSE(kernelTraceRan());
    EXPECT_EQ(tracing().tracingFileName(), std::nullopt);
}

TEST_F(VelaReportingSessionTracingTest, AnyOtherTypeMeansThePlatformTrace) {
    for (const Value& type : {Value("rtscope"), Value(""), Value(1), Value(true), Value(Dictionary())}) {
        probe_.clear();
        testSession({{kTypeKey, type}, {kPathKey, kPath}}).start();
        EXPECT_TRUE(probeWasUsed());
        release();
    }
    EXPECT_FALSE(kernelTraceRan());
}

TEST_F(VelaReportingSessionTracingTest, WithNeitherTypeNorFileThePlatformTraceRuns) {
    testSession().start();
    EXPECT_THAT(probe_.calls(),
                ElementsAre("makeProbeTraceConfig 1", "createProbeTraceSession 1", "setDelegate", "startProbeTrace"));
    EXPECT_TRUE(tracing().startedTracing());
    EXPECT_FALSE(kernelTraceRan());
}

TEST_F(VelaReportingSessionTracingTest, WithTheConstantAndNoFileThePlatformTraceRuns) {
    testSession({{kTypeKey, VelaReportingTraceTypeSpoor}}).start();
    EXPECT_TRUE(probeWasUsed());
    EXPECT_FALSE(kernelTraceRan());
}

// The kernel trace.

TEST_F(VelaReportingSessionTracingTest, TheKernelTracesStartIsLogged) {
    kernelSession().start();
    EXPECT_THAT(log_.linesOf("velarr"),
                ElementsAre(sessionLine(LogLevel::Debug, "starting session owned by 42"),
                            sessionLine(LogLevel::Debug, "Got the tracefile /srv/traces.plist, setting up trace"),
                            sessionLine(LogLevel::Info, "Setting up tracing for test")));
    for (const auto& record : log_.records()) {
        EXPECT_EQ(record.reporter, std::optional<std::int64_t>(42)) << record.text;
    }
}

TEST_F(VelaReportingSessionTracingTest, TheKernelTracesPropertiesAreSet) {
    kernelSession().start();
    EXPECT_EQ(tracing().tracingFileName(), kPath);
    ASSERT_NE(tracing().traceParams(), nullptr);
    EXPECT_EQ(tracing().traceParams()->name, "T");
    ASSERT_NE(tracing().traceRunner(), nullptr);
    EXPECT_EQ(tracing().traceRunner()->getNumTraces(), 1U);
    EXPECT_EQ(tracing().traceConfig(), nullptr);
    EXPECT_EQ(tracing().traceSession(), nullptr);
}

TEST_F(VelaReportingSessionTracingTest, TheFileIsReadWithTheClientsRights) {
    kernelSession().start();
    EXPECT_THAT(fileSystem_.readers(), ElementsAre(platform::Identity{1000, 1000, {29}}));
}

TEST_F(VelaReportingSessionTracingTest, AnUnknownClientsFileIsNotReadAndTheTraceRunsWithoutPoints) {
    client_.reset();
    kernelSession().start();
    EXPECT_THAT(fileSystem_.readers(), IsEmpty());
    EXPECT_EQ(tracing().traceParams()->name, "");
    EXPECT_TRUE(tracing().startedTracing());
}

TEST_F(VelaReportingSessionTracingTest, AFileThatCannotBeLoadedStillRunsAndWritesEmptyResults) {
    testSession({{kPathKey, "/missing"}}).start();
    EXPECT_EQ(tracing().tracingFileName(), "/missing");
    EXPECT_TRUE(tracing().traceParams()->dataParams.empty());
    EXPECT_TRUE(tracing().startedTracing());
    EXPECT_TRUE(kernelTraceRan());
    session().stop();
    ASSERT_EQ(metricsheet_.files().size(), 1U);
    EXPECT_TRUE(metricsheet_.files().at(0).closed);
    EXPECT_THAT(metricsheet_.files().at(0).values, IsEmpty());
}

TEST_F(VelaReportingSessionTracingTest, AnEmptyPathIsAPath) {
    testSession({{kPathKey, ""}}).start();
    EXPECT_EQ(tracing().tracingFileName(), "");
    EXPECT_TRUE(tracing().startedTracing());
    EXPECT_TRUE(kernelTraceRan());
}

TEST_F(VelaReportingSessionTracingTest, APathThatIsNoTextStartsNothing) {
    testSession({{kPathKey, 5}}).start();
    EXPECT_FALSE(tracing().startedTracing());
    EXPECT_FALSE(kernelTraceRan());
    EXPECT_FALSE(probeWasUsed());
    EXPECT_THAT(log_.linesOf("velarr"),
                ElementsAre(sessionLine(LogLevel::Debug, "starting session owned by 42"),
                            sessionLine(LogLevel::Debug, "Got the tracefile 5, setting up trace"),
                            sessionLine(LogLevel::Error, "TracefileName empty. Failed to setup tracing")));
}

TEST_F(VelaReportingSessionTracingTest, APathThatIsNoTextDoesNotRunAnEarlierTraceAgain) {
    kernelSession().start();
    spoor_.emit(0x21040010);
    spoor_.emit(0x21040014);
    session().stop();
    ASSERT_EQ(metricsheet_.files().size(), 1U);
    spoor_.clear();
    testSession({{kPathKey, 5}}).start();
    EXPECT_FALSE(tracing().startedTracing());
    EXPECT_FALSE(kernelTraceRan());
    session().stop();
    EXPECT_EQ(spoor_.calls().size(), 0U);
    EXPECT_EQ(metricsheet_.files().size(), 1U);
    EXPECT_FALSE(probeWasUsed());
}

TEST_F(VelaReportingSessionTracingTest, SettingUpWithoutAPathChangesNothing) {
    kernelSession().start();
    const TraceRunner* const runner = tracing().traceRunner();
    log_.clear();
    tracing().setupTracing(std::nullopt, "test");
    EXPECT_EQ(tracing().tracingFileName(), kPath);
    EXPECT_EQ(tracing().traceRunner(), runner);
    EXPECT_TRUE(tracing().startedTracing());
    EXPECT_THAT(log_.lines(),
                ElementsAre(sessionLine(LogLevel::Error, "TracefileName empty. Failed to setup tracing")));
    session().stop();
}

TEST_F(VelaReportingSessionTracingTest, SettingUpEndsWithNothingStarted) {
    testSession().start(); // a platform trace
    log_.clear();
    tracing().setupTracing(kPath, "test");
    EXPECT_FALSE(tracing().startedTracing());
    EXPECT_EQ(log_.lines().back(), sessionLine(LogLevel::Info, "Setting up tracing for test"));
    EXPECT_FALSE(kernelTraceRan());
}

TEST_F(VelaReportingSessionTracingTest, TheStopEndsTheKernelTraceAndWritesItsResults) {
    kernelSession().start();
    queues_.runUntilIdle();
    spoor_.emit(0x21040010);
    spoor_.emit(0x21040014);
    session().stop();
    EXPECT_FALSE(tracing().startedTracing());
    ASSERT_EQ(metricsheet_.files().size(), 1U);
    EXPECT_TRUE(metricsheet_.files().at(0).closed);
    ASSERT_FALSE(metricsheet_.files().at(0).values.empty());
    EXPECT_THAT(metricsheet_.files().at(0).values.at(0).name, ::testing::HasSubstr("open"));
    EXPECT_EQ(tracing().tracingFileName(), kPath);
    EXPECT_FALSE(probeWasUsed());
    EXPECT_THAT(processControl_.statuses(), IsEmpty());
}

TEST_F(VelaReportingSessionTracingTest, EveryStartHasARunnerOfItsOwn) {
    kernelSession().start();
    session().stop();
    session().start();
    EXPECT_TRUE(tracing().startedTracing());
    EXPECT_EQ(tracing().traceRunner()->getNumTraces(), 1U);
    session().stop();
    EXPECT_EQ(metricsheet_.files().size(), 2U);
    EXPECT_EQ(fileSystem_.readers().size(), 2U);
}

TEST_F(VelaReportingSessionTracingTest, TheKindIsDecidedAnewAtTheStop) {
    kernelSession().start();
    session().setConfiguration(Dictionary{{kTypeKey, "spoor"}});
    complete(); // what the stop is going to wait for
    session().stop();
    EXPECT_FALSE(tracing().startedTracing());
    EXPECT_THAT(metricsheet_.files(), IsEmpty());
    EXPECT_FALSE(probeWasUsed()); // there is no trace of the platform to stop
}

TEST_F(VelaReportingSessionTracingTest, TheNextStartMayBeOfTheOtherKind) {
    completeWhenStopped();
    kernelSession().start();
    session().stop();
    session().setConfiguration(Dictionary{{kTypeKey, "other"}});
    session().start();
    EXPECT_EQ(probe_.calls().back(), "startProbeTrace");
    EXPECT_EQ(tracing().tracingFileName(), kPath); // stays
    session().stop();
    EXPECT_EQ(metricsheet_.files().size(), 1U);
    EXPECT_EQ(session().getProbeTraceFileURL(), "file:///traces/a.data");
}

TEST_F(VelaReportingSessionTracingTest, APlatformTraceBecomesAKernelTraceWhenAPathIsSet) {
    completeWhenStopped();
    testSession().start();
    session().stop();
    session().setConfiguration(Dictionary{{kPathKey, kPath}});
    session().start();
    EXPECT_TRUE(kernelTraceRan());
    session().stop();
    EXPECT_EQ(metricsheet_.files().size(), 1U);
}

// The platform trace.

TEST_F(VelaReportingSessionTracingTest, EverythingIsStoredBeforeThePlatformTraceStarts) {
    testSession();
    bool observed = false;
    probe_.setObserver([&](const std::string& call) {
        if (call == "startProbeTrace") {
            observed = true;
            EXPECT_TRUE(tracing().startedTracing());
            EXPECT_NE(tracing().traceConfig(), nullptr);
            EXPECT_NE(tracing().traceSession(), nullptr);
            EXPECT_EQ(probe_.delegate().get(), &tracing());
        }
    });
    session().start();
    EXPECT_TRUE(observed);
}

TEST_F(VelaReportingSessionTracingTest, TheStopStopsThePlatformTraceAndWaitsForItsEnd) {
    completeWhenStopped();
    testSession().start();
    probe_.clear();
    session().stop();
    EXPECT_THAT(probe_.calls(), ElementsAre("stopProbeTrace", "setDelegate null", "released"));
    EXPECT_FALSE(tracing().startedTracing());
    EXPECT_FALSE(session().started());
}

TEST_F(VelaReportingSessionTracingTest, TheTraceEndsBehindTheEndOfRealTimeReportingAndBeforeTheList) {
    testSession().start();
    queues_.runUntilIdle();
    bool observed = false;
    probe_.setObserver([&](const std::string& call) {
        if (call == "stopProbeTrace") {
            observed = true;
            EXPECT_FALSE(tracing().startedTracing());
            EXPECT_TRUE(session().started());
            EXPECT_TRUE(listExists(session()));
            EXPECT_EQ(queues_.pendingItems(), 1U);
            complete();
        }
    });
    session().stop();
    EXPECT_TRUE(observed);
    EXPECT_FALSE(listExists(session()));
}

TEST_F(VelaReportingSessionTracingTest, ACompletionAheadOfTheWaitCounts) {
    testSession().start();
    complete();
    session().stop();
    EXPECT_FALSE(session().started());
    EXPECT_THAT(probe_.calls(), Not(Contains("stopProbeTrace"))); // it was over
}

TEST_F(VelaReportingSessionTracingTest, TheWaitHasNoTimeLimit) {
    testSession().start();
    const auto before = clock_.monotonicNow();
    bool stopped = false;
    queues_.background().postAfter(1h, [&] {
        EXPECT_FALSE(stopped);
        complete();
    });
    session().stop();
    stopped = true;
    EXPECT_EQ(clock_.monotonicNow() - before, 1h);
}

TEST_F(VelaReportingSessionTracingTest, ThePoolIsToldOfTheWait) {
    testSession().start();
    unsigned depth = 0;
    probe_.setObserver([&](const std::string& call) {
        if (call == "stopProbeTrace") {
            depth = queues_.blockingDepth();
            complete();
        }
    });
    queues_.background().post([this] { session().stop(); });
    queues_.runUntilIdle();
    EXPECT_EQ(depth, 1U);
    EXPECT_EQ(queues_.blockingDepth(), 0U);
}

TEST_F(VelaReportingSessionTracingTest, ACompletionThatNobodyWaitedForEndsTheNextWait) {
    completeWhenStopped();
    testSession();
    complete();
    session().start();
    session().stop(); // takes the first; its own is left
    session().start();
    session().stop();
    EXPECT_FALSE(session().started());
}

TEST_F(VelaReportingSessionTracingTest, TheFeatureIsAskedForAgainAtTheStop) {
    testSession().start();
    probe_.clear();
    setFeature(false);
    session().stop();
    EXPECT_FALSE(probeWasUsed());
    EXPECT_TRUE(tracing().startedTracing());
}

TEST_F(VelaReportingSessionTracingTest, AnotherTypeAtTheStopLeavesTheTraceRunning) {
    testSession().start();
    probe_.clear();
    session().setServiceType(1);
    session().stop();
    EXPECT_FALSE(probeWasUsed());
    EXPECT_TRUE(tracing().startedTracing());
}

// What the platform tells.

TEST_F(VelaReportingSessionTracingTest, AStartIsTold) {
    testSession().start();
    log_.clear();
    probe_.delegate()->performanceTraceDidStart(std::nullopt);
    EXPECT_THAT(log_.lines(), ElementsAre(traceLine(LogLevel::Default, "started performance trace."),
                                          traceLine(LogLevel::Info, "Performance Trace Started")));
    EXPECT_NE(tracing().traceSession(), nullptr);
    EXPECT_NE(tracing().traceConfig(), nullptr);
}

TEST_F(VelaReportingSessionTracingTest, AStartThatFailsLetsSessionAndConfigurationGo) {
    testSession().start();
    log_.clear();
    probe_.delegate()->performanceTraceDidStart(Failure{1, "there is no perf"});
    EXPECT_THAT(log_.lines(), ElementsAre(traceLine(LogLevel::Default, "started performance trace."),
                                          traceLine(LogLevel::Error, "performanceTraceDidStart there is no perf")));
    EXPECT_EQ(tracing().traceSession(), nullptr);
    EXPECT_EQ(tracing().traceConfig(), nullptr);
    EXPECT_TRUE(tracing().startedTracing());
}

TEST_F(VelaReportingSessionTracingTest, AfterAFailedStartTheStopStopsNothingAndWaits) {
    testSession().start();
    probe_.delegate()->performanceTraceDidStart(Failure{1, "there is no perf"});
    probe_.clear();
    const auto before = clock_.monotonicNow();
    queues_.background().postAfter(1min, [this] { complete({}, Failure{1, "there is no perf"}); });
    session().stop();
    EXPECT_FALSE(probeWasUsed());
    EXPECT_EQ(clock_.monotonicNow() - before, 1min);
}

TEST_F(VelaReportingSessionTracingTest, AnEndOfTheCollectionIsTold) {
    testSession().start();
    log_.clear();
    probe_.delegate()->performanceTraceDidStop(std::nullopt);
    EXPECT_THAT(log_.lines(), ElementsAre(traceLine(LogLevel::Info, "Performance Trace Stopped")));
    EXPECT_NE(tracing().traceSession(), nullptr);
}

TEST_F(VelaReportingSessionTracingTest, AnEndThatFailsLetsTheSessionGo) {
    testSession().start();
    log_.clear();
    probe_.delegate()->performanceTraceDidStop(Failure{1, "killed"});
    EXPECT_THAT(log_.lines(), ElementsAre(traceLine(LogLevel::Error, "performanceTraceDidStop killed")));
    EXPECT_EQ(tracing().traceSession(), nullptr);
    EXPECT_NE(tracing().traceConfig(), nullptr);
}

TEST_F(VelaReportingSessionTracingTest, ACompletionGivesTheFile) {
    testSession().start();
    EXPECT_EQ(session().getProbeTraceFileURL(), std::nullopt);
    log_.clear();
    probe_.delegate()->performanceTraceDidComplete("file:///traces/a%20b.data", "token", std::nullopt);
    EXPECT_THAT(log_.lines(), ElementsAre(traceLine(LogLevel::Info, "Performance Trace Completed: /traces/a b.data")));
    EXPECT_EQ(session().getProbeTraceFileURL(), "file:///traces/a%20b.data");
    EXPECT_EQ(tracing().traceSession(), nullptr);
    EXPECT_EQ(probe_.delegate(), nullptr);
}

TEST_F(VelaReportingSessionTracingTest, ACompletionWithAnErrorGivesNone) {
    testSession().start();
    complete("file:///traces/first.data");
    log_.clear();
    complete("file:///traces/second.data", Failure{28, "No space left on device"});
    EXPECT_THAT(log_.lines(),
                ElementsAre(traceLine(LogLevel::Error, "performanceTraceDidComplete No space left on device")));
    EXPECT_EQ(session().getProbeTraceFileURL(), "file:///traces/first.data");
}

TEST_F(VelaReportingSessionTracingTest, TheDelegateIsTakenOffBeforeTheSessionIsLetGo) {
    testSession().start();
    bool observed = false;
    probe_.setObserver([&](const std::string& call) {
        if (call == "setDelegate null") {
            observed = true;
            EXPECT_NE(tracing().traceSession(), nullptr);
            EXPECT_EQ(tracing().finalTraceURL(), std::nullopt);
        }
    });
    complete();
    EXPECT_TRUE(observed);
}

TEST_F(VelaReportingSessionTracingTest, WhatThePlatformTellsIsAboutTheReporter) {
    testSession().start();
    log_.clear();
    const auto delegate = probe_.delegate();
    delegate->performanceTraceDidStart(std::nullopt);
    delegate->performanceTraceDidStop(std::nullopt);
    delegate->performanceTraceDidComplete("file:///a", "", std::nullopt);
    EXPECT_EQ(log_.records().size(), 4U);
    for (const auto& record : log_.records()) {
        EXPECT_EQ(record.reporter, std::optional<std::int64_t>(42)) << record.text;
    }
}

// Release.

TEST_F(VelaReportingSessionTracingTest, ASessionThatIsReleasedWhileItsTraceRunsIsNotCalledAnyMore) {
    testSession().start();
    queues_.runUntilIdle();
    release();
    EXPECT_EQ(probe_.delegate(), nullptr);
    EXPECT_EQ(probe_.calls().back(), "released");
}

TEST_F(VelaReportingSessionTracingTest, ASessionMayBeReleasedWhileItIsTold) {
    testSession().start();
    queues_.runUntilIdle();
    const auto delegate = probe_.delegate();
    probe_.setObserver([this](const std::string& call) {
        if (call == "setDelegate null") {
            release();
        }
    });
    delegate->performanceTraceDidComplete("file:///a", "token", std::nullopt);
    EXPECT_EQ(linesSaying("Performance Trace Completed: /a"), 1U);
}

TEST_F(VelaReportingSessionTracingTest, ASessionMayBeReleasedWhileItsKernelTraceRuns) {
    kernelSession().start();
    queues_.runUntilIdle();
    EXPECT_EQ(spoor_.liveSessions(), 1U);
    release();
    spoor_.emit(0x21040010);
    EXPECT_EQ(spoor_.liveSessions(), 0U);
    EXPECT_THAT(metricsheet_.files(), IsEmpty());
}

} // namespace

} // namespace vela
