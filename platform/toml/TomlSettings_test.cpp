#include "platform/toml/TomlSettings.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::platform {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using List = std::vector<std::string>;

TomlReading read(std::string_view text) { return readTomlSettings(text, "f.toml"); }

std::vector<std::string> faultsOf(std::string_view text) {
    std::vector<std::string> texts;
    for (const SettingError& error : read(text).errors) {
        texts.push_back(error.text());
    }
    return texts;
}

/// The value of the only key of the only section.
SettingValue valueOf(const std::string& toml) {
    const TomlReading reading = read("[s]\nk = " + toml + "\n");
    EXPECT_EQ(reading.settings.size(), 2U) << toml;
    return reading.settings.size() == 2 ? reading.settings[1].value : SettingValue();
}

RawSetting option(std::string_view text) {
    const Result<RawSetting> setting = readSettingOption(text);
    EXPECT_TRUE(static_cast<bool>(setting)) << text;
    return setting ? *setting : RawSetting();
}

TEST(TomlSettingsTest, NothingIsNoSettings) {
    EXPECT_THAT(read("").settings, IsEmpty());
    EXPECT_THAT(read("").errors, IsEmpty());
    EXPECT_THAT(read("# only a comment").settings, IsEmpty());
}

TEST(TomlSettingsTest, EverySectionAndSettingHasItsLine) {
    const TomlReading reading = read("# first\n[log]\nlevel = \"debug\"\n\n[store]\ncommit_ms = 5\n");
    ASSERT_EQ(reading.settings.size(), 4U);
    EXPECT_EQ(reading.settings[0].section, "log");
    EXPECT_EQ(reading.settings[0].value, SettingValue());
    EXPECT_EQ(reading.settings[0].origin.text(), "f.toml:2");
    EXPECT_EQ(reading.settings[1].section, "log");
    EXPECT_EQ(reading.settings[1].key, "level");
    EXPECT_EQ(reading.settings[1].value, SettingValue("debug"));
    EXPECT_EQ(reading.settings[1].origin.text(), "f.toml:3");
    EXPECT_EQ(reading.settings[2].origin.text(), "f.toml:5");
    EXPECT_EQ(reading.settings[3].key, "commit_ms");
    EXPECT_EQ(reading.settings[3].origin.text(), "f.toml:6");
}

TEST(TomlSettingsTest, SettingsStandInTheOrderOfTheText) {
    const TomlReading reading = read("[z]\nb = 1\na = 2\n[a]\nx = 3\n");
    std::vector<std::string> names;
    for (const RawSetting& setting : reading.settings) {
        names.push_back(setting.section + "." + setting.key);
    }
    EXPECT_THAT(names, ElementsAre("z.", "z.b", "z.a", "a.", "a.x"));
}

TEST(TomlSettingsTest, EveryKindOfValueIsRead) {
    EXPECT_EQ(valueOf("true"), SettingValue(true));
    EXPECT_EQ(valueOf("-5"), SettingValue(std::int64_t{-5}));
    EXPECT_EQ(valueOf("0x10"), SettingValue(std::int64_t{16}));
    EXPECT_EQ(valueOf("1.5"), SettingValue(1.5));
    EXPECT_EQ(valueOf("\"a\\tb\""), SettingValue("a\tb"));
    EXPECT_EQ(valueOf("'a\\tb'"), SettingValue("a\\tb"));
    EXPECT_EQ(valueOf("[]"), SettingValue(List{}));
    EXPECT_EQ(valueOf("[\"a\", 'b']"), SettingValue(List{"a", "b"}));
}

TEST(TomlSettingsTest, DottedKeysAndQuotedKeysAreRead) {
    const TomlReading reading = read("log.level = \"info\"\n[features]\n\"A/B\" = true\n");
    ASSERT_EQ(reading.settings.size(), 4U);
    EXPECT_EQ(reading.settings[1].section, "log");
    EXPECT_EQ(reading.settings[1].key, "level");
    EXPECT_EQ(reading.settings[3].key, "A/B");
}

