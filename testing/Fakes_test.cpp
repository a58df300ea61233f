// The fakes keep the contracts that the real ones keep, and do what tests ask of them.
#include "common/VelaReportingLogCategories.h"
#include "testing/CapturingLog.h"
#include "testing/DevicePropertiesContract.h"
#include "testing/FakeDeviceProperties.h"
#include "testing/FakeFileSystem.h"
#include "testing/FakeMetricsheet.h"
#include "testing/FakeNotifications.h"
#include "testing/FakePreferences.h"
#include "testing/FakeProcessInformation.h"
#include "testing/FakeSpoor.h"
#include "testing/FileSystemContract.h"
#include "testing/ManualClock.h"
#include "testing/ManualWorkQueues.h"
#include "testing/NotificationsContract.h"
#include "testing/PreferencesContract.h"
#include "testing/ProcessInformationContract.h"
#include "testing/SpoorContract.h"

#include <cerrno>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::testing {

namespace {

using platform::LogLevel;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

struct FileSystemHarness {
    FileSystemHarness() { EXPECT_TRUE(fileSystem_.createDirectories("/root", 0755)); }
    FakeFileSystem& fileSystem() { return fileSystem_; }
    std::string root() { return "/root"; }
    std::optional<std::uint32_t> permissionsOf(const std::string& path) { return fileSystem_.permissionsOf(path); }
    std::vector<std::string> filesBelow() { return fileSystem_.files(); }
    void limitFileSize(std::optional<std::size_t> bytes) { fileSystem_.limitFileSize(bytes); }
    bool own(const std::string& path, std::uint32_t user, std::uint32_t group) {
        fileSystem_.setOwner(path, user, group);
        return true;
    }

    FakeFileSystem fileSystem_;
};

struct ProcessInformationHarness {
    ProcessInformationHarness() {
        processes_.add({.pid = 200, .parent = 100, .commandName = "velachild", .startTimeTicks = 20});
        processes_.add({.pid = 201, .parent = 100, .commandName = "velagone", .startTimeTicks = 21});
        processes_.remove(201);
    }
    const platform::ProcessInformation& processes() { return processes_; }
    std::int32_t child() { return 200; }
    std::int32_t gone() { return 201; }

    FakeProcessInformation processes_{100, "vela-test"};
};

struct SpoorHarness {
    platform::Spoor& spoor() { return spoor_; }
    platform::SerialQueue& queue() { return *queue_; }
    bool waitFor(const std::function<bool()>& condition) {
        queues_.runUntilIdle();
        return condition();
    }
    void settle() { queues_.runUntilIdle(); }
    bool makeStartsFail() {
        spoor_.failStart(ENOTSUP);
        return true;
    }

    ManualClock clock_;
    ManualWorkQueues queues_{clock_};
    FakeSpoor spoor_;
    std::unique_ptr<platform::SerialQueue> queue_ =
        queues_.makeSerialQueue("Tracing Queue", platform::QualityOfService::Default);
};

struct PreferencesHarness {
    const platform::Preferences& preferences() { return preferences_; }
    void set(std::string_view domain, std::string_view key, Value value) {
        preferences_.set(domain, key, std::move(value));
    }
    void remove(std::string_view domain, std::string_view key) { preferences_.remove(domain, key); }

    FakePreferences preferences_;
};

struct NotificationsHarness {
    platform::Notifications& notifications() { return notifications_; }
    std::unique_ptr<platform::SerialQueue> makeQueue() {
        return queues_.makeSerialQueue("notified", platform::QualityOfService::Default);
    }
    void post(std::string_view name) { notifications_.post(name); }
    void post(std::string_view name, std::uint64_t state) {
        notifications_.setState(name, state);
        notifications_.post(name);
    }
    template <class Done>
    void settle(const Done& done) {
        queues_.runUntilIdle();
        EXPECT_TRUE(done());
    }

    ManualClock clock_;
    ManualWorkQueues queues_{clock_};
    FakeNotifications notifications_;
};

struct DevicePropertiesHarness {
    DevicePropertiesHarness() {
        properties_.setFeature("AudioAnalytics", "Tracing", true);
        properties_.setFeature("AudioAnalytics", "Gauges", false);
    }
    const platform::DeviceProperties& properties(bool internalBuild) {
        properties_.setBoolean("InternalBuild", internalBuild);
        return properties_;
    }

    FakeDeviceProperties properties_;
};

} // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, FileSystemContract, FileSystemHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Fake, NotificationsContract, NotificationsHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Fake, PreferencesContract, PreferencesHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Fake, ProcessInformationContract, ProcessInformationHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Fake, DevicePropertiesContract, DevicePropertiesHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Fake, SpoorContract, SpoorHarness);

