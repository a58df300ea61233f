// The built vela-reportingd, as an administrator starts it.
#include "testing/RunProgram.h"
#include "testing/TemporaryFolder.h"

#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

class ReportingdTest : public ::testing::Test {
protected:
    testing::ProgramRun run(const std::vector<std::string>& arguments) {
        std::vector<std::string> all{VELA_REPORTINGD};
        all.insert(all.end(), arguments.begin(), arguments.end());
        return testing::runProgram(
            all, {"HOME=" + folder_.path(), "XDG_RUNTIME_DIR=" + folder_.path(), "PATH=/usr/bin:/bin"});
    }
    /// `--check` on folders of this test's own.
    testing::ProgramRun check(const std::vector<std::string>& arguments) {
        std::vector<std::string> all{"--check", "--set", "paths.state=" + (folder_ / "state"), "--set",
                                     "paths.runtime=" + (folder_ / "r")};
        all.insert(all.end(), arguments.begin(), arguments.end());
        return run(all);
    }

    testing::TemporaryFolder folder_;
};

TEST_F(ReportingdTest, CheckFindsEverythingThatTheServiceNeeds) {
    const testing::ProgramRun checked = check({});
    EXPECT_EQ(checked.status, 0) << checked.out << checked.error;
    EXPECT_THAT(checked.out, HasSubstr("\nserial queue        ok       an item was posted and ran\n"));
    EXPECT_THAT(checked.out, HasSubstr("\nbackground queue    ok       an item was posted and ran\n"));
    EXPECT_THAT(checked.out, HasSubstr("\nproperty lists      ok       XML, binary and text written and read back\n"));
    EXPECT_THAT(checked.out, HasSubstr("\nstate folder        ok       " + (folder_ / "state") + " can be created\n"));
    EXPECT_THAT(checked.out, HasSubstr("\nprocesses           "));
    EXPECT_THAT(checked.out, HasSubstr(" this is vela-reportingd ("));
    EXPECT_EQ(checked.error, "");
}

TEST_F(ReportingdTest, CheckCreatesNothing) {
    check({});
    EXPECT_TRUE(std::filesystem::is_empty(folder_.path()));
}

TEST_F(ReportingdTest, CheckNamesTheSettingsFile) {
    std::ofstream(folder_ / "v.toml") << "[log]\ntarget = \"stderr\"\n";
    const testing::ProgramRun checked = check({"--settings", folder_ / "v.toml"});
    EXPECT_EQ(checked.status, 0) << checked.error;
    EXPECT_THAT(checked.out, StartsWith("settings            ok       " + (folder_ / "v.toml") +
                                        ", and 2 of --set\n"
                                        "log                 ok       lines go to standard error\n"));
}

TEST_F(ReportingdTest, SomethingEssentialThatIsMissingEndsWithOne) {
    std::ofstream(folder_ / "file") << "x";
    const testing::ProgramRun checked =
        run({"--check", "--set", "paths.state=" + (folder_ / "file"), "--set", "paths.runtime=" + folder_.path()});
    EXPECT_EQ(checked.status, 1);
    EXPECT_THAT(checked.out, HasSubstr("\nstate folder        missing  " + (folder_ / "file") + " is no folder\n"));
}

TEST_F(ReportingdTest, JsonHasOneObjectALine) {
    const testing::ProgramRun checked = check({"--json"});
    EXPECT_EQ(checked.status, 0);
    EXPECT_THAT(checked.out, StartsWith(R"({"subject":"settings","outcome":"ok","text":")"));
    EXPECT_THAT(checked.out, HasSubstr("\n"
                                       R"({"subject":"JSON","outcome":"ok","text":"written"})"
                                       "\n"));
}

TEST_F(ReportingdTest, EveryWrongSettingIsPrinted) {
    std::ofstream(folder_ / "v.toml") << "[log]\nlevel = \"loud\"\nlevle = \"info\"\n";
    const testing::ProgramRun checked =
        run({"--check", "--settings", folder_ / "v.toml", "--set", "device.InternalBuild=yes"});
    EXPECT_EQ(checked.status, 78);
    EXPECT_EQ(checked.out, "");
    EXPECT_EQ(checked.error, (folder_ / "v.toml") + ":2: log.level: \"loud\" is none of debug, info, default, error\n" +
                                 (folder_ / "v.toml") +
                                 ":3: log.levle: there is no such setting; did you mean log.level?\n" +
                                 "--set: device.InternalBuild: \"yes\" is not true or false\n");
}

TEST_F(ReportingdTest, ANamedSettingsFileMustExist) {
    const testing::ProgramRun checked = run({"--check", "--settings", folder_ / "none.toml"});
    EXPECT_EQ(checked.status, 78);
    EXPECT_THAT(checked.error, StartsWith((folder_ / "none.toml") + ": "));
}

TEST_F(ReportingdTest, WrongUsageIsOneLineAndSixtyFour) {
    const testing::ProgramRun refused = run({"--chekc"});
    EXPECT_EQ(refused.status, 64);
    EXPECT_EQ(refused.out, "");
    EXPECT_EQ(refused.error, "vela-reportingd: there is no option --chekc; see --help\n");
}

TEST_F(ReportingdTest, AFolderThatCannotBeMadeEndsTheStartInOneLine) {
    const testing::ProgramRun refused =
        run({"--set", "paths.runtime=/dev/null/vela", "--set", "paths.state=/tmp", "--set",
             "store.path=" + (folder_ / "deliveries.db"), "--set", "log.target=stderr", "--set", "log.level=error"});
    EXPECT_EQ(refused.status, 1);
    EXPECT_EQ(refused.out, "");
    EXPECT_THAT(refused.error, HasSubstr("vela-reportingd: "));
    EXPECT_THAT(refused.error, HasSubstr("/dev/null: Not a directory"));
}

TEST_F(ReportingdTest, VersionAndHelpArePrinted) {
    EXPECT_EQ(run({"--version"}).out, "vela-reportingd " VELA_VERSION "\n");
    EXPECT_EQ(run({"--version"}).status, 0);
    EXPECT_THAT(run({"--help"}).out, StartsWith("usage: vela-reportingd [--settings FILE]"));
    EXPECT_EQ(run({"--help"}).status, 0);
}

TEST_F(ReportingdTest, OutputThatCannotBeWrittenIsAFailure) {
    const testing::ProgramRun full = testing::runProgram(
        {"/bin/sh", "-c", R"("$0" --check --set "paths.state=$1/state" --set "paths.runtime=$1/r" >/dev/full)",
         VELA_REPORTINGD, folder_.path()},
        {});
    EXPECT_EQ(full.status, 1);
    EXPECT_EQ(full.error, "vela-reportingd: standard output cannot be written: No space left on device\n");
    const testing::ProgramRun closed =
        testing::runProgram({"/bin/sh", "-c", R"("$0" --version >&-)", VELA_REPORTINGD}, {});
    EXPECT_EQ(closed.status, 1);
    EXPECT_EQ(closed.error, "vela-reportingd: standard output cannot be written: Bad file descriptor\n");
}

} // namespace
} // namespace vela
