#include "common/VelaReportingLogCategories.h"
#include "common/values/Utf8.h"
#include "testing/CapturingLog.h"

#include <array>
#include <atomic>
#include <cstdlib>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>
#include <thread>
#include <vector>

namespace vela {

namespace {

using platform::LogLevel;
using testing::CapturedLine;
using testing::CapturedRecord;
using testing::CapturingLog;
using ::testing::ElementsAre;
using ::testing::SizeIs;

/// Counts how often it is made into text.
struct Counting {
    int* count;
};
void appendDescription(std::string& text, const Counting& counting) {
    ++*counting.count;
    text += "counted";
}

using Accessor = const LogCategory& (*)();
constexpr std::array<Accessor, 9> kAccessors = {
    VelaReportingClientCategory,        VelaReportingServiceDelegateCategory,
    VelaReportingSessionCategory,       VelaReportingSessionBeaconReportingCategory,
    VelaReportingDriverUtilityCategory, VelaReportingTraceCategory,
    VelaReportingJouleCategory,         VelaReportingTelemLogCategory,
    VelaReportingSnagLogCategory};

TEST(LogCategoryTest, EveryAreaHasItsCategoryString) {
    EXPECT_EQ(VelaReportingClientCategory().name(), "velarc");
    EXPECT_EQ(VelaReportingServiceDelegateCategory().name(), "velars");
    EXPECT_EQ(VelaReportingSessionCategory().name(), "velarr");
    EXPECT_EQ(VelaReportingSessionBeaconReportingCategory().name(), "velari");
    EXPECT_EQ(VelaReportingDriverUtilityCategory().name(), "velard");
    EXPECT_EQ(VelaReportingTraceCategory().name(), "velart");
    EXPECT_EQ(VelaReportingJouleCategory().name(), "velarp");
    EXPECT_EQ(VelaReportingTelemLogCategory().name(), "velara");
    EXPECT_EQ(VelaReportingSnagLogCategory().name(), "velarb");
}

TEST(LogCategoryTest, EveryHandleIsOfTheOneSubsystem) {
    const CapturingLog log;
    for (const Accessor accessor : kAccessors) {
        EXPECT_EQ(accessor().subsystem(), "com.orvex.vela");
        accessor().info("line");
    }
    const std::vector<CapturedRecord> records = log.records();
    ASSERT_THAT(records, SizeIs(9));
    for (const CapturedRecord& record : records) {
        EXPECT_EQ(record.subsystem, "com.orvex.vela");
    }
}

TEST(LogCategoryTest, AnAccessorAlwaysAnswersTheSameHandle) {
    for (const Accessor accessor : kAccessors) {
        EXPECT_EQ(&accessor(), &accessor());
    }
}

// Both run in a process of their own, in which no handle exists yet.

[[noreturn]] void useHandlesOneByOne() {
    bool right = LogCategory::created() == 0;
    VelaReportingTraceCategory();
    right = right && LogCategory::created() == 1;
    VelaReportingTraceCategory();
    right = right && LogCategory::created() == 1;
    for (const Accessor accessor : kAccessors) {
        accessor();
    }
    std::_Exit(right && LogCategory::created() == 9 ? 0 : 1);
}

[[noreturn]] void useEachHandleFirstFromEightThreadsAtOnce() {
    constexpr int kThreads = 8;
    std::atomic<int> differing{0};
    for (std::size_t index = 0; index < kAccessors.size(); ++index) {
        std::array<const LogCategory*, kThreads> handles{};
        std::atomic<int> ready{0};
        std::vector<std::thread> threads;
        threads.reserve(kThreads);
        for (const LogCategory*& handle : handles) {
            threads.emplace_back([&ready, &handle, index] {
                ready.fetch_add(1);
                while (ready.load() < kThreads) {
                    std::this_thread::yield();
                }
                handle = &kAccessors[index]();
            });
        }
        for (std::thread& thread : threads) {
            thread.join();
        }
        for (const LogCategory* const handle : handles) {
            differing += handle == handles[0] ? 0 : 1;
        }
        differing += LogCategory::created() == index + 1 ? 0 : 1;
    }
    std::_Exit(differing == 0 ? 0 : 1);
}

TEST(LogCategoryDeathTest, AHandleIsCreatedOnItsFirstUse) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    EXPECT_EXIT(useHandlesOneByOne(), ::testing::ExitedWithCode(0), "");
}

TEST(LogCategoryDeathTest, AHandleIsCreatedOnceUnderConcurrentFirstCalls) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    EXPECT_EXIT(useEachHandleFirstFromEightThreadsAtOnce(), ::testing::ExitedWithCode(0), "");
}