namespace {

TEST(FakeFileSystemTest, AnErrorThatWasAskedForIsMetOnThatPathOnly) {
    FakeFileSystem fileSystem;
    fileSystem.addFile("/state/a", "old");
    fileSystem.addFile("/state/b", "old");
    fileSystem.failOn("/state/a", ENOSPC);
    const auto written = fileSystem.writeFileAtomically("/state/a", "new", 0644);
    ASSERT_FALSE(written);
    EXPECT_EQ(written.failure().code, ENOSPC);
    EXPECT_EQ(written.failure().description, "write /state/a: No space left on device");
    EXPECT_EQ(fileSystem.readFile("/state/a", 100).failure().code, ENOSPC);
    EXPECT_EQ(fileSystem.contentOf("/state/a"), "old");
    EXPECT_TRUE(fileSystem.writeFileAtomically("/state/b", "new", 0644));
    fileSystem.failOn("/state/a", 0);
    EXPECT_TRUE(fileSystem.writeFileAtomically("/state/a", "new", 0644));
}

TEST(FakeFileSystemTest, AFolderThatCannotBeMadeIsNot) {
    FakeFileSystem fileSystem;
    fileSystem.failOn("/a/b", EACCES);
    EXPECT_EQ(fileSystem.createDirectories("/a/b", 0755).failure().code, EACCES);
    EXPECT_EQ(fileSystem.permissionsOf("/a/b"), std::nullopt);
}

TEST(FakeFileSystemTest, TheCurrentDirectoryIsTheOneThatWasSet) {
    FakeFileSystem fileSystem;
    EXPECT_EQ(fileSystem.currentDirectory(), "/");
    fileSystem.setCurrentDirectory("/srv");
    EXPECT_EQ(fileSystem.currentDirectory(), "/srv");
}

platform::SpoorEvent eventAt(std::uint64_t timestamp, std::uint32_t code) {
    platform::SpoorEvent event;
    event.timestamp = timestamp;
    event.eventCode = code;
    return event;
}

class FakeSpoorTest : public ::testing::Test {
protected:
    std::unique_ptr<platform::SpoorSession> makeSession() {
        auto session = harness_.spoor_.createSession();
        session->setCompletionHandler([this] { collected_.complete(); });
        range_ = session->eventsRange(1, 9, [this](const auto& event) { collected_.add(event); });
        start_ = session->start(harness_.queue());
        return session;
    }

