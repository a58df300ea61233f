// The picture of a run, byte for byte and as a JSON reader sees it.
#include "testing/FakeFileSystem.h"
#include "tracing/ChromeTrace.h"
#include "tracing/Trace_test.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

namespace vela {

namespace {

class ChromeTraceTest : public ::testing::Test {
protected:
    ChromeTraceTest() { EXPECT_TRUE(files_.createDirectories("/t", 0777)); }

    void add(const std::string& name, std::uint32_t begin, std::uint32_t end, bool matchedByThread) {
        trace_.addTraceDataToCollect(std::make_unique<TraceInterval>(name, begin, end, matchedByThread));
    }
    std::string write(const std::vector<trace_point>& points, const ChromeTraceFacts& facts) {
        trace_.processTracepoints(*clock_.session, points);
        const auto file = files_.createFile("/t/r.json", 0644);
        ChromeTrace picture(*file, facts);
        picture.add(trace_);
        picture.finish();
        EXPECT_TRUE(file->commit());
        return *files_.contentOf("/t/r.json");
    }

    testing::FakeFileSystem files_;
    TraceClock clock_;
    Trace trace_{"start", true};
};

TEST_F(ChromeTraceTest, PairsAreCompleteEventsInMicroseconds) {
    add("open", 1, 2, true);
    add("wide", 3, 4, false);
    trace_point end = eventAt(1'500'000, 2, 8);
    end.processID = 70;
    EXPECT_EQ(
        write({eventAt(12'345, 1, 8), eventAt(12'400, 3, 7), eventAt(20'000, 4, 9), end}, {"VelaReporting", 4, 3, 5}),
        "{\"displayTimeUnit\":\"ns\",\n"
        "\"otherData\":{\"writer\":\"VelaReporting\",\"version\":4,\"intervalsLeftOut\":3,\"lostEvents\":5},\n"
        "\"traceEvents\":[\n"
        "{\"ph\":\"X\",\"name\":\"wide\",\"cat\":\"start\",\"ts\":12.4,\"dur\":7.6,\"pid\":0,\"tid\":7,"
        "\"args\":{\"endThread\":9}},\n"
        "{\"ph\":\"X\",\"name\":\"open\",\"cat\":\"start\",\"ts\":12.345,\"dur\":1487.655,\"pid\":70,\"tid\":8}\n"
        "]}\n");
}

TEST_F(ChromeTraceTest, TimesKeepEveryNanosecond) {
    add("a", 1, 2, true);
    const std::string text = write({eventAt(9'007'199'254'740'993, 1), eventAt(9'007'199'254'740'994, 2)}, {});
    EXPECT_THAT(text, ::testing::HasSubstr("\"ts\":9007199254740.993,\"dur\":0.001,"));
}

TEST_F(ChromeTraceTest, AnEmptyRunIsAnEmptyPicture) {
    const auto picture = nlohmann::json::parse(write({}, {"VelaReporting", 4, 0, 0}));
    EXPECT_TRUE(picture["traceEvents"].empty());
    EXPECT_EQ(picture["otherData"]["intervalsLeftOut"], 0);
}

TEST_F(ChromeTraceTest, NamesFromOutsideStayNames) {
    add("a \"quoted\" \\ name\n\x01 \xFF", 1, 2, true);
    const auto picture = nlohmann::json::parse(write({eventAt(1, 1), eventAt(3, 2)}, {}));
    ASSERT_EQ(picture["traceEvents"].size(), 1U);
    EXPECT_EQ(picture["traceEvents"][0]["name"], "a \"quoted\" \\ name\n\x01 \xEF\xBF\xBD");
}

TEST_F(ChromeTraceTest, ALongRunIsWrittenInPiecesAndReadsWhole) {
    constexpr std::uint64_t kPairs = 30'000;
    add("pair", 1, 2, true);
    std::vector<trace_point> points;
    for (std::uint64_t i = 0; i < kPairs; ++i) {
        points.push_back(eventAt(10 * i, 1));
        points.push_back(eventAt(10 * i + 4, 2));
    }
    const auto picture = nlohmann::json::parse(write(points, {}));
    ASSERT_EQ(picture["traceEvents"].size(), kPairs);
    for (std::uint64_t i = 0; i < kPairs; ++i) {
        const auto& event = picture["traceEvents"][i];
        ASSERT_EQ(event["ph"], "X");
        ASSERT_EQ(event["ts"], static_cast<double>(i) / 100);
        ASSERT_EQ(event["dur"], 0.004);
        ASSERT_EQ(event["tid"], 1);
    }
    EXPECT_LT(files_.longestPiece(), 1'100'000U);
}

} // namespace

} // namespace vela
