// The built velactl, and the files of packaging/ that describe what it shows.
#include "cli/PackagedFile_integrationtest.h"
#include "common/SettingValues.h"
#include "common/SettingsTable.h"
#include "testing/RunProgram.h"
#include "testing/TemporaryFolder.h"

#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <regex>

namespace vela {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

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
        return testing::runProgram(all, {"HOME=/home/u", "XDG_RUNTIME_DIR=/run/user/7"});
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
    EXPECT_EQ(full.error, "velactl: standard output cannot be written: No space left on device\n");
}

TEST_F(VelactlProgramTest, OutputThatIsClosedIsAFailure) {
    const testing::ProgramRun closed = testing::runProgram({"/bin/sh", "-c", R"("$0" --help >&-)", VELACTL}, {});
    EXPECT_EQ(closed.status, 1);
    EXPECT_EQ(closed.error, "velactl: standard output cannot be written: Bad file descriptor\n");
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

TEST_F(VelactlProgramTest, PreferencesAreATableOrJsonLines) {
    const auto defaults = [this](std::vector<std::string> words) {
        words.insert(words.begin(), "defaults");
        words.insert(words.end(), {"--set", "paths.state=" + folder_.path()});
        return run(words);
    };
    EXPECT_EQ(defaults({"read", "com.orvex.vela"}).out, "No preferences\n");
    EXPECT_EQ(defaults({"read", "com.orvex.vela", "--json"}).out, "");
    EXPECT_EQ(defaults({"write", "com.orvex.vela", "device_name", "Kitchen"}).status, 0);
    EXPECT_EQ(defaults({"write", "com.orvex.vela", "list", "[1, {\"a\": true}]"}).status, 0);
    EXPECT_EQ(defaults({"read", "com.orvex.vela"}).out, "KEY          VALUE\n"
                                                        "device_name  \"Kitchen\"\n"
                                                        "list         [1,{\"a\":true}]\n");
    EXPECT_EQ(defaults({"read", "com.orvex.vela", "--json"}).out, "{\"key\":\"device_name\",\"value\":\"Kitchen\"}\n"
                                                                  "{\"key\":\"list\",\"value\":[1,{\"a\":true}]}\n");
    EXPECT_EQ(defaults({"read", "com.orvex.vela", "device_name"}).out, "\"Kitchen\"\n");
    EXPECT_EQ(defaults({"read", "com.orvex.vela", "device_name", "--json"}).out,
              "{\"key\":\"device_name\",\"value\":\"Kitchen\"}\n");
}

TEST_F(VelactlProgramTest, WhatOnlyLooksLikeJsonIsNoPreference) {
    const auto defaults = [this](std::vector<std::string> words) {
        words.insert(words.begin(), "defaults");
        words.insert(words.end(), {"--set", "paths.state=" + folder_.path()});
        return run(words);
    };
    for (const std::string text : {"[1,2", "{\"a\":", "\"x", "null", "18446744073709551616", "1e999"}) {
        const testing::ProgramRun refused = defaults({"write", "com.orvex.vela", "a", text});
        EXPECT_EQ(refused.status, 1) << text;
        EXPECT_THAT(refused.error, ::testing::HasSubstr("; a text like this needs quotation marks of its own\n"));
    }
    EXPECT_EQ(defaults({"write", "com.orvex.vela", "a", "12:30"}).status, 0);
    EXPECT_EQ(defaults({"read", "com.orvex.vela", "a"}).out, "\"12:30\"\n");
}

TEST_F(VelactlProgramTest, AKeyOrAllKeysOfADomainAreDeleted) {
    const auto defaults = [this](std::vector<std::string> words) {
        words.insert(words.begin(), "defaults");
        words.insert(words.end(), {"--set", "paths.state=" + folder_.path()});
        return run(words);
    };
    for (const char* key : {"a", "b", "c"}) {
        EXPECT_EQ(defaults({"write", "com.orvex.vela", key, "1"}).status, 0);
    }
    EXPECT_EQ(defaults({"write", "com.orvex.audio", "a", "1"}).status, 0);
    EXPECT_EQ(defaults({"delete", "com.orvex.vela", "a"}).status, 0);
    EXPECT_EQ(defaults({"read", "com.orvex.vela"}).out, "KEY  VALUE\nb    1\nc    1\n");
    const testing::ProgramRun all = defaults({"delete", "com.orvex.vela"});
    EXPECT_EQ(all.status, 0) << all.error;
    EXPECT_EQ(defaults({"read", "com.orvex.vela"}).out, "No preferences\n");
    EXPECT_EQ(defaults({"read", "com.orvex.audio"}).out, "KEY  VALUE\na    1\n");
    const testing::ProgramRun again = defaults({"delete", "com.orvex.vela"});
    EXPECT_EQ(again.status, 1);
    EXPECT_EQ(again.error, "velactl: com.orvex.vela has no preferences\n");
}

} // namespace
} // namespace vela
