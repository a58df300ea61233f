// `velactl trace report`: what it reads, what it makes of it, how it shows it.
#include "cli/Subcommand.h"
#include "cli/TraceReport.h"
#include "testing/TemporaryFolder.h"

#include <cmath>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <nlohmann/json.hpp>
#include <numeric>
#include <sstream>

namespace vela {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

constexpr const char* kHeading = "{\"format\":\"metricsheet\",\"writer\":\"VelaReporting\",\"version\":4}\n";

std::string line(const std::string& name, const std::string& value) {
    return "{\"name\":\"" + name + "\",\"value\":" + value + ",\"unit\":\"nanoseconds\"}\n";
}

platform::Result<TraceResultsFile> resultsIn(const std::string& text) {
    std::istringstream in(text);
    return readTraceResults(in);
}

std::string faultIn(const std::string& text) {
    const auto file = resultsIn(text);
    return file ? "none" : file.failure().description;
}

// Reading.

TEST(TraceReportTest, ValuesAreGatheredByNameInTheOrderOfTheFile) {
    const auto file = resultsIn(kHeading + line("open", "123.0") + line("close", "5.5") + line("open", "7"));
    ASSERT_TRUE(file);
    ASSERT_EQ(file->intervals.size(), 2U);
    EXPECT_EQ(file->intervals[0].name, "open");
    EXPECT_EQ(file->intervals[0].unit, "nanoseconds");
    EXPECT_THAT(file->intervals[0].values, ::testing::ElementsAre(123, 7));
    EXPECT_EQ(file->intervals[1].name, "close");
    EXPECT_THAT(file->intervals[1].values, ::testing::ElementsAre(5.5));
    EXPECT_EQ(file->lostEvents, 0);
}

TEST(TraceReportTest, ARunWithoutPairsHasNoIntervals) {
    const auto file = resultsIn(kHeading);
    ASSERT_TRUE(file);
    EXPECT_TRUE(file->intervals.empty());
}

TEST(TraceReportTest, LostEventsAreNoInterval) {
    const auto file = resultsIn(kHeading + line("lost events", "1.0") +
                                "{\"name\":\"lost events\",\"value\":17.0,\"unit\":\"events\"}\n");
    ASSERT_TRUE(file);
    EXPECT_EQ(file->lostEvents, 17);
    ASSERT_EQ(file->intervals.size(), 1U);
    EXPECT_EQ(file->intervals[0].unit, "nanoseconds");
}

TEST(TraceReportTest, UnitsAreKeptApart) {
    const auto file = resultsIn(kHeading + line("a", "1.0") + "{\"name\":\"a\",\"value\":2.0,\"unit\":\"bytes\"}\n");
    ASSERT_TRUE(file);
    EXPECT_EQ(file->intervals.size(), 2U);
}

TEST(TraceReportTest, FaultsAreToldWithTheirLine) {
    EXPECT_EQ(faultIn(""), "1: it is empty");
    EXPECT_EQ(faultIn("{}\n"), "1: no trace results: the first line must name the format metricsheet and its version");
    EXPECT_EQ(faultIn("{\"format\":\"other\",\"version\":4}\n"),
              "1: no trace results: the first line must name the format metricsheet and its version");
    EXPECT_EQ(faultIn("{\"format\":\"metricsheet\",\"version\":5}\n"), "1: its version is not 4");
    EXPECT_EQ(faultIn("[]\n"), "1: a line is one JSON object");
    EXPECT_THAT(faultIn("PK\x03\x04"), StartsWith("1: "));
    EXPECT_THAT(faultIn(std::string(kHeading) + line("a", "1") + "{\"name\":\"a\",\"val"), StartsWith("3: "));
    EXPECT_THAT(faultIn(std::string(kHeading) + "\n" + line("a", "1")), StartsWith("2: "));
    const std::string value = "a value is an object with a name, a number as its value, and a unit";
    EXPECT_EQ(faultIn(std::string(kHeading) + "{\"name\":\"a\",\"value\":\"1\",\"unit\":\"u\"}\n"), "2: " + value);
    EXPECT_EQ(faultIn(std::string(kHeading) + "{\"name\":7,\"value\":1,\"unit\":\"u\"}\n"), "2: " + value);
    EXPECT_EQ(faultIn(std::string(kHeading) + "{\"name\":\"a\",\"value\":1}\n"), "2: " + value);
    EXPECT_EQ(faultIn(std::string(kHeading) + "7\n"), "2: a line is one JSON object");
}

// Numbers.

TEST(TraceReportTest, OneValueIsEveryFigure) {
    const TraceSummary summary = summarize({7});
    EXPECT_EQ(summary.count, 1U);
    EXPECT_EQ(summary.min, 7);
    EXPECT_EQ(summary.median, 7);
    EXPECT_EQ(summary.p99, 7);
    EXPECT_EQ(summary.max, 7);
}

TEST(TraceReportTest, TheMedianOfAnEvenNumberLiesHalfWay) {
    EXPECT_EQ(summarize({4, 1, 2, 10}).median, 3);
    EXPECT_EQ(summarize({4, 1, 10}).median, 4);
}

TEST(TraceReportTest, NinetyNineOfAHundredAreNotAboveP99) {
    std::vector<double> values(100);
    std::iota(values.rbegin(), values.rend(), 1);
    const TraceSummary summary = summarize(values);
    EXPECT_EQ(summary.min, 1);
    EXPECT_EQ(summary.median, 50.5);
    EXPECT_EQ(summary.p99, 99);
    EXPECT_EQ(summary.max, 100);
    values.push_back(101);
    EXPECT_EQ(summarize(values).p99, 100);
    EXPECT_EQ(summarize({1, 2}).p99, 2);
}

std::size_t total(const std::vector<TraceBucket>& buckets) {
    std::size_t sum = 0;
    for (const TraceBucket& bucket : buckets) {
        sum += bucket.count;
    }
    return sum;
}

TEST(TraceReportTest, EqualValuesAreOneBucket) {
    const auto buckets = histogramOf({5, 5, 5});
    ASSERT_EQ(buckets.size(), 1U);
    EXPECT_EQ(buckets[0].from, 5);
    EXPECT_EQ(buckets[0].to, 5);
    EXPECT_EQ(buckets[0].count, 3U);
}

TEST(TraceReportTest, ANarrowRangeHasBucketsOfEqualWidth) {
    const auto buckets = histogramOf({100, 110, 119, 120, 200});
    ASSERT_EQ(buckets.size(), 10U);
    EXPECT_EQ(buckets[0].from, 100);
    EXPECT_EQ(buckets[0].to, 110);
    EXPECT_EQ(buckets[0].count, 1U);
    EXPECT_EQ(buckets[1].count, 2U);
    EXPECT_EQ(buckets[2].count, 1U);
    EXPECT_EQ(buckets[9].to, 200);
    EXPECT_EQ(buckets[9].count, 1U);
}

TEST(TraceReportTest, AWideRangeHasBucketsOfEqualRatio) {
    const auto buckets = histogramOf({1, 1.5, 1e10});
    ASSERT_EQ(buckets.size(), 10U);
    EXPECT_EQ(buckets[0].count, 2U);
    EXPECT_DOUBLE_EQ(buckets[3].to, 1e4);
    EXPECT_EQ(buckets[9].to, 1e10);
    EXPECT_EQ(buckets[9].count, 1U);
}

TEST(TraceReportTest, ARangeFromZeroHasBucketsOfEqualWidth) {
    const auto buckets = histogramOf({0, 1e9});
    EXPECT_EQ(buckets[0].to, 1e8);
    EXPECT_EQ(total(buckets), 2U);
}

TEST(TraceReportTest, EveryValueIsInOneBucket) {
    std::vector<double> values(10'000);
    for (std::size_t i = 0; i < values.size(); ++i) {
        values[i] = 1.1 * static_cast<double>(i * i) + 3;
    }
    values.push_back(18446744073709551616.0);
    EXPECT_EQ(total(histogramOf(values)), values.size());
}

TEST(TraceReportTest, TheSmallestAndTheLargestNumbersHaveBoundsThatAreNumbers) {
    const auto tiny = histogramOf({5e-324, 1e300});
    ASSERT_EQ(tiny.size(), 10U);
    EXPECT_EQ(tiny[0].from, 5e-324);
    EXPECT_DOUBLE_EQ(tiny[0].to, 1e299);
    EXPECT_EQ(tiny[0].count, 1U);
    EXPECT_EQ(tiny[9].to, 1e300);
    EXPECT_EQ(tiny[9].count, 1U);
    const auto wide = histogramOf({-1.5e308, 1.5e308});
    EXPECT_DOUBLE_EQ(wide[0].to, -1.2e308);
    EXPECT_EQ(wide[9].to, 1.5e308);
    for (const TraceBucket& bucket : wide) {
        EXPECT_TRUE(std::isfinite(bucket.from) && std::isfinite(bucket.to));
    }
    EXPECT_EQ(total(wide), 2U);
    EXPECT_EQ(summarize({-1.5e308, 1.5e308}).median, 0);
}

TEST(TraceReportTest, DurationsHaveAUnitThatFits) {
    EXPECT_EQ(durationText(0), "0 ns");
    EXPECT_EQ(durationText(1), "1 ns");
    EXPECT_EQ(durationText(1.25), "1.25 ns");
    EXPECT_EQ(durationText(250), "250 ns");
    EXPECT_EQ(durationText(999), "999 ns");
    EXPECT_EQ(durationText(999.9), "1 us");
    EXPECT_EQ(durationText(1'000), "1 us");
    EXPECT_EQ(durationText(1'254), "1.25 us");
    EXPECT_EQ(durationText(12'345), "12.3 us");
    EXPECT_EQ(durationText(100'000), "100 us");
    EXPECT_EQ(durationText(5'000'000), "5 ms");
    EXPECT_EQ(durationText(1.5e9), "1.5 s");
    EXPECT_EQ(durationText(120e9), "120 s");
    EXPECT_EQ(durationText(18446744073709551616.0), "18446744074 s");
    EXPECT_EQ(durationText(-1'500), "-1.5 us");
}

// The command.

class TraceReportCommandTest : public ::testing::Test {
protected:
    int run(const std::vector<std::string_view>& arguments, const std::string& input = "") {
        std::istringstream in(input);
        std::ostringstream out;
        std::ostringstream error;
        Console console{in, out, error, false, false};
        const int status = runVelactl(arguments, console);
        out_ = out.str();
        error_ = error.str();
        return status;
    }

    std::string out_;
    std::string error_;
};

TEST_F(TraceReportCommandTest, IntervalsAreATableAndAHistogramEach) {
    const testing::TemporaryFolder folder;
    const std::string path = folder / "r.msj";
    std::ofstream(path) << kHeading << line("open", "100.0") << line("open", "110.0") << line("open", "119.0")
                        << line("open", "200.0") << line("close", "1500.0");
    EXPECT_EQ(run({"trace", "report", path}), kDone);
    EXPECT_EQ(error_, "");
    EXPECT_EQ(out_, "INTERVAL  COUNT  MIN     MEDIAN  P99     MAX\n"
                    "open      4      100 ns  114 ns  200 ns  200 ns\n"
                    "close     1      1.5 us  1.5 us  1.5 us  1.5 us\n"
                    "\n"
                    "open\n"
                    "  100 ns - 110 ns  #################### 1\n"
                    "  110 ns - 120 ns  ######################################## 2\n"
                    "  120 ns - 130 ns  0\n"
                    "  130 ns - 140 ns  0\n"
                    "  140 ns - 150 ns  0\n"
                    "  150 ns - 160 ns  0\n"
                    "  160 ns - 170 ns  0\n"
                    "  170 ns - 180 ns  0\n"
                    "  180 ns - 190 ns  0\n"
                    "  190 ns - 200 ns  #################### 1\n"
                    "\n"
                    "close\n"
                    "  1.5 us - 1.5 us  ######################################## 1\n");
}

TEST_F(TraceReportCommandTest, JsonIsALineForEachInterval) {
    EXPECT_EQ(run({"trace", "report", "-", "--json"},
                  kHeading + line("open", "100.0") + line("open", "200.0") + line("close", "5.0") +
                      "{\"name\":\"lost events\",\"value\":3.0,\"unit\":\"events\"}\n"),
              kDone);
    std::istringstream lines(out_);
    std::string text;
    std::getline(lines, text);
    const auto open = nlohmann::json::parse(text);
    EXPECT_EQ(open["name"], "open");
    EXPECT_EQ(open["unit"], "nanoseconds");
    EXPECT_EQ(open["count"], 2);
    EXPECT_EQ(open["min"], 100.0);
    EXPECT_EQ(open["median"], 150.0);
    EXPECT_EQ(open["p99"], 200.0);
    EXPECT_EQ(open["max"], 200.0);
    EXPECT_EQ(open["histogram"].size(), 10U);
    EXPECT_EQ(open["histogram"][0], nlohmann::json::parse("{\"from\":100.0,\"to\":110.0,\"count\":1}"));
    std::getline(lines, text);
    EXPECT_EQ(text, "{\"name\":\"close\",\"unit\":\"nanoseconds\",\"count\":1,\"min\":5.0,\"median\":5.0,\"p99\":5.0,"
                    "\"max\":5.0,\"histogram\":[{\"from\":5.0,\"to\":5.0,\"count\":1}]}");
    std::getline(lines, text);
    EXPECT_EQ(text, "{\"lost_events\":3.0}");
    EXPECT_FALSE(std::getline(lines, text));
}

TEST_F(TraceReportCommandTest, LostEventsAreSaid) {
    EXPECT_EQ(run({"trace", "report", "-"},
                  std::string(kHeading) + "{\"name\":\"lost events\",\"value\":17.0,\"unit\":\"events\"}\n"),
              kDone);
    EXPECT_EQ(out_, "INTERVAL  COUNT  MIN  MEDIAN  P99  MAX\n\n17 trace events were lost: intervals may be missing.\n");
}

TEST_F(TraceReportCommandTest, OtherUnitsStandAsTheyAre) {
    EXPECT_EQ(run({"trace", "report", "-"},
                  std::string(kHeading) + "{\"name\":\"size\",\"value\":1500.5,\"unit\":\"bytes\"}\n"),
              kDone);
    EXPECT_THAT(out_, HasSubstr("size      1      1500.5 bytes  1500.5 bytes"));
}

TEST_F(TraceReportCommandTest, TheSmallestAndTheLargestNumbersArePrintedAsNumbers) {
    const std::string file = kHeading + line("a", "5e-324") + line("a", "1e300");
    EXPECT_EQ(run({"trace", "report", "-"}, file), kDone);
    EXPECT_EQ(out_.find("inf"), std::string::npos) << out_;
    EXPECT_EQ(run({"trace", "report", "--json", "-"}, file), kDone);
    EXPECT_EQ(out_.find("null"), std::string::npos) << out_;
}

TEST_F(TraceReportCommandTest, NamesCannotBreakALine) {
    EXPECT_EQ(run({"trace", "report", "-"}, kHeading + line("a\\n\\u001b[2J", "1.0")), kDone);
    EXPECT_EQ(out_.find('\033'), std::string::npos);
    EXPECT_THAT(out_, HasSubstr("\\n"));
}

TEST_F(TraceReportCommandTest, AFaultIsToldWithFileAndLineAndNothingElseIsPrinted) {
    EXPECT_EQ(run({"trace", "report", "-"}, kHeading + line("a", "1.0") + "x\n"), kFailed);
    EXPECT_EQ(out_, "");
    EXPECT_THAT(error_, StartsWith("velactl: -:3: "));
    const testing::TemporaryFolder folder;
    const std::string path = folder / "r.msj";
    std::ofstream(path) << "{}\n";
    EXPECT_EQ(run({"trace", "report", path}), kFailed);
    EXPECT_EQ(error_, "velactl: " + path +
                          ":1: no trace results: the first line must name the format metricsheet and its version\n");
}

TEST_F(TraceReportCommandTest, AFileThatIsNotThereOrAFolderCannotBeRead) {
    EXPECT_EQ(run({"trace", "report", "/no/such/file"}), kFailed);
    EXPECT_EQ(error_, "velactl: /no/such/file cannot be read: No such file or directory\n");
    EXPECT_EQ(run({"trace", "report", "/"}), kFailed);
    EXPECT_EQ(error_, "velactl: / cannot be read: Is a directory\n");
}

TEST_F(TraceReportCommandTest, WrongUsageIsTwo) {
    EXPECT_EQ(run({"trace"}), kWrongUsage);
    EXPECT_THAT(error_, StartsWith("velactl: a subcommand of trace is missing; usage: velactl trace "));
    EXPECT_EQ(run({"trace", "record"}), kWrongUsage);
    EXPECT_THAT(error_, StartsWith("velactl: trace has no subcommand record; usage: "));
    EXPECT_EQ(run({"trace", "report"}), kWrongUsage);
    EXPECT_THAT(error_, StartsWith("velactl: report takes one file; usage: "));
    EXPECT_EQ(run({"trace", "report", "a", "b"}), kWrongUsage);
    EXPECT_EQ(run({"trace", "report", "a", "--jsn"}), kWrongUsage);
    EXPECT_THAT(error_, StartsWith("velactl: there is no option --jsn; usage: "));
}

} // namespace
} // namespace vela
