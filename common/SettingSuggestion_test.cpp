#include "common/SettingSuggestion.h"

#include <gtest/gtest.h>

namespace vela {
namespace {

TEST(SettingSuggestionTest, TheDistanceCountsSingleChanges) {
    EXPECT_EQ(editDistance("", ""), 0U);
    EXPECT_EQ(editDistance("", "abc"), 3U);
    EXPECT_EQ(editDistance("level", "levle"), 2U);
    EXPECT_EQ(editDistance("kitten", "sitting"), 3U);
    EXPECT_EQ(editDistance("same", "same"), 0U);
}

TEST(SettingSuggestionTest, CapitalLettersAreNoChange) {
    EXPECT_EQ(editDistance("InternalBuild", "internalbuild"), 0U);
}

TEST(SettingSuggestionTest, OnlyTheFirstSixtyFourBytesCount) {
    EXPECT_EQ(editDistance(std::string(64, 'x') + "abc", std::string(64, 'x')), 0U);
    EXPECT_EQ(editDistance(std::string(100000, 'x'), ""), 64U);
}

TEST(SettingSuggestionTest, ASlipOfThePenIsUnderstood) {
    EXPECT_EQ(settingSuggestion("log", "levle"), "; did you mean log.level?");
    EXPECT_EQ(settingSuggestion("device", "internalbuild"), "; did you mean device.InternalBuild?");
    EXPECT_EQ(settingSuggestion("limits", "sesion_bytes"), "; did you mean limits.session_bytes?");
}

TEST(SettingSuggestionTest, AKeyOfAnotherSectionIsFound) {
    EXPECT_EQ(settingSuggestion("limits", "max_bytes"), "; did you mean store.max_bytes?");
    EXPECT_EQ(settingSuggestion("store", "runtime"), "; did you mean paths.runtime?");
}

TEST(SettingSuggestionTest, WhatIsNothingLikeASettingGetsNoSuggestion) {
    EXPECT_EQ(settingSuggestion("log", "utterly_different_thing"), "");
    EXPECT_EQ(sectionSuggestion("utterly"), "");
}

TEST(SettingSuggestionTest, ASectionIsUnderstoodToo) {
    EXPECT_EQ(sectionSuggestion("lmits"), "; did you mean limits?");
    EXPECT_EQ(sectionSuggestion("Log"), "; did you mean log?");
}

TEST(SettingSuggestionTest, ANameFromOutsideStaysOnOneLine) {
    EXPECT_EQ(displayedName("a\nb"), "a\\nb");
    EXPECT_EQ(displayedName(std::string(81, 'x')), std::string(80, 'x') + "...");
    EXPECT_EQ(displayedName(""), "");
}

} // namespace
} // namespace vela