TEST(LogLineTest, ALineCarriesTheSourceFilesNameAndItsLine) {
    const CapturingLog log;
    VelaReportingSessionCategory().info("starting session owned by %lli", std::int64_t{7});
    const int line = __LINE__ - 1;
    const std::vector<CapturedRecord> records = log.records();
    ASSERT_THAT(records, SizeIs(1));
    EXPECT_EQ(records[0].line, (CapturedLine{LogLevel::Info, "velarr", "VelaReportingLogCategories_test",
                                             "starting session owned by 7"}));
    EXPECT_EQ(records[0].lineNumber, line);
    EXPECT_TRUE(records[0].sourceFile.ends_with("common/VelaReportingLogCategories_test.cpp")) << records[0].sourceFile;
    EXPECT_EQ(records[0].text,
              "VelaReportingLogCategories_test:" + std::to_string(line) + "   starting session owned by 7");
}

TEST(LogLineTest, AShortSourceNameIsRightAlignedInTwentyFiveColumns) {
    const CapturingLog log;
    VelaReportingTraceCategory().standard(FormatText<int>("Got %d", "tracing/TraceRunner.cpp", 42), 5);
    EXPECT_EQ(log.records()[0].text, "              TraceRunner:42    Got 5");
    EXPECT_EQ(log.records()[0].line.message, "Got 5");
}

TEST(LogLineTest, ALongSourceNameAndALargeLineNumberAreNotCut) {
    const CapturingLog log;
    VelaReportingSnagLogCategory()
        .as("VelaReportingSnagStateManagerUtility")
        .error(FormatText<>("text", "backends/Other.cpp", 1234567));
    VelaReportingServiceDelegateCategory().info(FormatText<>("text", "VelaReportingServiceDelegate.cpp", 100000));
    EXPECT_EQ(log.records()[0].text, "VelaReportingSnagStateManagerUtility:1234567 text");
    EXPECT_EQ(log.records()[1].text, "VelaReportingServiceDelegate:100000 text");
}

TEST(LogLineTest, ACategoryUnderAnotherNameKeepsItsCategory) {
    const CapturingLog log;
    VelaReportingServiceDelegateCategory().as("VelaReportingServiceDelegate").debug("validating reporter %lli", 1);
    EXPECT_THAT(log.lines(), ElementsAre(CapturedLine{LogLevel::Debug, "velars", "VelaReportingServiceDelegate",
                                                      "validating reporter 1"}));
}

TEST(LogLineTest, LevelsAreKeptApart) {
    const CapturingLog log;
    const LogCategory& category = VelaReportingSessionCategory();
    category.debug("1");
    category.info("2");
    category.standard("3");
    category.error("4");
    const std::string source = "VelaReportingLogCategories_test";
    EXPECT_THAT(log.lines(), ElementsAre(CapturedLine{LogLevel::Debug, "velarr", source, "1"},
                                         CapturedLine{LogLevel::Info, "velarr", source, "2"},
                                         CapturedLine{LogLevel::Default, "velarr", source, "3"},
                                         CapturedLine{LogLevel::Error, "velarr", source, "4"}));
}

TEST(LogLevelTest, LinesBelowTheMinimumAreNotWritten) {
    const CapturingLog log(LogLevel::Default);
    const LogCategory& category = VelaReportingSessionCategory();
    category.debug("1");
    category.info("2");
    category.standard("3");
    category.error("4");
    EXPECT_THAT(log.lines(), SizeIs(2));
    EXPECT_FALSE(category.isEnabled(LogLevel::Info));
    EXPECT_TRUE(category.isEnabled(LogLevel::Default));
}

TEST(LogLevelTest, ADisabledLevelFormatsNoArgument) {
    CapturingLog log(LogLevel::Error);
    int count = 0;
    VelaReportingSessionCategory().debug("%@", Counting{&count});
    VelaReportingSessionCategory().info("%@", Counting{&count});
    VelaReportingSessionCategory().as("Other").standard("%@", Counting{&count});
    EXPECT_EQ(count, 0);
    VelaReportingSessionCategory().error("%@", Counting{&count});
    EXPECT_EQ(count, 1);
}

TEST(LogLevelTest, TheLevelMayChangeWhileTheDestinationStays) {
    CapturingLog log(LogLevel::Error);
    VelaReportingSessionCategory().info("before");
    setLogDestination(&log, LogLevel::Info);
    VelaReportingSessionCategory().info("behind");
    EXPECT_THAT(log.lines(), SizeIs(1));
}

TEST(LogDestinationTest, WithoutADestinationNothingIsFormatted) {
    setLogDestination(nullptr, LogLevel::Debug);
    int count = 0;
    VelaReportingSessionCategory().error("%@", Counting{&count});
    EXPECT_EQ(count, 0);
    EXPECT_FALSE(VelaReportingSessionCategory().isEnabled(LogLevel::Error));
}

TEST(LogDestinationTest, ACapturingLogEndsWithItsScope) {
    { const CapturingLog log; }
    EXPECT_FALSE(VelaReportingSessionCategory().isEnabled(LogLevel::Error));
}

