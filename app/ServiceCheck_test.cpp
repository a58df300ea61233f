#include "app/ServiceCheck.h"
#include "platform/linux/LinuxJsonWriting.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "platform/plist/PropertyListCodec.h"
#include "testing/FakeProcessInformation.h"

#include <algorithm>
#include <chrono>
#include <gtest/gtest.h>

namespace vela {
namespace {

using platform::Failure;
using platform::FolderState;
using platform::PropertyListFormat;
using platform::Result;

/// Queues whose background queue drops every item.
class DeafQueues final : public platform::WorkQueues {
public:
    class Queue final : public platform::WorkQueue {
    public:
        void post(platform::WorkItem) override {}
        void postAfter(platform::Nanoseconds, platform::WorkItem) override {}
        bool isCurrent() const override { return false; }
        std::string_view name() const override { return "deaf"; }
    };

    std::unique_ptr<platform::SerialQueue> makeSerialQueue(std::string_view name,
                                                           platform::QualityOfService quality) override {
        return real_.makeSerialQueue(name, quality);
    }
    platform::WorkQueue& background() override { return deaf_; }
    std::unique_ptr<platform::Semaphore> makeSemaphore(std::uint32_t initial) override {
        return real_.makeSemaphore(initial);
    }
    std::unique_ptr<platform::Condition> makeCondition() override { return real_.makeCondition(); }
    void beginBlocking() override {}
    void endBlocking() override {}

private:
    platform::LinuxWorkQueues real_;
    Queue deaf_;
};

/// Forgets what it reads in one format.
class ForgetfulPropertyLists final : public platform::PropertyListReading {
public:
    explicit ForgetfulPropertyLists(PropertyListFormat broken) : broken_(broken) {}

    Result<Value> read(std::string_view bytes, const platform::PropertyListLimits& limits) const override {
        return wroteBroken_ ? Result<Value>(Value("something else")) : real_.read(bytes, limits);
    }
    Result<std::string> write(ValueRef value, PropertyListFormat format) const override {
        wroteBroken_ = format == broken_;
        return real_.write(value, format);
    }

private:
    platform::PropertyListCodec real_;
    PropertyListFormat broken_;
    mutable bool wroteBroken_ = false;
};

class BrokenJson final : public platform::JsonWriting {
public:
    Result<platform::Done> append(std::string&, ValueRef, JsonLayout, std::size_t) const override {
        return Failure{0, "broken"};
    }
};

class ServiceCheckTest : public ::testing::Test {
protected:
    ServiceCheckTest() {
        settings_.paths.state = "/s";
        settings_.paths.runtime = "/r";
        processes_.add({.pid = 1, .parent = 0, .commandName = "init", .startTimeTicks = 1});
    }

    std::vector<CheckFinding> check(platform::Nanoseconds patience = std::chrono::minutes(1)) {
        return checkService(settings_, {*queues_, processes_, *propertyLists_, *json_}, facts_, patience);
    }

    CheckFinding finding(std::string_view subject) { return find(check(), subject); }

    static CheckFinding find(const std::vector<CheckFinding>& findings, std::string_view subject) {
        const auto found = std::ranges::find(findings, subject, &CheckFinding::subject);
        EXPECT_NE(found, findings.end()) << subject;
        return found == findings.end() ? CheckFinding() : *found;
    }

