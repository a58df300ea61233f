// The built velactl, and the files of packaging/ that describe what it shows.
#include "common/SettingValues.h"
#include "common/SettingsTable.h"
#include "testing/RunProgram.h"
#include "testing/TemporaryFolder.h"

#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <regex>
#include <sstream>

namespace vela {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

std::string contentOf(const std::string& path) {
    std::ifstream stream(path, std::ios::binary);
    EXPECT_TRUE(stream.is_open()) << path;
    std::ostringstream content;
    content << stream.rdbuf();
    return content.str();
}

class VelactlProgramTest : public ::testing::Test {
protected:
    /// The program with the settings file `toml` and further arguments.
    testing::ProgramRun settings(const std::string& toml, const std::vector<std::string>& arguments = {}) {
        std::ofstream(file()) << toml;
        std::vector<std::string> all{"settings", "--settings", file()};
        all.insert(all.end(), arguments.begin(), arguments.end());
        return run(all);
    }
    testing::ProgramRun run(const std::vector<std::string>& arguments) {
        std::vector<std::string> all{VELACTL};
        all.insert(all.end(), arguments.begin(), arguments.end());
        return testing::runProgram(std::move(all), {"HOME=/home/u", "XDG_RUNTIME_DIR=/run/user/7"});
    }
    std::string file() const { return folder_ / "v.toml"; }

    testing::TemporaryFolder folder_;
};

TEST_F(VelactlProgramTest, SettingsAreAnAlignedTableWithoutColour) {
    const testing::ProgramRun shown = settings("[paths]\nstate = \"/s\"\nruntime = \"/r\"\n[log]\nlevel = \"debug\"\n",
                                               {"--set", "log.target=stderr"});
    EXPECT_EQ(shown.status, 0);
    EXPECT_EQ(shown.error, "");
    const std::string rows = std::regex_replace(shown.out, std::regex(file()), "FILE");
    EXPECT_THAT(
        rows,
        StartsWith("KEY                              VALUE                                             FROM\n"
                   "device.InternalBuild             false                                             default\n"
                   "features.AudioAnalytics/Tracing  false                                             default\n"
                   "paths.root                       \"/\"                                               default\n"
                   "paths.state                      \"/s\"                                              FILE:2\n"
                   "paths.runtime                    \"/r\"                                              FILE:3\n"
                   "log.target                       \"stderr\"                                          --set\n"
                   "log.level                        \"debug\"                                           FILE:5\n"
                   "store.path                       \"/s/deliveries.db\"                                default\n"));
}

TEST_F(VelactlProgramTest, SettingsAreJsonLines) {
    const testing::ProgramRun shown =
        settings("[limits]\nmessage_bytes = \"2 MiB\"\n", {"--json", "--set", "access.users=[\"a\", \"b\"]"});
    EXPECT_EQ(shown.status, 0);
    EXPECT_THAT(shown.out, StartsWith(R"({"key":"device.InternalBuild","value":false,"origin":"default"})"
                                      "\n"));
    EXPECT_THAT(shown.out,
                HasSubstr(R"({"key":"limits.message_bytes","value":2097152,"origin":"file","file":")" + file() +
                          R"(","line":2})"
                          "\n"));
    EXPECT_THAT(shown.out, HasSubstr(R"({"key":"access.users","value":["a","b"],"origin":"command line"})"
                                     "\n"));
}

TEST_F(VelactlProgramTest, WrongSettingsAreAllPrintedAndNothingElse) {
    const testing::ProgramRun shown = settings("[log]\nlevel = \"loud\"\ntarget = 5\n");
    EXPECT_EQ(shown.status, 1);
    EXPECT_EQ(shown.out, "");
    EXPECT_EQ(shown.error, file() + ":2: log.level: \"loud\" is none of debug, info, default, error\n" + file() +
                               ":3: log.target: 5 is none of journal, stderr\n");
}

TEST_F(VelactlProgramTest, ExitStatusesAreThoseOfItsPage) {
    EXPECT_EQ(run({"--help"}).status, 0);
    EXPECT_EQ(run({"settings", "--settings", folder_ / "none.toml"}).status, 1);
    EXPECT_EQ(run({"no-such-thing"}).status, 2);
}