    SpoorHarness harness_;
    CollectedEvents collected_;
    int range_ = 0;
    int start_ = 0;
};

TEST_F(FakeSpoorTest, EventsAreReplayedAsTheyAre) {
    const auto session = makeSession();
    harness_.spoor_.replay({eventAt(70, 9), eventAt(50, 10), eventAt(30, 1)});
    EXPECT_EQ(collected_.size(), 0U);
    harness_.settle();
    ASSERT_THAT(collected_.codes(), ElementsAre(9, 1));
    EXPECT_EQ(collected_.events()[1].timestamp, 30U);
    EXPECT_THAT(harness_.spoor_.codes(), IsEmpty());
}

TEST_F(FakeSpoorTest, TimesHaveTheUnitThatWasSet) {
    harness_.spoor_.setTimeUnit(125, 3);
    const auto session = makeSession();
    EXPECT_EQ(session->nanoseconds(1), 41U);
    EXPECT_EQ(session->nanoseconds(3), 125U);
}

TEST_F(FakeSpoorTest, ErrorsAreAnswered) {
    harness_.spoor_.failRange(5);
    harness_.spoor_.failStart(7);
    harness_.spoor_.failEnd(9);
    harness_.spoor_.loseEvents(11);
    const auto session = makeSession();
    EXPECT_EQ(range_, 5);
    EXPECT_EQ(start_, 7);
    EXPECT_EQ(session->end(), 9);
    EXPECT_EQ(session->lostEvents(), 11U);
    harness_.settle();
    EXPECT_EQ(collected_.completions(), 0);
}

TEST_F(FakeSpoorTest, ACompletionCanBeHeldBack) {
    harness_.spoor_.setCompletes(false);
    const auto session = makeSession();
    EXPECT_EQ(session->end(), 0);
    harness_.settle();
    EXPECT_EQ(collected_.completions(), 0);
    harness_.spoor_.completeEndedSessions();
    harness_.spoor_.completeEndedSessions();
    harness_.settle();
    EXPECT_EQ(collected_.completions(), 1);
}

TEST_F(FakeSpoorTest, WhatIsAskedForIsKept) {
    makeSession()->setWallTimesEnabled(true);
    EXPECT_THAT(harness_.spoor_.calls(), ElementsAre("create", "completion handler", "range 0x1-0x9",
                                                     "start Tracing Queue", "wall times on", "destroy"));
    EXPECT_EQ(harness_.spoor_.liveSessions(), 0U);
}

TEST(FakeMetricsheetTest, FilesAreKeptAndFaultsComeOnDemand) {
    FakeMetricsheet metricsheet;
    const auto writer = metricsheet.openWriter("/a.msj", "VelaReporting", 4);
    writer->newValue("one", 1.5, "nanoseconds");
    EXPECT_FALSE(metricsheet.files()[0].closed);
    EXPECT_TRUE(writer->close());
    EXPECT_TRUE(metricsheet.files()[0].closed);
    EXPECT_EQ(metricsheet.files()[0].path, "/a.msj");
    EXPECT_EQ(metricsheet.files()[0].writerName, "VelaReporting");
    EXPECT_EQ(metricsheet.files()[0].version, 4U);
    EXPECT_THAT(metricsheet.files()[0].values, ElementsAre(FakeMetricsheet::Value{"one", 1.5, "nanoseconds"}));
    metricsheet.failClose(platform::Failure{28, "rename: no"});
    EXPECT_EQ(metricsheet.openWriter("/b.msj", "", 1)->close().failure().description, "rename: no");
    metricsheet.setOpens(false);
    EXPECT_EQ(metricsheet.openWriter("/c.msj", "", 1), nullptr);
}

TEST(FakeProcessInformationTest, LookUpsAreCounted) {
    const FakeProcessInformation processes(100, "a name that is longer than a record's");
    platform::ProcessRecord record;
    EXPECT_EQ(processes.reads(), 0U);
    EXPECT_TRUE(processes.read(100, record));
    EXPECT_FALSE(processes.read(101, record));
    EXPECT_EQ(processes.reads(), 2U);
    EXPECT_EQ(record.commandName, "a name that is ");
}

TEST(FakeDevicePropertiesTest, QuestionsAreCounted) {
    FakeDeviceProperties properties;
    properties.booleanProperty("InternalBuild");
    properties.booleanProperty("InternalBuild");
    properties.featureEnabled("AudioAnalytics", "Tracing");
    EXPECT_EQ(properties.booleanQueries(), 2U);
    EXPECT_EQ(properties.featureQueries(), 1U);
}

TEST(CapturingLogTest, LinesOfOneCategoryAreToldApart) {
    CapturingLog log;
    VelaReportingTraceCategory().as("TraceRunner").info("one");
    VelaReportingSessionCategory().as("VelaReportingSession").info("two");
    EXPECT_THAT(log.linesOf("velart"), ElementsAre(CapturedLine{LogLevel::Info, "velart", "TraceRunner", "one"}));
    log.clear();
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST(CapturingLogTest, ALineIsPrintedForAPerson) {
    EXPECT_EQ(::testing::PrintToString(CapturedLine{LogLevel::Default, "velarr", "VelaReportingSession", "text"}),
              "default velarr VelaReportingSession \"text\"");
}

} // namespace

TEST(FakeNotificationsTest, ARegistrationThatShallFailAnswersItsStatusAndIsNone) {
    ManualClock clock;
    ManualWorkQueues queues(clock);
    FakeNotifications notifications;
    notifications.failRegistration("a", 13);
    const auto failed = notifications.registerForNotification("a", queues.background(), [](std::int32_t) {});
    EXPECT_EQ(failed.status, 13);
    EXPECT_EQ(failed.token, -1);
    EXPECT_THAT(notifications.registrations(), IsEmpty());
    notifications.failRegistration("a", 0);
    EXPECT_EQ(notifications.registerForNotification("a", queues.background(), [](std::int32_t) {}).token, 1);
}

TEST(FakeNotificationsTest, RegistrationsAreListedAsTheyCame) {
    ManualClock clock;
    ManualWorkQueues queues(clock);
    FakeNotifications notifications;
    for (const std::string_view name : {"b", "a", "b"}) {
        notifications.registerForNotification(name, queues.background(), [](std::int32_t) {});
    }
    notifications.cancel(2);
    using Registration = FakeNotifications::Registration;
    EXPECT_THAT(notifications.registrations(), ElementsAre(Registration{"b", 1}, Registration{"b", 3}));
}

TEST(FakeNotificationsTest, AStateThatIsSetPostsNothingAndMayBeTakenAway) {
    ManualClock clock;
    ManualWorkQueues queues(clock);
    FakeNotifications notifications;
    const auto registration = notifications.registerForNotification("a", queues.background(), [](std::int32_t) {});
    notifications.setState("a", 5);
    EXPECT_EQ(queues.pendingItems(), 0U);
    EXPECT_EQ(notifications.state(registration.token), std::optional<std::uint64_t>(5));
    notifications.setState("a", std::nullopt);
    EXPECT_EQ(notifications.state(registration.token), std::nullopt);
}

TEST(FakePreferencesTest, QueriesAreCounted) {
    const FakePreferences preferences;
    preferences.copyValue("a", "b");
    preferences.copyValue("a", "b");
    EXPECT_EQ(preferences.queries(), 2U);
}

} // namespace vela::testing
