// The fakes keep the contracts that the real ones keep, and do what tests ask of them.
#include "common/VelaReportingLogCategories.h"
#include "testing/CapturingLog.h"
#include "testing/DevicePropertiesContract.h"
#include "testing/FakeDeviceProperties.h"
#include "testing/FakeFileSystem.h"
#include "testing/FakeProcessInformation.h"
#include "testing/FileSystemContract.h"
#include "testing/ProcessInformationContract.h"

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

struct DevicePropertiesHarness {
    DevicePropertiesHarness() {
        properties_.setBoolean("InternalBuild", true);
        properties_.setBoolean("Sealed", false);
        properties_.setFeature("AudioAnalytics", "Tracing", true);
        properties_.setFeature("AudioAnalytics", "Gauges", false);
    }
    const platform::DeviceProperties& properties() { return properties_; }

    FakeDeviceProperties properties_;
};

} // namespace

INSTANTIATE_TYPED_TEST_SUITE_P(Fake, FileSystemContract, FileSystemHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Fake, ProcessInformationContract, ProcessInformationHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(Fake, DevicePropertiesContract, DevicePropertiesHarness);

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

} // namespace vela::testing
