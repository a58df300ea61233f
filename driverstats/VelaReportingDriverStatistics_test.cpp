#include "common/values/TextualForm.h"
#include "driverstats/Channels_test.h"
#include "driverstats/VelaReportingDriverStatistics.h"

#include <clocale>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <random>

namespace vela {

namespace {

using platform::HwStatsBucket;
using platform::HwStatsChannel;
using platform::HwStatsState;
using platform::LogLevel;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr std::int64_t kLeast = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t kGreatest = std::numeric_limits<std::int64_t>::max();

/// What a channel adds, as "{key = value;}".
template <class Process>
Dictionary added(Process process, const HwStatsChannel& channel) {
    DictionaryBuilder driverStats;
    process(channel, driverStats);
    return driverStats.build();
}

std::optional<std::string> textOf(const Dictionary& statistics, std::string_view key) {
    const ValueRef value = statistics.find(key);
    return value.isString() ? std::optional<std::string>(value.text()) : std::nullopt;
}

std::optional<std::string> histogramOf(std::vector<HwStatsBucket> buckets) {
    return textOf(added(processHistogramData, histogramChannel("h", std::move(buckets))), "Rx_Histogram_h");
}

std::optional<std::string> stateOf(std::vector<HwStatsState> states) {
    return textOf(added(processStateData, stateChannel("s", std::move(states))), "Rx_State_s");
}

HwStatsChannel withNames(std::optional<std::string> driver, std::optional<std::string> group,
                         std::optional<std::string> subGroup, std::optional<std::string> name) {
    HwStatsChannel channel;
    channel.driverName = std::move(driver);
    channel.group = std::move(group);
    channel.subGroup = std::move(subGroup);
    channel.channelName = std::move(name);
    return channel;
}

// Keys

TEST(DriverStatsKeyTest, AKeyNamesDriverGroupTypeAndChannel) {
    EXPECT_EQ(getDriverStatsKey(withNames("My Driver<0x10>", "Rx", {}, "Frames_Dropped"), "Simple"),
              "MyDriver_Rx_Simple_FramesDropped");
}

TEST(DriverStatsKeyTest, ASubgroupFollowsItsGroup) {
    EXPECT_EQ(getDriverStatsKey(withNames("D", "Haptics", "Stats", "On Time"), "Histogram"),
              "D_Haptics_Stats_Histogram_OnTime");
}

TEST(DriverStatsKeyTest, WithoutAnyNameThereIsTheTypeOnly) {
    EXPECT_EQ(getDriverStatsKey(withNames({}, {}, {}, {}), "Simple"), "Simple_");
    EXPECT_EQ(getDriverStatsKey(withNames({}, {}, {}, {}), "State"), "State_");
}

TEST(DriverStatsKeyTest, EachNameMayStandAlone) {
    EXPECT_EQ(getDriverStatsKey(withNames("d", {}, {}, {}), "State"), "d_State_");
    EXPECT_EQ(getDriverStatsKey(withNames({}, "g", {}, {}), "State"), "g_State_");
    EXPECT_EQ(getDriverStatsKey(withNames({}, {}, "s", {}), "State"), "s_State_");
    EXPECT_EQ(getDriverStatsKey(withNames({}, {}, {}, "c"), "State"), "State_c");
}

TEST(DriverStatsKeyTest, AnEmptyNameLeavesItsUnderscore) {
    EXPECT_EQ(getDriverStatsKey(withNames("", "", "", ""), "State"), "___State_");
    EXPECT_EQ(getDriverStatsKey(withNames("_ _", " ", "_", "_ "), "State"), "___State_");
}

TEST(DriverStatsKeyTest, TheDriversNameEndsAtItsFirstBracket) {
    EXPECT_EQ(getDriverStatsKey(withNames("A<b<c>", {}, {}, {}), "State"), "A_State_");
    EXPECT_EQ(getDriverStatsKey(withNames("<x>", {}, {}, {}), "State"), "_State_");
    EXPECT_EQ(getDriverStatsKey(withNames("a>b", {}, {}, {}), "State"), "a>b_State_");
}

TEST(DriverStatsKeyTest, ABracketInAnotherNameStays) {
    EXPECT_EQ(getDriverStatsKey(withNames({}, "g<1>", "s<2>", "c<3>"), "State"), "g<1>_s<2>_State_c<3>");
}

TEST(DriverStatsKeyTest, UnderscoresAndSpacesGoAndNothingElse) {
    EXPECT_EQ(
        getDriverStatsKey(withNames("a_b c\td-e", "StateTransitionTimes_ms", "x__y  z", "T\u00f6n\u00a0_1"), "State"),
        "abc\td-e_StateTransitionTimesms_xyz_State_T\u00f6n\u00a01");
}

TEST(DriverStatsKeyTest, TheTypeStaysAsItIs) {
    EXPECT_EQ(getDriverStatsKey(withNames({}, {}, {}, "c"), "A _type"), "A _type_c");
}

// Simple channels

TEST(SimpleDataTest, AValueFromOneOnIsAdded) {
    EXPECT_EQ(added(processSimpleData, simpleChannel("c", 1)), (Dictionary{{"Rx_Simple_c", 1}}));
    EXPECT_EQ(added(processSimpleData, simpleChannel("c", kGreatest)), (Dictionary{{"Rx_Simple_c", kGreatest}}));
}

TEST(SimpleDataTest, AValueIsAnInteger) {
    EXPECT_EQ(added(processSimpleData, simpleChannel("c", 7)).find("Rx_Simple_c").kind(), ValueKind::Integer);
}

TEST(SimpleDataTest, ZeroIsDropped) { EXPECT_EQ(added(processSimpleData, simpleChannel("c", 0)), Dictionary()); }

TEST(SimpleDataTest, ANegativeValueIsDropped) {
    EXPECT_EQ(added(processSimpleData, simpleChannel("c", -1)), Dictionary());
    EXPECT_EQ(added(processSimpleData, simpleChannel("c", kLeast)), Dictionary());
}

TEST(SimpleDataTest, OfOneKeyTheLaterValueStaysInTheFirstsPlace) {
    DictionaryBuilder driverStats;
    processSimpleData(simpleChannel("a_b", 1), driverStats);
    processSimpleData(simpleChannel("c", 2), driverStats);
    processSimpleData(simpleChannel("a b", 3), driverStats);
    EXPECT_EQ(textualForm(Value(driverStats.build())), "{Rx_Simple_ab = 3; Rx_Simple_c = 2;}");
}

// Histograms

TEST(HistogramDataTest, AHistogramIsItsHeadAndTheBucketsWithHits) {
    EXPECT_EQ(histogramOf({bucket(0, 10, 3), bucket(10, 20, 0)}),
              "count=2,lower=0,upper=20,min=1,max=9,unit=ms::0-10:3");
}

TEST(HistogramDataTest, BucketsAreParted) {
    EXPECT_EQ(histogramOf({bucket(0, 10, 3), bucket(10, 20, 4), bucket(20, 30, 0), bucket(30, 40, 5)}),
              "count=4,lower=0,upper=40,min=1,max=9,unit=ms::0-10:3;10-20:4;30-40:5");
}

TEST(HistogramDataTest, TheBoundsBeginAtZero) {
    EXPECT_EQ(histogramOf({bucket(10, 20, 1), bucket(20, 30, 1)}),
              "count=2,lower=0,upper=30,min=1,max=9,unit=ms::10-20:1;20-30:1");
    EXPECT_EQ(histogramOf({bucket(-30, -20, 2), bucket(-20, -10, 1)}),
              "count=2,lower=-30,upper=0,min=1,max=9,unit=ms::-30--20:2;-20--10:1");
}

TEST(HistogramDataTest, BucketsWithoutHitsWidenTheBounds) {
    EXPECT_EQ(histogramOf({bucket(-50, -40, 0), bucket(0, 1, 1), bucket(90, 100, 0)}),
              "count=3,lower=-50,upper=100,min=1,max=9,unit=ms::0-1:1");
}

TEST(HistogramDataTest, WithoutHitsThereIsNoEntry) {
    EXPECT_EQ(added(processHistogramData, histogramChannel("h", {bucket(0, 10, 0), bucket(10, 20, 0)})), Dictionary());
}

TEST(HistogramDataTest, WithoutBucketsThereIsNoEntry) {
    EXPECT_EQ(added(processHistogramData, histogramChannel("h", {})), Dictionary());
}

TEST(HistogramDataTest, NegativeHitsAreHits) {
    EXPECT_EQ(histogramOf({bucket(0, 10, -3)}), "count=1,lower=0,upper=10,min=1,max=9,unit=ms::0-10:-3");
}

TEST(HistogramDataTest, LeastAndGreatestValueAreTheLibrarys) {
    HwStatsChannel channel = histogramChannel("h", {bucket(0, 10, 1)});
    channel.histogramMin = -100;
    channel.histogramMax = 5;
    EXPECT_EQ(textOf(added(processHistogramData, channel), "Rx_Histogram_h"),
              "count=1,lower=0,upper=10,min=-100,max=5,unit=ms::0-10:1");
}

TEST(HistogramDataTest, WithoutAUnitItIsNull) {
    HwStatsChannel channel = histogramChannel("h", {bucket(0, 10, 1)});
    channel.unitLabel.reset();
    EXPECT_EQ(textOf(added(processHistogramData, channel), "Rx_Histogram_h"),
              "count=1,lower=0,upper=10,min=1,max=9,unit=(null)::0-10:1");
}

TEST(HistogramDataTest, AnEmptyUnitIsEmpty) {
    HwStatsChannel channel = histogramChannel("h", {bucket(0, 10, 1)});
    channel.unitLabel = "";
    EXPECT_EQ(textOf(added(processHistogramData, channel), "Rx_Histogram_h"),
              "count=1,lower=0,upper=10,min=1,max=9,unit=::0-10:1");
}

TEST(HistogramDataTest, TheNumbersHaveTheirWholeRange) {
    HwStatsChannel channel = histogramChannel("h", {bucket(kLeast, kGreatest, kLeast)});
    channel.histogramMin = kLeast;
    channel.histogramMax = kGreatest;
    EXPECT_EQ(textOf(added(processHistogramData, channel), "Rx_Histogram_h"),
              "count=1,lower=-9223372036854775808,upper=9223372036854775807,min=-9223372036854775808,"
              "max=9223372036854775807,unit=ms::-9223372036854775808-9223372036854775807:-9223372036854775808");
}

TEST(HistogramDataTest, ABucketWithoutItsBoundsHasThoseOfTheOneBefore) {
    const testing::CapturingLog log;
    EXPECT_EQ(histogramOf({bucket(5, 10, 1), {700, 800, -5, 2}, bucket(20, 30, 3)}),
              "count=3,lower=0,upper=30,min=1,max=9,unit=ms::5-10:1;5-10:2;20-30:3");
    EXPECT_THAT(log.lines(), ElementsAre(driverLine(LogLevel::Info, "Error in getting the bucket bounds : -5")));
}

TEST(HistogramDataTest, AFirstBucketWithoutItsBoundsHasZeros) {
    const testing::CapturingLog log;
    EXPECT_EQ(histogramOf({{700, 800, 22, 2}, {700, 800, 23, 0}}),
              "count=2,lower=0,upper=0,min=1,max=9,unit=ms::0-0:2");
    EXPECT_THAT(log.lines(), ElementsAre(driverLine(LogLevel::Info, "Error in getting the bucket bounds : 22"),
                                         driverLine(LogLevel::Info, "Error in getting the bucket bounds : 23")));
}

/// The histogram's text step by step, by the standard library's numbers.
std::string plainHistogram(const HwStatsChannel& channel) {
    using std::to_string;
    std::int64_t lower = 0;
    std::int64_t upper = 0;
    std::int64_t lo = 0;
    std::int64_t hi = 0;
    std::string buckets;
    for (const HwStatsBucket& own : channel.buckets) {
        if (own.boundsFailure == 0) {
            lo = own.lower;
            hi = own.upper;
        }
        lower = lo < lower ? lo : lower;
        upper = hi > upper ? hi : upper;
        if (own.hits != 0) {
            buckets += to_string(lo) + "-" + to_string(hi) + ":" + to_string(own.hits) + ";";
        }
    }
    if (buckets.empty()) {
        return buckets;
    }
    return "count=" + to_string(channel.buckets.size()) + ",lower=" + to_string(lower) + ",upper=" + to_string(upper) +
           ",min=" + to_string(channel.histogramMin) + ",max=" + to_string(channel.histogramMax) +
           ",unit=" + channel.unitLabel.value_or("(null)") + "::" + buckets.substr(0, buckets.size() - 1);
}

TEST(HistogramDataTest, AnyHistogramIsWhatThePlainWayGives) {
    // NOLINTNEXTLINE(cert-msc32-c,cert-msc51-cpp): a failure must be met again
    std::mt19937_64 random(4711);
    const auto number = [&random] { return static_cast<std::int64_t>(random()) >> random() % 64; };
    for (int round = 0; round < 2000; ++round) {
        HwStatsChannel channel = histogramChannel("h", {});
        channel.buckets.resize(random() % 40);
        for (HwStatsBucket& own : channel.buckets) {
            own = {number(), number(), random() % 8 == 0 ? 5 : 0, random() % 3 == 0 ? number() : 0};
        }
        channel.histogramMin = number();
        channel.histogramMax = number();
        if (random() % 4 == 0) {
            channel.unitLabel.reset();
        }
        ASSERT_EQ(textOf(added(processHistogramData, channel), "Rx_Histogram_h").value_or(""), plainHistogram(channel));
    }
}

// States

TEST(StateDataTest, StatesWithResidencyFollowOneAnother) {
    EXPECT_EQ(stateOf({{"on", 2, 40, 0.5}, {"off", 1, 60, 0.25}}),
              "name:on,transition:2,residency:40,duty_cycle:0.500000;"
              "name:off,transition:1,residency:60,duty_cycle:0.250000;");
}

TEST(StateDataTest, AStateWithoutResidencyIsLeftOutWhateverItsTransitions) {
    EXPECT_EQ(stateOf({{"on", 7, 0, 1.0}, {"off", 0, 60, 0.25}}),
              "name:off,transition:0,residency:60,duty_cycle:0.250000;");
}

TEST(StateDataTest, WithoutResidencyTheEntryIsEmpty) {
    EXPECT_EQ(stateOf({{"on", 7, 0, 1.0}}), "");
    EXPECT_EQ(stateOf({}), "");
}

TEST(StateDataTest, TheTextIsLoggedAlsoWhenItIsEmpty) {
    const testing::CapturingLog log;
    stateOf({{"on", 2, 40, 0.5}});
    stateOf({});
    EXPECT_THAT(log.lines(),
                ElementsAre(driverLine(LogLevel::Debug, "the current reported data is : name:on,transition:2,"
                                                        "residency:40,duty_cycle:0.500000;"),
                            driverLine(LogLevel::Debug, "the current reported data is : ")));
}

TEST(StateDataTest, AStatesNameStaysAsItIs) {
    EXPECT_EQ(stateOf({{"deep_sleep 1;", 1, 1, 1}}),
              "name:deep_sleep 1;,transition:1,residency:1,duty_cycle:1.000000;");
}

TEST(StateDataTest, CountsHaveTheirWholeRange) {
    constexpr std::uint64_t kAll = std::numeric_limits<std::uint64_t>::max();
    EXPECT_EQ(stateOf({{"on", kAll, kAll, 0}}),
              "name:on,transition:18446744073709551615,residency:18446744073709551615,"
              "duty_cycle:0.000000;");
}

std::string dutyCycle(double number) {
    const std::string text = stateOf({{"", 0, 1, number}}).value_or("");
    return text.substr(text.find("duty_cycle:") + 11);
}

TEST(StateDataTest, ADutyCycleHasSixDecimals) {
    EXPECT_EQ(dutyCycle(1.0 / 3), "0.333333;");
    EXPECT_EQ(dutyCycle(2.0 / 3), "0.666667;");
    EXPECT_EQ(dutyCycle(0.9999999), "1.000000;");
    EXPECT_EQ(dutyCycle(0.0000005), "0.000000;"); // the nearest double lies below
    EXPECT_EQ(dutyCycle(0.00000051), "0.000001;");
    EXPECT_EQ(dutyCycle(-0.0), "-0.000000;");
    EXPECT_EQ(dutyCycle(123456789.5), "123456789.500000;");
}

TEST(StateDataTest, ADutyCycleMayBeAnyNumber) {
    EXPECT_EQ(dutyCycle(std::numeric_limits<double>::infinity()), "inf;");
    EXPECT_EQ(dutyCycle(-std::numeric_limits<double>::infinity()), "-inf;");
    EXPECT_EQ(dutyCycle(std::numeric_limits<double>::quiet_NaN()), "nan;");
    const std::string greatest = dutyCycle(-std::numeric_limits<double>::max());
    EXPECT_EQ(greatest.size(), 318U); // sign, 309 digits, point, six decimals and ";"
    EXPECT_EQ(greatest.substr(0, 18), "-17976931348623157");
}

TEST(StateDataTest, AnyDutyCycleIsWhatTheStandardLibraryPrints) {
    // NOLINTNEXTLINE(cert-msc32-c,cert-msc51-cpp): a failure must be met again
    std::mt19937_64 random(815);
    std::uniform_real_distribution<double> shares(0, 1);
    for (int round = 0; round < 5000; ++round) {
        const double number = round % 2 == 0 ? shares(random) : static_cast<double>(random() % 2000001) / 2000000;
        ASSERT_EQ(dutyCycle(number), std::to_string(number) + ";") << number; // which is defined as "%f"
    }
}

TEST(StateDataTest, ADutyCycleHasAPointWhateverTheLocale) {
    // NOLINTBEGIN(concurrency-mt-unsafe): no other thread runs.
    const std::string before = std::setlocale(LC_ALL, nullptr);
    bool changed = false;
    for (const char* locale : {"de_DE.UTF-8", "de_DE.utf8", "fr_FR.UTF-8", "fr_FR.utf8"}) {
        changed = changed || std::setlocale(LC_ALL, locale) != nullptr;
    }
    const std::string text = dutyCycle(0.5);
    EXPECT_NE(std::setlocale(LC_ALL, before.c_str()), nullptr);
    // NOLINTEND(concurrency-mt-unsafe)
    if (!changed) {
        GTEST_SKIP() << "no locale with a decimal comma is installed";
    }
    EXPECT_EQ(text, "0.500000;");
}

// Formats

class ChannelFormatTest : public ::testing::Test {
protected:
    /// "simple {...} histogram {...} state {...}" of a channel with a code of its own.
    std::string processed(std::uint8_t format, bool named = true) {
        HwStatsChannel channel = histogramChannel("c_1", {bucket(0, 10, 1)});
        channel.format = format;
        channel.group = named ? std::optional<std::string>("My_Group") : std::nullopt;
        channel.subGroup = named ? std::optional<std::string>("Sub Group") : std::nullopt;
        channel.simpleValue = 5;
        channel.states = {{"on", 1, 1, 1}};
        VelaReportingDriverStatistics statistics;
        processChannel(channel, statistics);
        return "simple " + textualForm(Value(statistics.simple.build())) + " histogram " +
               textualForm(Value(statistics.histogram.build())) + " state " +
               textualForm(Value(statistics.state.build()));
    }

