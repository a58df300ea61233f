#include "reporters/pipewire/ReporterCommandLine.h"
#include "reporters/pipewire/ReporterSettings.h"
#include "testing/FakeFileSystem.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::reporter {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class ReporterSettingsTest : public ::testing::Test {
protected:
    ReporterSettingsReading read(const std::string& text, const std::vector<std::string>& options = {}) {
        files.addFile("/etc/vela/x.toml", text);
        return loadReporterSettings("/etc/vela/x.toml", options, files);
    }
    std::vector<std::string> errorsOf(const std::string& text, const std::vector<std::string>& options = {}) {
        std::vector<std::string> texts;
        const ReporterSettingsReading reading = read(text, options);
        EXPECT_FALSE(reading.settings);
        for (const SettingError& error : reading.errors) {
            texts.push_back(error.text());
        }
        return texts;
    }

    vela::testing::FakeFileSystem files;
};

TEST_F(ReporterSettingsTest, DefaultsReportEverythingByName) {
    const ReporterSettingsReading reading = loadReporterSettings(std::nullopt, {}, files);
    ASSERT_TRUE(reading.settings);
    EXPECT_EQ(reading.settings->remote, "");
    EXPECT_EQ(reading.settings->address, "");
    EXPECT_EQ(reading.settings->names, NameTreatment::Report);
    EXPECT_THAT(reading.settings->leftOutApplications, IsEmpty());
    EXPECT_FALSE(reading.settings->deviceSessions);
    EXPECT_TRUE(reading.settings->statistics);
}

TEST_F(ReporterSettingsTest, AFileSetsEverything) {
    const ReporterSettingsReading reading = read("[pipewire]\nremote = \"other\"\n"
                                                 "[service]\naddress = \"unix:path=/x\"\n"
                                                 "[names]\napplications = \"hash\"\n"
                                                 "[leave_out]\napplications = [\"a*\", \"b\"]\nroles = [\"Game\"]\n"
                                                 "nodes = [\"n?\"]\n"
                                                 "[devices]\nsessions = true\n"
                                                 "[statistics]\npublish = false\nfolder = \"/run/x\"\n");
    ASSERT_TRUE(reading.settings);
    EXPECT_EQ(reading.settings->remote, "other");
    EXPECT_EQ(reading.settings->address, "unix:path=/x");
    EXPECT_EQ(reading.settings->names, NameTreatment::Hash);
    EXPECT_THAT(reading.settings->leftOutApplications, ElementsAre("a*", "b"));
    EXPECT_THAT(reading.settings->leftOutRoles, ElementsAre("Game"));
    EXPECT_THAT(reading.settings->leftOutNodes, ElementsAre("n?"));
    EXPECT_TRUE(reading.settings->deviceSessions);
    EXPECT_FALSE(reading.settings->statistics);
    EXPECT_EQ(reading.settings->folder, "/run/x");
}

TEST_F(ReporterSettingsTest, TheCommandLineWins) {
    const ReporterSettingsReading reading = read("[names]\napplications = \"hash\"\n", {"names.applications=omit"});
    ASSERT_TRUE(reading.settings);
    EXPECT_EQ(reading.settings->names, NameTreatment::Omit);
}

TEST_F(ReporterSettingsTest, UnknownNamesAreErrors) {
    EXPECT_THAT(errorsOf("[names]\napplication = \"hash\"\n[nodes]\n"),
                ElementsAre("/etc/vela/x.toml:2: names.application: there is no such setting; did you mean "
                            "names.applications?",
                            "/etc/vela/x.toml:3: nodes: there is no such section"));
}

TEST_F(ReporterSettingsTest, WrongValuesAreErrors) {
    EXPECT_THAT(errorsOf("[names]\napplications = \"all\"\n[devices]\nsessions = 1\n", {"statistics.folder=x"}),
                ElementsAre("/etc/vela/x.toml:2: names.applications: \"all\" is none of report, hash, omit",
                            "/etc/vela/x.toml:4: devices.sessions: 1 is not true or false",
                            "--set: statistics.folder: \"x\" is no absolute path"));
}

TEST_F(ReporterSettingsTest, TextThatIsNoTomlIsAnError) { EXPECT_EQ(errorsOf("[names\n").size(), 1); }

TEST_F(ReporterSettingsTest, AFileThatIsNamedMustBeThere) {
    EXPECT_FALSE(loadReporterSettings("/nowhere.toml", {}, files).settings);
}

TEST_F(ReporterSettingsTest, TheExampleSaysNothingButDefaults) {
    EXPECT_TRUE(read(exampleReporterSettings()).settings);
    std::string uncommented = exampleReporterSettings();
    for (std::size_t at = 0; (at = uncommented.find("\n#", at)) != std::string::npos; ++at) {
        if (uncommented[at + 2] != ' ') {
            uncommented.erase(at + 1, 1);
        }
    }
    const ReporterSettingsReading reading = read(uncommented);
    EXPECT_TRUE(reading.settings) << uncommented << (reading.errors.empty() ? "" : reading.errors.front().text());
}

platform::Result<ReporterCommandLine> line(const std::vector<std::string_view>& arguments) {
    return readReporterCommandLine(arguments);
}

TEST(ReporterCommandLineTest, WatchesByDefault) {
    const auto read = line({"--settings", "/a", "--set", "x.y=1", "--settings=/b", "--set=z.z=2"});
    ASSERT_TRUE(read);
    EXPECT_EQ(read->action, ReporterCommandLine::Action::Watch);
    EXPECT_EQ(read->settingsFile, "/b");
    EXPECT_THAT(read->settings, ElementsAre("x.y=1", "z.z=2"));
}

TEST(ReporterCommandLineTest, TakesActions) {
    EXPECT_EQ(line({"--check"})->action, ReporterCommandLine::Action::Check);
    EXPECT_EQ(line({"--example"})->action, ReporterCommandLine::Action::Example);
    EXPECT_EQ(line({"--check", "--version"})->action, ReporterCommandLine::Action::Version);
    EXPECT_EQ(line({"--version", "--help"})->action, ReporterCommandLine::Action::Help);
}

TEST(ReporterCommandLineTest, RefusesWhatItDoesNotKnow) {
    EXPECT_FALSE(line({"--loud"}));
    EXPECT_FALSE(line({"file"}));
    EXPECT_FALSE(line({"--set"}));
}

TEST(ReporterCommandLineTest, HelpNamesEveryOption) {
    for (const char* const option : {"--settings", "--set", "--check", "--example", "--version", "--help"}) {
        EXPECT_NE(reporterHelpText().find(option), std::string_view::npos) << option;
    }
}

} // namespace
} // namespace vela::reporter