TEST_F(VelactlProgramTest, APropertyListIsPrintedInAnotherForm) {
    std::ofstream(folder_ / "p.plist") << "{key = value;}";
    const testing::ProgramRun shown = run({"plist", folder_ / "p.plist"});
    EXPECT_EQ(shown.status, 0) << shown.error;
    EXPECT_EQ(shown.out, "{\n  \"key\": \"value\"\n}\n");
    const testing::ProgramRun bad = run({"plist", file() + ".none"});
    EXPECT_EQ(bad.status, 1);
    EXPECT_EQ(bad.out, "");
}

TEST_F(VelactlProgramTest, OutputThatCannotBeWrittenIsAFailure) {
    const testing::ProgramRun full = testing::runProgram({"/bin/sh", "-c", R"("$0" --help >/dev/full)", VELACTL}, {});
    EXPECT_EQ(full.status, 1);
}

TEST_F(VelactlProgramTest, ThePackagedSettingsFileIsTheTable) {
    EXPECT_EQ(contentOf(VELA_PACKAGING "/vela-reporting.toml"), exampleSettingsFile());
    EXPECT_EQ(run({"settings", "--example"}).out, exampleSettingsFile());
}

/// What `velactl settings --json` says, without its origins.
std::string valuesOnly(const std::string& lines) { return std::regex_replace(lines, std::regex(",\"origin\":.*"), ""); }

TEST_F(VelactlProgramTest, ThePackagedSettingsFileChangesNothing) {
    const std::string packaged = contentOf(VELA_PACKAGING "/vela-reporting.toml");
    EXPECT_EQ(settings(packaged, {"--json"}).out, settings("", {"--json"}).out);
}

TEST_F(VelactlProgramTest, ThePackagedSettingsFileWithoutItsMarksIsTheDefaults) {
    // A line is a setting where no blank follows the mark.
    const std::string packaged =
        std::regex_replace(contentOf(VELA_PACKAGING "/vela-reporting.toml"), std::regex("\n#([^ ])"), "\n$1");
    const std::vector<std::string> folders{"--json", "--set", "paths.state=/s", "--set", "paths.runtime=/r"};
    const testing::ProgramRun shown = settings(packaged, folders);
    EXPECT_EQ(shown.status, 0) << shown.error;
    EXPECT_EQ(valuesOnly(shown.out), valuesOnly(settings("", folders).out));
    std::size_t fromFile = 0;
    for (std::size_t at = shown.out.find("\"file\":"); at != std::string::npos;
         at = shown.out.find("\"file\":", at + 1)) {
        ++fromFile;
    }
    EXPECT_EQ(fromFile, settingsTable().size() - 2); // the two folders were set over it
}

/// The text of a man page's source, without what escapes and fonts add.
std::string plainText(std::string roff) {
    for (const auto& [from, to] :
         {std::pair{R"(\\\(dq)", "\""}, {R"(\\e)", R"(\)"}, {R"(\\-)", "-"}, {R"(\\ )", " "}}) {
        roff = std::regex_replace(roff, std::regex(from), to);
    }
    return roff;
}

TEST_F(VelactlProgramTest, TheManPageOfTheSettingsHoldsEverySettingInOrder) {
    const std::string page = plainText(contentOf(VELA_PACKAGING "/man/vela-reporting.toml.5"));
    std::size_t at = 0;
    std::string_view section;
    for (const SettingDescription& setting : settingsTable()) {
        if (setting.section != section) {
            section = setting.section;
            at = page.find("\n.SS [" + std::string(section) + "]\n", at);
            ASSERT_NE(at, std::string::npos) << section;
        }
        const std::string key = isOpenSection(section) ? quotedText(setting.key) : std::string(setting.key);
        at = page.find("\n.BR " + key + " = " + valueText(setting.standard) + "\n", at);
        ASSERT_NE(at, std::string::npos) << setting.name();
        const std::size_t allowed = page.find("\nAllowed: " + allowedText(setting) + ".\n", at);
        ASSERT_NE(allowed, std::string::npos) << setting.name();
        EXPECT_EQ(page.substr(at + 1, allowed - at).find("\n.TP\n"), std::string::npos) << setting.name();
    }
}

} // namespace
} // namespace vela