TEST(TomlSettingsTest, LineEndsMayBeOfEitherKindAndAByteOrderMarkMayStandFirst) {
    const TomlReading reading = read("\xef\xbb\xbf[log]\r\nlevel = \"debug\"\r\n");
    ASSERT_EQ(reading.settings.size(), 2U);
    EXPECT_EQ(reading.settings[1].value, SettingValue("debug"));
    EXPECT_EQ(reading.settings[1].origin.line, 2);
}

TEST(TomlSettingsTest, ASyntaxErrorHasLineColumnAndReason) {
    EXPECT_THAT(faultsOf("[log]\nlevel = = 1\n"),
                ElementsAre(::testing::MatchesRegex("f\\.toml:2:9: Error while parsing.*")));
    EXPECT_THAT(read("[log]\nlevel = = 1\n").settings, IsEmpty());
}

TEST(TomlSettingsTest, AKeyThatStandsTwiceIsAnError) {
    EXPECT_THAT(faultsOf("[log]\nlevel = \"a\"\nlevel = \"b\"\n"), ElementsAre(::testing::StartsWith("f.toml:3:")));
    EXPECT_THAT(faultsOf("[log]\n[log]\n"), ElementsAre(::testing::StartsWith("f.toml:2:")));
}

TEST(TomlSettingsTest, AnErrorsTextStaysOnOneLine) {
    for (const SettingError& error : read("[log]\nlevel = \x01\n").errors) {
        EXPECT_EQ(error.text().find('\x01'), std::string::npos);
        EXPECT_EQ(error.text().find('\n'), std::string::npos);
    }
}

TEST(TomlSettingsTest, ValuesThatNoSettingHasAreErrorsBesideTheOthers) {
    EXPECT_THAT(faultsOf("[log]\nlevel = 1979-05-27\ntarget = \"x\"\n[store]\npath = [1]\nmax_bytes = {a = 1}\n"),
                ElementsAre("f.toml:2:9: log.level: a date or time is no value of a setting",
                            "f.toml:6:13: store.max_bytes: a table is no value of a setting",
                            "f.toml:5:8: store.path: a list of something else than texts is no value of a setting"));
    EXPECT_EQ(read("[log]\nlevel = 1979-05-27\ntarget = \"x\"\n").settings.size(), 2U);
}

TEST(TomlSettingsTest, ASettingOutsideEverySectionIsAnError) {
    EXPECT_THAT(faultsOf("level = \"debug\"\n[log]\n"), ElementsAre("f.toml:1:9: level: stands outside every section"));
}

TEST(TomlSettingsTest, AListOfTablesIsNoSection) {
    EXPECT_THAT(faultsOf("[[log]]\nlevel = \"debug\"\n"),
                ElementsAre(::testing::EndsWith("log: stands outside every section")));
}

TEST(TomlSettingsTest, ATableInASectionIsAnError) {
    EXPECT_THAT(faultsOf("[features.Audio]\nTracing = true\n"),
                ElementsAre("f.toml:1:1: features.Audio: a table is no value of a setting"));
}

TEST(TomlSettingsTest, TextOfMoreThanOneMebibyteIsRefused) {
    EXPECT_THAT(faultsOf("#" + std::string(1024 * 1024, 'x')), ElementsAre("f.toml: the file is larger than 1 MiB"));
    EXPECT_THAT(faultsOf("#" + std::string(1024 * 1024 - 1, 'x')), IsEmpty());
}

TEST(TomlSettingsTest, DeepNamesAreRefusedBeforeTheyNest) {
    std::string name = "a";
    for (int depth = 0; depth < 100000; ++depth) {
        name += ".a";
    }
    EXPECT_THAT(faultsOf("[" + name + "]\nk = 1\n"), ElementsAre("f.toml:1: more than 16 dots in one line"));
    EXPECT_THAT(faultsOf(name + " = 1\n"), ElementsAre("f.toml:1: more than 16 dots in one line"));
}

TEST(TomlSettingsTest, DeepListsAndTablesAreRefused) {
    EXPECT_THAT(faultsOf("[s]\nk = " + std::string(100000, '[')), ElementsAre(::testing::StartsWith("f.toml:2:")));
    std::string tables = "[s]\nk = ";
    for (int depth = 0; depth < 10000; ++depth) {
        tables += "{a=";
    }
    EXPECT_THAT(faultsOf(tables), ElementsAre(::testing::StartsWith("f.toml:2:")));
}