TEST(LogEscapingTest, AnArgumentCannotForgeALine) {
    const CapturingLog log;
    VelaReportingServiceDelegateCategory().info("name %@ %s %c", "a\n  VelaReportingSession:1     forged\x1b[2J",
                                                "\xff\r", '\n');
    EXPECT_EQ(log.lines()[0].message, "name a\\n  VelaReportingSession:1     forged\\x1b[2J \\xff\\r \\n");
}

TEST(LogEscapingTest, AValueCannotForgeALine) {
    const CapturingLog log;
    std::string turning;
    appendUtf8(turning, 0x202E);
    VelaReportingServiceDelegateCategory().info("message %@ of %@", Value("a\nb" + turning),
                                                Dictionary{{"k", Value("x\ny" + turning)}});
    const std::string message = log.lines()[0].message;
    EXPECT_TRUE(message.starts_with("message a\\nb\\u202e of {k = ")) << message;
    EXPECT_EQ(message.find('\n'), std::string::npos);
    EXPECT_EQ(message.find(turning), std::string::npos);
}

TEST(LogEscapingTest, ASeparatorOfLinesIsEscaped) {
    const CapturingLog log;
    VelaReportingServiceDelegateCategory().info("%@", std::optional<std::string>("\u2028"));
    EXPECT_EQ(log.lines()[0].message, "\\u2028");
}

TEST(LogEscapingTest, TheFormatTextItselfStaysAsItIs) {
    const CapturingLog log;
    VelaReportingSessionCategory().info("first\nsecond \t%@", "x");
    EXPECT_EQ(log.lines()[0].message, "first\nsecond \tx");
}

TEST(LogCuttingTest, TheLongestMessageIsWhole) {
    const CapturingLog log;
    const std::string message(32768, 'a');
    VelaReportingSessionCategory().info("%@", message);
    EXPECT_EQ(log.lines()[0].message, message);
}

TEST(LogCuttingTest, ALongerMessageEndsInThreeDots) {
    const CapturingLog log;
    VelaReportingSessionCategory().info("%@", std::string(32769, 'a'));
    EXPECT_EQ(log.lines()[0].message, std::string(32765, 'a') + "...");
}

TEST(LogCuttingTest, ALongerMessageIsCutBetweenTwoCharacters) {
    const CapturingLog log;
    std::string message(32763, 'a');
    message += "\u20ac\u20ac\u20ac"; // the cut would fall into the first
    VelaReportingSessionCategory().info("%@", message);
    EXPECT_EQ(log.lines()[0].message, std::string(32763, 'a') + "...");
}

TEST(LogReporterTest, ALineWithoutAScopeIsAboutNoReporter) {
    const CapturingLog log;
    VelaReportingSessionCategory().info("line");
    EXPECT_EQ(log.records()[0].reporter, std::nullopt);
}

TEST(LogReporterTest, ScopesNest) {
    const CapturingLog log;
    {
        const LogReporterScope outer(7);
        VelaReportingSessionCategory().info("outer");
        {
            const LogReporterScope inner(-9);
            VelaReportingSessionCategory().info("inner");
        }
        VelaReportingSessionCategory().info("outer again");
    }
    VelaReportingSessionCategory().info("outside");
    const std::vector<CapturedRecord> records = log.records();
    EXPECT_EQ(records[0].reporter, std::optional<std::int64_t>(7));
    EXPECT_EQ(records[1].reporter, std::optional<std::int64_t>(-9));
    EXPECT_EQ(records[2].reporter, std::optional<std::int64_t>(7));
    EXPECT_EQ(records[3].reporter, std::nullopt);
}

TEST(LogReporterTest, AScopeHoldsForItsThreadOnly) {
    const CapturingLog log;
    const LogReporterScope scope(7);
    std::thread([] { VelaReportingSessionCategory().info("other thread"); }).join();
    EXPECT_EQ(log.records()[0].reporter, std::nullopt);
}

TEST(LogThreadsTest, LinesOfManyThreadsAllArriveWhole) {
    CapturingLog log;
    constexpr int kThreads = 4;
    constexpr int kLines = 200;
    std::vector<std::thread> threads;
    threads.reserve(kThreads);
    for (int thread = 0; thread < kThreads; ++thread) {
        threads.emplace_back([thread] {
            const LogReporterScope scope(thread);
            for (int line = 0; line < kLines; ++line) {
                VelaReportingSessionCategory().info("%d of %d", line, thread);
            }
        });
    }
    setLogDestination(&log, LogLevel::Info);
    for (std::thread& thread : threads) {
        thread.join();
    }
    std::array<int, kThreads> next{};
    for (const CapturedRecord& record : log.records()) {
        ASSERT_TRUE(record.reporter);
        const auto thread = static_cast<std::size_t>(*record.reporter);
        EXPECT_EQ(record.line.message, formatText("%d of %d", next[thread], thread));
        ++next[thread];
    }
    EXPECT_THAT(next, ElementsAre(kLines, kLines, kLines, kLines));
}

} // namespace

} // namespace vela
