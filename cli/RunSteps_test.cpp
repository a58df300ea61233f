#include "cli/RunSteps.h"
#include "common/values/Dictionary.h"

#include <gtest/gtest.h>
#include <sstream>
#include <string>

namespace vela {
namespace {

std::string faultOfRun(const std::string& text) {
    std::istringstream in(text);
    const auto steps = readRunSteps(in);
    return steps ? "no fault" : steps.failure().description;
}

constexpr const char* kForm = R"(a line is {"call":"OPERATION","args":[...]} or {"sleep":SECONDS})";

TEST(RunStepsTest, LinesAreCallsAndPauses) {
    std::istringstream in(R"(# a session
{"call":"createReportingSession","args":[42]}

{"sleep":1.5}
	{"args":[],"call":"getAllReporters"}
{"call":"killService"})");
    const auto steps = readRunSteps(in);
    ASSERT_TRUE(steps) << steps.failure().description;
    ASSERT_EQ(steps->size(), 4U);
    EXPECT_EQ((*steps)[0].line, 2U);
    EXPECT_EQ((*steps)[0].operation->name, "createReportingSession");
    ASSERT_EQ((*steps)[0].arguments.size(), 1U);
    EXPECT_EQ((*steps)[0].arguments[0], Value(42));
    EXPECT_EQ((*steps)[1].line, 4U);
    EXPECT_EQ((*steps)[1].operation, nullptr);
    EXPECT_EQ((*steps)[1].seconds, 1.5);
    EXPECT_EQ((*steps)[2].operation->name, "getAllReporters");
    EXPECT_EQ((*steps)[3].line, 6U);
    EXPECT_EQ((*steps)[3].operation->name, "killService");
}

TEST(RunStepsTest, AnOperationThatDoesNotExistIsNamed) {
    EXPECT_EQ(faultOfRun("{\"sleep\":0}\n{\"call\":\"createReportingSesion\",\"args\":[42]}\n"),
              ":2: there is no operation \"createReportingSesion\"");
    EXPECT_EQ(faultOfRun(R"({"call":"a\nb"})"), ":1: there is no operation \"a\\nb\"");
}

TEST(RunStepsTest, AnUnknownMemberIsNamed) {
    EXPECT_EQ(faultOfRun(R"({"calls":"getAllReporters"})"), std::string(":1: there is no member \"calls\": ") + kForm);
    EXPECT_EQ(faultOfRun(R"({"call":"getAllReporters","arguments":[]})"),
              std::string(":1: there is no member \"arguments\": ") + kForm);
}

TEST(RunStepsTest, AMemberOfAnotherTypeIsNamed) {
    EXPECT_EQ(faultOfRun(R"({"call":5})"), ":1: \"call\" is no text");
    EXPECT_EQ(faultOfRun(R"({"call":"createReportingSession","args":42})"), ":1: \"args\" is no array");
    EXPECT_EQ(faultOfRun(R"({"sleep":"1"})"), ":1: \"sleep\" is no number of seconds");
}

TEST(RunStepsTest, WhatIsNeitherACallNorAPauseIsToldTheForm) {
    EXPECT_EQ(faultOfRun("{}"), std::string(":1: ") + kForm);
    EXPECT_EQ(faultOfRun("[]"), std::string(":1: ") + kForm);
    EXPECT_EQ(faultOfRun(R"({"args":[42]})"), std::string(":1: ") + kForm);
}

TEST(RunStepsTest, APauseStandsAlone) {
    EXPECT_EQ(faultOfRun(R"({"sleep":1,"call":"getAllReporters"})"), ":1: a line with \"sleep\" has no other member");
    EXPECT_EQ(faultOfRun(R"({"sleep":86400})"), "no fault");
    EXPECT_EQ(faultOfRun(R"({"sleep":86400.5})"), ":1: a pause has 0 to 86400 seconds");
    EXPECT_EQ(faultOfRun(R"({"sleep":-1})"), ":1: a pause has 0 to 86400 seconds");
}

TEST(RunStepsTest, ArgumentsAreTriedOut) {
    EXPECT_EQ(faultOfRun(R"({"call":"getAllReporters","args":[1]})"),
              ":1: the operation is called as: getAllReporters");
    EXPECT_EQ(faultOfRun(R"({"call":"getAllReporters"} {})"), ":1: no JSON at byte 28");
}

} // namespace
} // namespace vela