    Settings settings_;
    CheckedFacts facts_;
    vela::testing::FakeProcessInformation processes_;
    platform::LinuxWorkQueues realQueues_;
    platform::PropertyListCodec realPropertyLists_;
    platform::LinuxJsonWriting realJson_;
    platform::WorkQueues* queues_ = &realQueues_;
    const platform::PropertyListReading* propertyLists_ = &realPropertyLists_;
    const platform::JsonWriting* json_ = &realJson_;
};

TEST_F(ServiceCheckTest, ADeviceThatHasEverythingHasNothingMissing) {
    facts_.threadPriorities = true;
    facts_.traceFolder = "/t";
    facts_.traceInstances = true;
    facts_.performanceTool = "/usr/bin/perf";
    const std::vector<CheckFinding> findings = check();
    EXPECT_FALSE(isSomethingMissing(findings));
    EXPECT_EQ(findingsAsText(findings),
              "settings            ok       built-in defaults, no settings file\n"
              "log                 ok       the system journal takes the lines\n"
              "serial queue        ok       an item was posted and ran\n"
              "background queue    ok       an item was posted and ran\n"
              "thread priorities   ok       applied\n"
              "processes           ok       this is vela-reportingd (100), started by init (1)\n"
              "state folder        ok       /s is there and writable\n"
              "runtime folder      ok       /r is there and writable\n"
              "property lists      ok       XML, binary and text written and read back\n"
              "JSON                ok       written\n"
              "kernel trace        ok       /t takes trace instances\n"
              "performance trace   ok       /usr/bin/perf\n");
}

TEST_F(ServiceCheckTest, SettingsFilesAndSingleSettingsAreNamed) {
    facts_.settingsFile = "/etc/v.toml";
    facts_.singleSettings = 2;
    EXPECT_EQ(finding("settings").text, "/etc/v.toml, and 2 of --set");
}

TEST_F(ServiceCheckTest, WithoutAJournalThereIsANote) {
    facts_.logFailure = "no socket";
    EXPECT_EQ(finding("log").outcome, CheckOutcome::Note);
    EXPECT_EQ(finding("log").text, "no socket; lines go to standard error");
}

TEST_F(ServiceCheckTest, StandardErrorIsATargetLikeAnother) {
    settings_.log.target = LogTarget::StandardError;
    EXPECT_EQ(finding("log").outcome, CheckOutcome::Fine);
    EXPECT_EQ(finding("log").text, "lines go to standard error");
}

TEST_F(ServiceCheckTest, AQueueThatRunsNothingIsMissing) {
    DeafQueues deaf;
    queues_ = &deaf;
    const std::vector<CheckFinding> findings = check(std::chrono::milliseconds(200));
    EXPECT_EQ(find(findings, "background queue").outcome, CheckOutcome::Missing);
    EXPECT_EQ(find(findings, "background queue").text, "an item that was posted did not run");
    EXPECT_TRUE(isSomethingMissing(findings));
}

TEST_F(ServiceCheckTest, PrioritiesThatAreNotAppliedAreANote) {
    EXPECT_EQ(finding("thread priorities").outcome, CheckOutcome::Note);
    EXPECT_FALSE(isSomethingMissing(check()));
}

TEST_F(ServiceCheckTest, AParentThatCannotBeSeenIsANote) {
    processes_.remove(1);
    EXPECT_EQ(finding("processes").outcome, CheckOutcome::Note);
    EXPECT_EQ(finding("processes").text, "this is vela-reportingd (100), started by a process that cannot be seen (1)");
}

TEST_F(ServiceCheckTest, AProcessThatCannotSeeItselfIsMissing) {
    processes_.remove(100);
    EXPECT_EQ(finding("processes").outcome, CheckOutcome::Missing);
}

TEST_F(ServiceCheckTest, AProcessNameCannotBreakTheLine) {
    processes_.add({.pid = 1, .parent = 0, .commandName = "a\nb", .startTimeTicks = 1});
    EXPECT_EQ(finding("processes").text, "this is vela-reportingd (100), started by a\\nb (1)");
}

TEST_F(ServiceCheckTest, EveryStateOfAFolderIsTold) {
    struct Case {
        FolderState state;
        CheckOutcome outcome;
        const char* text;
    };
    for (const Case& expected :
         {Case{FolderState::Writable, CheckOutcome::Fine, "/s is there and writable"},
          Case{FolderState::CanBeCreated, CheckOutcome::Fine, "/s can be created"},
          Case{FolderState::NotWritable, CheckOutcome::Missing, "/s is not writable by this user"},
          Case{FolderState::CannotBeCreated, CheckOutcome::Missing, "/s cannot be created by this user"},
          Case{FolderState::NoFolder, CheckOutcome::Missing, "/s is no folder"}}) {
        facts_.state = expected.state;
        EXPECT_EQ(finding("state folder").outcome, expected.outcome) << expected.text;
        EXPECT_EQ(finding("state folder").text, expected.text);
    }
    facts_.runtime = FolderState::NotWritable;
    EXPECT_EQ(finding("runtime folder").text, "/r is not writable by this user");
}

TEST_F(ServiceCheckTest, AFormatThatIsNotReadBackIsNamed) {
    for (const auto& [format, name] : {std::pair{PropertyListFormat::Xml, "XML"},
                                       {PropertyListFormat::Binary, "binary"},
                                       {PropertyListFormat::Text, "text"}}) {
        const ForgetfulPropertyLists forgetful(format);
        propertyLists_ = &forgetful;
        EXPECT_EQ(finding("property lists").outcome, CheckOutcome::Missing);
        EXPECT_EQ(finding("property lists").text, std::string(name) + ": what was written was not read back");
    }
}

TEST_F(ServiceCheckTest, JsonThatIsNotWrittenIsMissing) {
    const BrokenJson broken;
    json_ = &broken;
    EXPECT_EQ(finding("JSON").outcome, CheckOutcome::Missing);
}

TEST_F(ServiceCheckTest, WithoutTheKernelsTraceThereAreNotes) {
    EXPECT_EQ(finding("kernel trace").outcome, CheckOutcome::Note);
    EXPECT_EQ(finding("kernel trace").text, "no trace file system that this process can see");
    EXPECT_EQ(finding("performance trace").text, "there is no program named perf");
    facts_.traceFolder = "/t";
    EXPECT_EQ(finding("kernel trace").outcome, CheckOutcome::Note);
    EXPECT_EQ(finding("kernel trace").text, "/t is there, not writable by this process");
}

TEST(CheckFindingsTest, JsonHasOneObjectALine) {
    const std::vector<CheckFinding> findings{
        {"a", CheckOutcome::Fine, "x"}, {"b", CheckOutcome::Note, "\"y\""}, {"c", CheckOutcome::Missing, "z"}};
    EXPECT_EQ(findingsAsJson(findings), "{\"subject\":\"a\",\"outcome\":\"ok\",\"text\":\"x\"}\n"
                                        "{\"subject\":\"b\",\"outcome\":\"note\",\"text\":\"\\\"y\\\"\"}\n"
                                        "{\"subject\":\"c\",\"outcome\":\"missing\",\"text\":\"z\"}\n");
}

} // namespace
} // namespace vela
