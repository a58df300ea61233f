#include "platform/toml/SettingsLoading.h"
#include "testing/FakeFileSystem.h"

#include <cerrno>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::platform {
namespace {

using ::testing::ElementsAre;
using ::testing::StartsWith;

class SettingsLoadingTest : public ::testing::Test {
protected:
    LoadedSettings load(std::optional<std::string> file, std::vector<std::string> options = {}) {
        return loadSettings({std::move(file), std::move(options), {}}, files_);
    }
    std::vector<std::string> faultsOf(std::optional<std::string> file, std::vector<std::string> options = {}) {
        std::vector<std::string> texts;
        for (const SettingError& error : load(std::move(file), std::move(options)).reading.errors) {
            texts.push_back(error.text());
        }
        return texts;
    }

    vela::testing::FakeFileSystem files_;
};

TEST_F(SettingsLoadingTest, WithoutAFileTheDefaultsHold) {
    const LoadedSettings loaded = load(std::nullopt);
    ASSERT_TRUE(loaded.reading.settings.has_value());
    EXPECT_EQ(loaded.reading.settings->paths.state, "/var/lib/vela");
    EXPECT_EQ(loaded.file, std::nullopt);
}

TEST_F(SettingsLoadingTest, TheStandardFileIsReadWhereItIs) {
    files_.addFile("/etc/vela/vela-reporting.toml", "[log]\nlevel = \"debug\"\n");
    const LoadedSettings loaded = load(std::nullopt);
    ASSERT_TRUE(loaded.reading.settings.has_value());
    EXPECT_EQ(loaded.reading.settings->log.level, LogLevel::Debug);
    EXPECT_EQ(loaded.file, "/etc/vela/vela-reporting.toml");
}

TEST_F(SettingsLoadingTest, AStandardFileThatCannotBeReadIsAnError) {
    files_.addFile("/etc/vela/vela-reporting.toml", "");
    files_.failOn("/etc/vela/vela-reporting.toml", EACCES);
    EXPECT_THAT(faultsOf(std::nullopt), ElementsAre(StartsWith("/etc/vela/vela-reporting.toml: ")));
}

TEST_F(SettingsLoadingTest, ANamedFileMustBeThere) {
    EXPECT_THAT(faultsOf("/nowhere.toml"), ElementsAre(StartsWith("/nowhere.toml: ")));
}

TEST_F(SettingsLoadingTest, ANamedFileStandsInPlaceOfTheStandardOne) {
    files_.addFile("/etc/vela/vela-reporting.toml", "[log]\nlevel = \"debug\"\n");
    files_.addFile("/mine.toml", "[log]\ntarget = \"stderr\"\n");
    const LoadedSettings loaded = load("/mine.toml");
    ASSERT_TRUE(loaded.reading.settings.has_value());
    EXPECT_EQ(loaded.reading.settings->log.level, LogLevel::Default);
    EXPECT_EQ(loaded.reading.settings->log.target, LogTarget::StandardError);
    EXPECT_EQ(loaded.file, "/mine.toml");
}

TEST_F(SettingsLoadingTest, ARelativeNameIsBelowTheCurrentFolderAndShownAsGiven) {
    files_.addFile("/srv/mine.toml", "[log]\nlevel = 5\n");
    files_.setCurrentDirectory("/srv");
    EXPECT_THAT(faultsOf("mine.toml"), ElementsAre("mine.toml:2: log.level: 5 is none of debug, info, default, error"));
}

TEST_F(SettingsLoadingTest, SingleSettingsLieOverTheFile) {
    files_.addFile("/mine.toml", "[log]\nlevel = \"debug\"\ntarget = \"stderr\"\n");
    const LoadedSettings loaded = load("/mine.toml", {"log.level=info", "log.level=error"});
    ASSERT_TRUE(loaded.reading.settings.has_value());
    EXPECT_EQ(loaded.reading.settings->log.level, LogLevel::Error);
    EXPECT_EQ(loaded.reading.settings->log.target, LogTarget::StandardError);
}

TEST_F(SettingsLoadingTest, FaultsOfAllLayersAreReportedTogether) {
    files_.addFile("/mine.toml", "[log]\nlevel = 1979-05-27\ntarget = \"nowhere\"\n");
    const LoadedSettings loaded = load("/mine.toml", {"nonsense", "log.levle=x"});
    EXPECT_FALSE(loaded.reading.settings.has_value());
    EXPECT_TRUE(loaded.reading.inForce.empty());
    EXPECT_THAT(faultsOf("/mine.toml", {"nonsense", "log.levle=x"}),
                ElementsAre("/mine.toml:2:9: log.level: a date or time is no value of a setting",
                            "--set: \"nonsense\" is not section.key=value",
                            "/mine.toml:3: log.target: \"nowhere\" is none of journal, stderr",
                            "--set: log.levle: there is no such setting; did you mean log.level?"));
}

TEST_F(SettingsLoadingTest, AFileThatIsNoTomlIsReportedWithThePlace) {
    files_.addFile("/mine.toml", "[log]\nlevel = = 5\n");
    EXPECT_THAT(faultsOf("/mine.toml"), ElementsAre(StartsWith("/mine.toml:2:9: ")));
}

TEST_F(SettingsLoadingTest, AFileOfMoreThanOneMebibyteIsRefused) {
    files_.addFile("/mine.toml", std::string(1024 * 1024 + 1, '\n'));
    EXPECT_EQ(faultsOf("/mine.toml").size(), 1U);
}

} // namespace
} // namespace vela::platform