    testing::CapturingLog log_;
};

TEST_F(ChannelFormatTest, OneIsSimple) {
    EXPECT_EQ(processed(1), "simple {MyGroup_SubGroup_Simple_c1 = 5;} histogram {} state {}");
}

TEST_F(ChannelFormatTest, TwoIsAState) {
    EXPECT_EQ(processed(2), "simple {} histogram {} state {MyGroup_SubGroup_State_c1 = "
                            "\"name:on,transition:1,residency:1,duty_cycle:1.000000;\";}");
}

TEST_F(ChannelFormatTest, ThreeIsAHistogram) {
    EXPECT_EQ(processed(3), "simple {} histogram {MyGroup_SubGroup_Histogram_c1 = "
                            "\"count=1,lower=0,upper=10,min=1,max=9,unit=ms::0-10:1\";} state {}");
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(ChannelFormatTest, ZeroAndFourAreDropped) {
    EXPECT_EQ(processed(0), "simple {} histogram {} state {}");
    EXPECT_EQ(processed(4), "simple {} histogram {} state {}");
    EXPECT_THAT(
        log_.lines(),
        ElementsAre(
            driverLine(LogLevel::Debug, "Dropping sample of type : 0 for group : My_Group subgroup : Sub Group"),
            driverLine(LogLevel::Debug, "Dropping sample of type : 4 for group : My_Group subgroup : Sub Group")));
}

TEST_F(ChannelFormatTest, CodesAboveFourAreNotSupported) {
    for (const std::uint8_t format : {std::uint8_t{5}, std::uint8_t{7}, std::uint8_t{255}}) {
        EXPECT_EQ(processed(format), "simple {} histogram {} state {}");
    }
    const auto line = [](const std::string& format) {
        return driverLine(LogLevel::Error,
                          "The HwStatsingFormat " + format + " is not supported group : My_Group subgroup : Sub Group");
    };
    EXPECT_THAT(log_.lines(), ElementsAre(line("5"), line("7"), line("255")));
}

TEST_F(ChannelFormatTest, MissingNamesAreNull) {
    processed(0, false);
    processed(7, false);
    EXPECT_THAT(
        log_.lines(),
        ElementsAre(
            driverLine(LogLevel::Debug, "Dropping sample of type : 0 for group : (null) subgroup : (null)"),
            driverLine(LogLevel::Error, "The HwStatsingFormat 7 is not supported group : (null) subgroup : (null)")));
}

} // namespace

} // namespace vela
