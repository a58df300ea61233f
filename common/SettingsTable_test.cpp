#include "common/SettingCheck.h"
#include "common/SettingsTable.h"

#include <gtest/gtest.h>
#include <set>

namespace vela {
namespace {

TEST(SettingsTableTest, EverySettingHasItsOwnNameAndPlace) {
    Settings settings;
    std::set<std::string> names;
    std::set<const void*> places;
    for (const SettingDescription& setting : settingsTable()) {
        EXPECT_TRUE(names.insert(setting.name()).second) << setting.name();
        const SettingSlot slot = setting.slot(settings);
        const void* place = std::visit([](auto* target) { return static_cast<const void*>(target); }, slot);
        EXPECT_TRUE(places.insert(place).second) << setting.name();
    }
    EXPECT_EQ(names.size(), 30U);
}

TEST(SettingsTableTest, EveryDefaultIsAllowed) {
    for (const SettingDescription& setting : settingsTable()) {
        EXPECT_TRUE(static_cast<bool>(checkSetting(setting, setting.standard))) << setting.name();
    }
}

TEST(SettingsTableTest, TheSettingsOfASectionStandTogether) {
    std::set<std::string_view> seen;
    std::string_view section;
    for (const SettingDescription& setting : settingsTable()) {
        if (setting.section != section) {
            section = setting.section;
            EXPECT_TRUE(seen.insert(section).second) << section;
        }
    }
}

TEST(SettingsTableTest, EveryDescriptionIsOneLineWithoutAFullStop) {
    for (const SettingDescription& setting : settingsTable()) {
        EXPECT_FALSE(setting.description.empty()) << setting.name();
        EXPECT_EQ(setting.description.find('\n'), std::string_view::npos) << setting.name();
        EXPECT_FALSE(setting.description.ends_with('.')) << setting.name();
    }
}

TEST(SettingsTableTest, SettingsAreFoundByExactName) {
    ASSERT_NE(findSetting("log", "level"), nullptr);
    EXPECT_EQ(findSetting("log", "level")->name(), "log.level");
    EXPECT_EQ(findSetting("log", "Level"), nullptr);
    EXPECT_EQ(findSetting("", "level"), nullptr);
}

TEST(SettingsTableTest, OnlyFeaturesTakesFurtherKeys) {
    EXPECT_TRUE(isOpenSection("features"));
    EXPECT_FALSE(isOpenSection("device"));
    EXPECT_TRUE(isSettingSection("device"));
    EXPECT_FALSE(isSettingSection("devices"));
}

TEST(SettingsTableTest, SizesAreShownAsSizes) {
    EXPECT_EQ(settingText(SettingKind::ByteSize, std::int64_t{1048576}), "\"1 MiB\"");
    EXPECT_EQ(settingText(SettingKind::Integer, std::int64_t{1048576}), "1048576");
    EXPECT_EQ(settingText(SettingKind::Path, "/x"), "\"/x\"");
}

TEST(SettingsTableTest, WhatIsAllowedIsSaid) {
    EXPECT_EQ(allowedText(*findSetting("device", "InternalBuild")), "true or false");
    EXPECT_EQ(allowedText(*findSetting("store", "commit_messages")), "a whole number, 1 to 65536");
    EXPECT_EQ(allowedText(*findSetting("store", "commit_ms")), "a whole number of milliseconds, 1 to 60000");
    EXPECT_EQ(allowedText(*findSetting("store", "max_bytes")), "a size, 1 MiB to 1 TiB");
    EXPECT_EQ(allowedText(*findSetting("log", "target")), "one of journal, stderr");
    EXPECT_EQ(allowedText(*findSetting("paths", "root")), "an absolute path");
    EXPECT_EQ(allowedText(*findSetting("tally", "used")), "a list of texts");
    EXPECT_EQ(allowedText(*findSetting("beacon", "backends")), "a list of store");
}

TEST(SettingsTableTest, TheExampleFileHoldsEverySettingAsAComment) {
    const std::string file = exampleSettingsFile();
    EXPECT_NE(file.find("\n[log]\n"
                        "# Where log lines go; standard error when there is no journal (one of journal, stderr).\n"
                        "#target = \"journal\"\n"
                        "# The least important level that is logged (one of debug, info, default, error).\n"
                        "#level = \"default\"\n"
                        "\n[store]\n"),
              std::string::npos)
        << file;
    EXPECT_NE(file.find("\n#\"AudioAnalytics/Tracing\" = false\n"), std::string::npos);
    EXPECT_NE(file.find("\n#groups = [\"audio\"]\n"), std::string::npos);
}

} // namespace
} // namespace vela
