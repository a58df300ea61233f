#include "common/SettingCheck.h"

#include <gtest/gtest.h>

namespace vela {
namespace {

const SettingDescription& setting(std::string_view section, std::string_view key) {
    const SettingDescription* found = findSetting(section, key);
    EXPECT_NE(found, nullptr);
    return *found;
}

std::string faultOf(std::string_view section, std::string_view key, const SettingValue& value) {
    const auto checked = checkSetting(setting(section, key), value);
    return checked ? "" : checked.failure().description;
}

SettingValue checkedValue(std::string_view section, std::string_view key, const SettingValue& value) {
    const auto checked = checkSetting(setting(section, key), value);
    return checked ? *checked : SettingValue();
}

TEST(SettingCheckTest, ABooleanIsTrueOrFalseAndNothingElse) {
    EXPECT_EQ(checkedValue("device", "InternalBuild", true), SettingValue(true));
    EXPECT_EQ(faultOf("device", "InternalBuild", std::int64_t{1}), "1 is not true or false");
    EXPECT_EQ(faultOf("device", "InternalBuild", "true"), "\"true\" is not true or false");
}

TEST(SettingCheckTest, ANumberHasARange) {
    EXPECT_EQ(checkedValue("limits", "value_depth", std::int64_t{1}), SettingValue(std::int64_t{1}));
    EXPECT_EQ(checkedValue("limits", "value_depth", std::int64_t{128}), SettingValue(std::int64_t{128}));
    EXPECT_EQ(faultOf("limits", "value_depth", std::int64_t{0}), "0 is outside 1 to 128");
    EXPECT_EQ(faultOf("limits", "value_depth", std::int64_t{129}), "129 is outside 1 to 128");
    EXPECT_EQ(faultOf("limits", "value_depth", std::int64_t{-1}), "-1 is outside 1 to 128");
}

TEST(SettingCheckTest, ANumberIsNoRealAndNoText) {
    EXPECT_EQ(faultOf("limits", "value_depth", 1.0), "1 is not a whole number, 1 to 128");
    EXPECT_EQ(faultOf("store", "commit_ms", "250"), "\"250\" is not a whole number of milliseconds, 1 to 60000");
}

TEST(SettingCheckTest, CommitMessagesHasSensibleBounds) {
    EXPECT_EQ(faultOf("store", "commit_messages", std::int64_t{0}), "0 is outside 1 to 65536");
    EXPECT_EQ(faultOf("store", "commit_messages", std::int64_t{65537}), "65537 is outside 1 to 65536");
}

TEST(SettingCheckTest, ASizeIsTextOrBytes) {
    EXPECT_EQ(checkedValue("limits", "message_bytes", "64 KiB"), SettingValue(std::int64_t{65536}));
    EXPECT_EQ(checkedValue("limits", "message_bytes", std::int64_t{65536}), SettingValue(std::int64_t{65536}));
    EXPECT_EQ(faultOf("limits", "message_bytes", true), "true is not a size, 1 KiB to 128 MiB");
    EXPECT_EQ(faultOf("limits", "message_bytes", 1.5), "1.5 is not a size, 1 KiB to 128 MiB");
}

TEST(SettingCheckTest, ASizeHasARange) {
    EXPECT_EQ(faultOf("limits", "message_bytes", "1023 B"), "\"1023 B\" is outside 1 KiB to 128 MiB");
    EXPECT_EQ(faultOf("limits", "message_bytes", "129 MiB"), "\"129 MiB\" is outside 1 KiB to 128 MiB");
    EXPECT_EQ(faultOf("limits", "message_bytes", std::int64_t{0}), "0 is outside 1 KiB to 128 MiB");
    EXPECT_EQ(faultOf("limits", "message_bytes", "0 KiB"), "\"0 KiB\" is no bytes at all");
}

TEST(SettingCheckTest, AChoiceIsExactlyOneOfItsTexts) {
    EXPECT_EQ(checkedValue("log", "level", "debug"), SettingValue("debug"));
    EXPECT_EQ(faultOf("log", "level", "loud"), "\"loud\" is none of debug, info, default, error");
    EXPECT_EQ(faultOf("log", "level", "Debug"), "\"Debug\" is none of debug, info, default, error");
    EXPECT_EQ(faultOf("log", "target", std::int64_t{2}), "2 is none of journal, stderr");
}

TEST(SettingCheckTest, APathIsATextThatTheSystemCanTake) {
    EXPECT_EQ(checkedValue("store", "path", "<state>/x"), SettingValue("<state>/x"));
    EXPECT_EQ(faultOf("store", "path", true), "true is not an absolute path");
    EXPECT_EQ(faultOf("store", "path", ""), "the path is empty");
    EXPECT_EQ(faultOf("store", "path", std::string("/a\0b", 4)), R"("/a\u0000b" has a zero byte in it)");
    EXPECT_EQ(faultOf("store", "path", "/" + std::string(4095, 'x')), "the path is longer than 4095 bytes");
    EXPECT_EQ(faultOf("store", "path", "/" + std::string(4094, 'x')), "");
}

TEST(SettingCheckTest, AListHoldsTextsOfWhichNoneIsEmpty) {
    using List = std::vector<std::string>;
    EXPECT_EQ(checkedValue("tally", "used", List{"com.*", "x"}), SettingValue(List{"com.*", "x"}));
    EXPECT_EQ(checkedValue("access", "users", List{}), SettingValue(List{}));
    EXPECT_EQ(faultOf("tally", "used", "com.*"), "\"com.*\" is not a list of texts");
    EXPECT_EQ(faultOf("tally", "used", List{"a", ""}), "\"\" cannot be in the list");
    EXPECT_EQ(faultOf("access", "users", List{std::string("a\0", 2)}), R"("a\u0000" cannot be in the list)");
}

TEST(SettingCheckTest, ABackEndIsAKnownOne) {
    using List = std::vector<std::string>;
    EXPECT_EQ(checkedValue("beacon", "backends", List{"store"}), SettingValue(List{"store"}));
    EXPECT_EQ(checkedValue("beacon", "backends", List{}), SettingValue(List{}));
    EXPECT_EQ(faultOf("beacon", "backends", List{"store", "cloud"}), "\"cloud\" is none of store");
}

} // namespace
} // namespace vela
