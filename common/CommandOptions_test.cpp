#include "common/CommandOptions.h"

#include <array>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr std::array<CommandOption, 2> kKnown{{{"--set", true}, {"--json"}}};

platform::Result<CommandArguments> read(const std::vector<std::string_view>& arguments) {
    return readArguments(arguments, kKnown);
}

TEST(CommandOptionsTest, NothingIsNothing) {
    const auto arguments = read({});
    ASSERT_TRUE(static_cast<bool>(arguments));
    EXPECT_THAT(arguments->options, IsEmpty());
    EXPECT_THAT(arguments->operands, IsEmpty());
    EXPECT_FALSE(arguments->has("--json"));
}

TEST(CommandOptionsTest, AValueFollowsOrStandsBehindTheEqualsSign) {
    const auto arguments = read({"--set", "a.b=c", "--set=d=e", "--set="});
    ASSERT_TRUE(static_cast<bool>(arguments));
    EXPECT_THAT(arguments->valuesOf("--set"), ElementsAre("a.b=c", "d=e", ""));
}

TEST(CommandOptionsTest, AValueMayLookLikeAnOption) {
    const auto arguments = read({"--set", "--json"});
    ASSERT_TRUE(static_cast<bool>(arguments));
    EXPECT_THAT(arguments->valuesOf("--set"), ElementsAre("--json"));
    EXPECT_FALSE(arguments->has("--json"));
}

TEST(CommandOptionsTest, OperandsMayStandAnywhere) {
    const auto arguments = read({"one", "--json", "two", "-"});
    ASSERT_TRUE(static_cast<bool>(arguments));
    EXPECT_TRUE(arguments->has("--json"));
    EXPECT_THAT(arguments->operands, ElementsAre("one", "two", "-"));
}

TEST(CommandOptionsTest, EverythingBehindTwoDashesIsAnOperand) {
    const auto arguments = read({"--", "--json", "--nothing"});
    ASSERT_TRUE(static_cast<bool>(arguments));
    EXPECT_FALSE(arguments->has("--json"));
    EXPECT_THAT(arguments->operands, ElementsAre("--json", "--nothing"));
}

TEST(CommandOptionsTest, ANegativeNumberIsAnOperand) {
    const auto arguments = read({"-5", "--json", "-0x11", "-1.5"});
    ASSERT_TRUE(static_cast<bool>(arguments));
    EXPECT_TRUE(arguments->has("--json"));
    EXPECT_THAT(arguments->operands, ElementsAre("-5", "-0x11", "-1.5"));
    EXPECT_EQ(read({"--5"}).failure().description, "there is no option --5");
}

TEST(CommandOptionsTest, AnUnknownOptionIsRefused) {
    EXPECT_EQ(read({"--sett"}).failure().description, "there is no option --sett");
    EXPECT_EQ(read({"-j"}).failure().description, "there is no option -j");
    EXPECT_EQ(read({"--x=y"}).failure().description, "there is no option --x");
    EXPECT_EQ(read({"--a\nb"}).failure().description, "there is no option --a\\nb");
}

TEST(CommandOptionsTest, AMissingValueIsRefused) {
    EXPECT_EQ(read({"--set"}).failure().description, "--set needs a value");
}

TEST(CommandOptionsTest, AValueForAnOptionWithoutOneIsRefused) {
    EXPECT_EQ(read({"--json=yes"}).failure().description, "--json takes no value");
}

} // namespace
} // namespace vela
