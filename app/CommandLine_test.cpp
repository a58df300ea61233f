#include "app/CommandLine.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela {
namespace {

using ::testing::ElementsAre;
using Action = CommandLine::Action;

platform::Result<CommandLine> read(const std::vector<std::string_view>& arguments) {
    return readCommandLine(arguments);
}

TEST(CommandLineTest, WithoutArgumentsItServes) {
    ASSERT_TRUE(static_cast<bool>(read({})));
    EXPECT_EQ(read({})->action, Action::Serve);
    EXPECT_EQ(read({})->settingsFile, std::nullopt);
}

TEST(CommandLineTest, EveryOptionIsTaken) {
    const auto line = read({"--check", "--json", "--settings", "/f.toml", "--set", "a.b=1", "--set=c.d=2"});
    ASSERT_TRUE(static_cast<bool>(line));
    EXPECT_EQ(line->action, Action::Check);
    EXPECT_TRUE(line->json);
    EXPECT_EQ(line->settingsFile, "/f.toml");
    EXPECT_THAT(line->settings, ElementsAre("a.b=1", "c.d=2"));
}

TEST(CommandLineTest, TheLastSettingsFileCounts) {
    EXPECT_EQ(read({"--settings=/a", "--settings=/b"})->settingsFile, "/b");
}

TEST(CommandLineTest, HelpWinsOverVersionAndVersionOverCheck) {
    EXPECT_EQ(read({"--check", "--version", "--help"})->action, Action::Help);
    EXPECT_EQ(read({"--check", "--version"})->action, Action::Version);
}

TEST(CommandLineTest, WrongUsageIsExplained) {
    EXPECT_EQ(read({"--chekc"}).failure().description, "there is no option --chekc");
    EXPECT_EQ(read({"--settings"}).failure().description, "--settings needs a value");
    EXPECT_EQ(read({"file"}).failure().description, "there is nothing to do with \"file\"");
    EXPECT_EQ(read({"--json"}).failure().description, "--json goes with --check");
}

TEST(CommandLineTest, TheHelpNamesEveryOption) {
    for (const char* option : {"--check", "--json", "--settings", "--set", "--version", "--help"}) {
        EXPECT_NE(helpText().find(option), std::string_view::npos) << option;
    }
}

} // namespace
} // namespace vela