TEST(TomlSettingsTest, WhatTheParserOnlyAssertsIsAnError) {
    for (const char* text : {"[=", "[.", "[,", "[\n", "[{", "a.=1"}) {
        EXPECT_THAT(faultsOf(text), ElementsAre(::testing::StartsWith("f.toml:1"))) << text;
    }
}

TEST(TomlSettingsTest, AFileOfManyLinesIsReadInTime) {
    std::string text;
    for (int line = 1; line < 19990; ++line) {
        text += "[a.x" + std::to_string(line) + "]\n";
    }
    EXPECT_EQ(read(text).errors.size(), 19989U);
}

TEST(SettingOptionTest, ATextNeedsNoMarks) {
    const RawSetting setting = option("log.level=debug");
    EXPECT_EQ(setting.section, "log");
    EXPECT_EQ(setting.key, "level");
    EXPECT_EQ(setting.value, SettingValue("debug"));
    EXPECT_EQ(setting.origin.text(), "--set");
}

TEST(SettingOptionTest, AValueIsTomlWhereItIs) {
    EXPECT_EQ(option("a.b=true").value, SettingValue(true));
    EXPECT_EQ(option("a.b=64").value, SettingValue(std::int64_t{64}));
    EXPECT_EQ(option("a.b=0.5").value, SettingValue(0.5));
    EXPECT_EQ(option("a.b=\"true\"").value, SettingValue("true"));
    EXPECT_EQ(option("a.b=[\"x\", \"y\"]").value, SettingValue(List{"x", "y"}));
}

TEST(SettingOptionTest, WhatIsNoValueOfASettingIsText) {
    EXPECT_EQ(option("a.b=").value, SettingValue(""));
    EXPECT_EQ(option("a.b=256 MiB").value, SettingValue("256 MiB"));
    EXPECT_EQ(option("a.b=/var/lib/x").value, SettingValue("/var/lib/x"));
    EXPECT_EQ(option("a.b=1979-05-27").value, SettingValue("1979-05-27"));
    EXPECT_EQ(option("a.b={x=1}").value, SettingValue("{x=1}"));
    EXPECT_EQ(option("a.b=[1]").value, SettingValue("[1]"));
    EXPECT_EQ(option("a.b=1, c = 2").value, SettingValue("1, c = 2"));
}

TEST(SettingOptionTest, AValueCannotBringASecondSetting) {
    EXPECT_EQ(option("a.b=1\nc = 2").value, SettingValue("1\nc = 2"));
}

TEST(SettingOptionTest, EqualsSignsAndDotsMayStandInTheValue) {
    EXPECT_EQ(option("store.path=/a=b.c").value, SettingValue("/a=b.c"));
    EXPECT_EQ(option("store.path=/a=b.c").key, "path");
}

TEST(SettingOptionTest, AKeyMayHaveDotsAndMarks) {
    EXPECT_EQ(option("features.Some.Domain/X=true").key, "Some.Domain/X");
    EXPECT_EQ(option("features.\"A/B\"=true").key, "A/B");
    EXPECT_EQ(option("features.\"=true").key, "\"");
}

TEST(SettingOptionTest, BlanksAroundNameAndValueDoNotCount) {
    const RawSetting setting = option(" log.level =\t debug ");
    EXPECT_EQ(setting.section, "log");
    EXPECT_EQ(setting.key, "level");
    EXPECT_EQ(setting.value, SettingValue("debug"));
}

TEST(SettingOptionTest, WithoutSectionKeyOrValueItIsRefused) {
    for (const char* text : {"", "log.level", "level=debug", ".level=debug", "log.=debug", "=", "."}) {
        const Result<RawSetting> setting = readSettingOption(text);
        ASSERT_FALSE(static_cast<bool>(setting)) << text;
        EXPECT_EQ(setting.failure().description, "\"" + std::string(text) + "\" is not section.key=value");
    }
}

TEST(SettingOptionTest, DeepValuesStayText) {
    const std::string deep(5000, '[');
    EXPECT_EQ(option("a.b=" + deep).value, SettingValue(deep));
}

} // namespace
} // namespace vela::platform
