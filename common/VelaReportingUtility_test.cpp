#include "common/VelaReportingUtility.h"
#include "common/values/TextualForm.h"
#include "testing/CapturingLog.h"
#include "testing/FakeDeviceProperties.h"
#include "testing/FakeProcessInformation.h"
#include "testing/ManualClock.h"
#include "testing/ManualWorkQueues.h"

#include <array>
#include <clocale>
#include <gtest/gtest.h>
#include <limits>
#include <thread>
#include <utility>
#include <vector>

namespace vela {

namespace {

using platform::LogLevel;
using testing::CapturedLine;

constexpr std::array<std::pair<std::uint32_t, std::string_view>, 15> kServices = {{
    {0, "generic"},
    {1, "muse"},
    {2, "telephony"},
    {3, "haptics"},
    {4, "alarms"},
    {5, "standalone"},
    {6, "soundautoconfig"},
    {7, "longformaudio"},
    {8, "nonlongformaudio"},
    {9, "audiodeviceusage"},
    {10, "alerts"},
    {11, "test"},
    {12, "apiusage"},
    {13, "systemsounds"},
    {65535, "unknown"},
}};

TEST(ServiceTypeTest, EveryTypeHasItsName) {
    for (const auto& [type, name] : kServices) {
        EXPECT_EQ(VelaReportingUtilityGenerateServiceNameFromServiceType(type), name);
    }
}

TEST(ServiceTypeTest, ANumberThatIsNoTypeIsTelephony) {
    for (const std::uint32_t type : {14U, 100U, 65534U, 65536U, 65538U, 70000U, 0xFFFFFFFFU}) {
        EXPECT_EQ(VelaReportingUtilityGenerateServiceNameFromServiceType(type), "telephony") << type;
    }
}

TEST(ServiceTypeTest, EveryNameHasItsType) {
    for (const auto& [type, name] : kServices) {
        EXPECT_EQ(VelaReportingUtilityGenerateServiceTypeFromServiceName(name), type);
    }
}

TEST(ServiceTypeTest, ANameThatIsNotInTheTableIsUnknown) {
    for (const std::string_view name : {"Generic", "GENERIC", "generic ", " generic", "", "gener", "telephony\n"}) {
        EXPECT_EQ(VelaReportingUtilityGenerateServiceTypeFromServiceName(name), 65535) << name;
    }
    EXPECT_EQ(VelaReportingUtilityGenerateServiceTypeFromServiceName(std::nullopt), 65535);
}

TEST(ServiceTypeTest, AllButApiUsageBatchTheirEvents) {
    for (const auto& [type, name] : kServices) {
        EXPECT_EQ(VelaReportingUtilityShouldBatchBeaconReportingEventsForServiceType(type), type != 12) << name;
    }
    EXPECT_TRUE(VelaReportingUtilityShouldBatchBeaconReportingEventsForServiceType(14));
    EXPECT_TRUE(VelaReportingUtilityShouldBatchBeaconReportingEventsForServiceType(65536 + 12));
}

TEST(CategoryTest, AnAbTestHasAHighHalfThatIsNotAllOnes) {
    for (const std::uint32_t category : {0x00010000U, 0x10000004U, 0x80000001U, 0xFFFF0000U, 0xFFFFFFFEU}) {
        EXPECT_TRUE(VelaReportingUtilityIsABTestModeOn(category)) << category;
    }
    for (const std::uint32_t category : {0U, 4U, 0x0000FFFFU, 0xFFFFFFFFU}) {
        EXPECT_FALSE(VelaReportingUtilityIsABTestModeOn(category)) << category;
    }
}

TEST(CategoryTest, EveryBaseCategoryHasItsString) {
    constexpr std::array<std::string_view, 15> kNames = {
        "Generic",     "Record", "Input",         "Playback",    "Output", "PlaybackAndRecord",
        "IO",          "Setup",  "ClientRequest", "RouteChange", "Error",  "HwStatsing",
        "Performance", "Volume", "HearingHealth"};
    for (std::uint32_t category = 1; category <= kNames.size(); ++category) {
        EXPECT_EQ(VelaReportingUtilityCategoryString(category), kNames[category - 1]);
    }
}

TEST(CategoryTest, OtherBaseCategoriesAreUndefined) {
    EXPECT_EQ(VelaReportingUtilityCategoryString(0), "Undefined");
    EXPECT_EQ(VelaReportingUtilityCategoryString(16), "Undefined");
    EXPECT_EQ(VelaReportingUtilityCategoryString(65535), "Undefined");
    EXPECT_EQ(VelaReportingUtilityCategoryString(0xFFFFFFFF), "Undefined");
}

TEST(CategoryTest, EveryFlagHasItsString) {
    EXPECT_EQ(VelaReportingUtilityCategoryString(0x04000001), "MIDI_Generic");
    EXPECT_EQ(VelaReportingUtilityCategoryString(0x0800000B), "Session_Error");
    EXPECT_EQ(VelaReportingUtilityCategoryString(0x10000004), "DSP_Playback");
    EXPECT_EQ(VelaReportingUtilityCategoryString(0x20000007), "HAL_IO");
    EXPECT_EQ(VelaReportingUtilityCategoryString(0x4000000A), "Routing_RouteChange");
    EXPECT_EQ(VelaReportingUtilityCategoryString(0x80000001), "Toolbox_Generic");
}

TEST(CategoryTest, AHighHalfThatIsNoSingleFlagLeavesTheUnderscore) {
    EXPECT_EQ(VelaReportingUtilityCategoryString(0x00030002), "_Record");
    EXPECT_EQ(VelaReportingUtilityCategoryString(0x00010000), "_Undefined");
    EXPECT_EQ(VelaReportingUtilityCategoryString(0x30000004), "_Playback");
    EXPECT_EQ(VelaReportingUtilityCategoryString(0x04010001), "_Generic");
    EXPECT_EQ(VelaReportingUtilityCategoryString(0xFFFFFFFE), "_Undefined");
}

TEST(CategoryTest, RealTimeReportingTakesTheLowHalf) {
    EXPECT_EQ(VelaReportingUtilityRetrieveBeaconReportingCategoryFromCategory(0x10000004), 4);
    EXPECT_EQ(VelaReportingUtilityRetrieveBeaconReportingCategoryFromCategory(0xFFFFFFFF), 65535);
    EXPECT_EQ(VelaReportingUtilityRetrieveBeaconReportingCategoryFromCategory(0x00010000), 0);
}

TEST(TypeTest, EveryTypeHasItsString) {
    constexpr std::array<std::string_view, 18> kNames = {"Start",          "Stop",
                                                         "Activate",       "Deactivate",
                                                         "Setup",          "Error",
                                                         "IssueDetector",  "Joule",
                                                         "AudioUnitUsage", "MIDIDriver",
                                                         "Summary",        "HeadphoneAudioExposure",
                                                         "AudioExposure",  "Listeningenhancement",
                                                         "Gauge",          "Simple",
                                                         "Histogram",      "State"};
    for (std::uint32_t type = 1; type <= kNames.size(); ++type) {
        EXPECT_EQ(VelaReportingUtilityTypeString(type), kNames[type - 1]);
    }
    EXPECT_EQ(VelaReportingUtilityTypeString(65535), "Unknown");
}

TEST(TypeTest, EveryOtherNumberIsGeneric) {
    for (const std::uint32_t type : {0U, 19U, 100U, 65534U, 65536U, 0xFFFFFFFFU}) {
        EXPECT_EQ(VelaReportingUtilityTypeString(type), "Generic") << type;
    }
}

TEST(ReporterTest, TheSessionIDIsTheReporterID) {
    for (const std::int64_t reporter : {std::numeric_limits<std::int64_t>::min(), std::int64_t{-1}, std::int64_t{0},
                                        std::int64_t{0x100000000}, std::numeric_limits<std::int64_t>::max()}) {
        EXPECT_EQ(VelaReportingUtilityExtractSessionIDFromReporterID(reporter), reporter);
    }
}

TEST(MessageTest, TheTagIsCategoryAndTypeWithoutASeparator) {
    const Dictionary message = {{"a", 1}};
    EXPECT_EQ(textualForm(Value(VelaReportingUtilityAddAudioMessageTag(message, 1, 1))),
              "{a = 1; audiotag = GenericStart;}");
    EXPECT_EQ(VelaReportingUtilityAddAudioMessageTag(message, 0xFFFFFFFF, 65535).find("audiotag").text(),
              "UndefinedUnknown");
    EXPECT_EQ(VelaReportingUtilityAddAudioMessageTag({}, 0x10000004, 2).find("audiotag").text(), "DSP_PlaybackStop");
    EXPECT_EQ(message, (Dictionary{{"a", 1}}));
}

TEST(MessageTest, ATagThatIsThereIsOverwritten) {
    const Dictionary message = {{"audiotag", "mine"}, {"a", 1}};
    EXPECT_EQ(textualForm(Value(VelaReportingUtilityAddAudioMessageTag(message, 14, 11))),
              "{audiotag = VolumeSummary; a = 1;}");
    EXPECT_EQ(message.find("audiotag").text(), "mine");
}

class EventEpochTimeTest : public ::testing::Test {
protected:
    static Dictionary stamped() {
        return {{"velareporting_timestamp", 100.5}, {"systemuptime_sec", 7}, {"processuptime_ms", 9}};
    }
    testing::FakeDeviceProperties device_;
};

TEST_F(EventEpochTimeTest, AnInternalBuildKeepsTheMessageAsItIs) {
    device_.setBoolean("InternalBuild", true);
    const VelaReportingBuildType buildType(device_);
    const Dictionary message = stamped();
    EXPECT_TRUE(VelaReportingUtilityRemoveEventEpochTime(message).isSameObject(message));
    const Dictionary unstamped = {{"a", 1}};
    EXPECT_TRUE(VelaReportingUtilityRemoveEventEpochTime(unstamped).isSameObject(unstamped));
}

TEST_F(EventEpochTimeTest, AnyOtherBuildTakesTheTimestampAndNothingElse) {
    const VelaReportingBuildType buildType(device_);
    const Dictionary message = stamped();
    EXPECT_EQ(textualForm(Value(VelaReportingUtilityRemoveEventEpochTime(message))),
              "{systemuptime_sec = 7; processuptime_ms = 9;}");
    EXPECT_EQ(message, stamped());
}

TEST_F(EventEpochTimeTest, AMessageWithoutATimestampIsUnchanged) {
    const VelaReportingBuildType buildType(device_);
    const Dictionary message = {{"a", 1}};
    EXPECT_TRUE(VelaReportingUtilityRemoveEventEpochTime(message).isSameObject(message));
}

TEST(MessageTest, EverySpaceInAKeyBecomesAnUnderscore) {
    const Dictionary message = {{"a  b", 1}, {" c ", "two words"}};
    EXPECT_EQ(VelaReportingUtilityRemoveWhiteSpaceFromKeys(message), (Dictionary{{"a__b", 1}, {"_c_", "two words"}}));
    EXPECT_EQ(message, (Dictionary{{"a  b", 1}, {" c ", "two words"}}));
}

TEST(MessageTest, OtherWhiteSpaceInKeysStays) {
    const Dictionary message = {{"a\tb", 1}, {"a\nb", 2}, {"a\u00A0b", 3}};
    EXPECT_EQ(VelaReportingUtilityRemoveWhiteSpaceFromKeys(message), message);
}

TEST(MessageTest, KeysInsideValuesStay) {
    const Dictionary message = {{"a b", Dictionary{{"c d", 1}}}};
    EXPECT_EQ(VelaReportingUtilityRemoveWhiteSpaceFromKeys(message), (Dictionary{{"a_b", Dictionary{{"c d", 1}}}}));
}

TEST(MessageTest, OfTwoKeysThatBecomeOneTheLaterWins) {
    EXPECT_EQ(VelaReportingUtilityRemoveWhiteSpaceFromKeys({{"a b", 1}, {"a_b", 2}}), (Dictionary{{"a_b", 2}}));
    EXPECT_EQ(VelaReportingUtilityRemoveWhiteSpaceFromKeys({{"a_b", 1}, {"a b", 2}}), (Dictionary{{"a_b", 2}}));
}

TEST(MessageTest, TheAppNameIsTheConfigurationsValue) {
    EXPECT_EQ(VelaReportingUtilityRetrieveAppName(Dictionary{{"HostApplicationDisplayID", "player"}}), Value("player"));
    EXPECT_EQ(VelaReportingUtilityRetrieveAppName(Dictionary{{"HostApplicationDisplayID", ""}}), Value(""));
    EXPECT_EQ(VelaReportingUtilityRetrieveAppName(Dictionary{{"HostApplicationDisplayID", 7}}), Value(7));
}

TEST(MessageTest, TheAppNameIsUnknownWhereTheKeyIsAbsent) {
    EXPECT_EQ(VelaReportingUtilityRetrieveAppName(Dictionary()), Value("Unknown"));
    EXPECT_EQ(VelaReportingUtilityRetrieveAppName(Dictionary{{"other", 1}}), Value("Unknown"));
}

TEST(MessageTest, WithoutAConfigurationThereIsNoAppName) {
    EXPECT_EQ(VelaReportingUtilityRetrieveAppName(std::nullopt), Value());
}

class ProcessNameTest : public ::testing::Test {
protected:
    std::optional<std::string> nameOf(std::string commandName) {
        processes_.add({.pid = 7, .parent = 1, .commandName = std::move(commandName), .startTimeTicks = 5});
        return VelaReportingUtilityProcessNameForPID(processes_, 7);
    }
    testing::CapturingLog log_;
    testing::FakeProcessInformation processes_{100, "vela-reportingd-of-a-long-name"};
};

TEST_F(ProcessNameTest, TheOwnPidGivesTheOwnName) {
    EXPECT_EQ(VelaReportingUtilityProcessNameForPID(processes_, 100), "vela-reportingd-of-a-long-name");
    EXPECT_EQ(processes_.reads(), 0U);
}

TEST_F(ProcessNameTest, BelowOneThereIsNoProcess) {
    for (const std::int32_t pid : {0, -1, std::numeric_limits<std::int32_t>::min()}) {
        EXPECT_EQ(VelaReportingUtilityProcessNameForPID(processes_, pid), std::nullopt);
    }
    EXPECT_EQ(processes_.reads(), 0U);
}

TEST_F(ProcessNameTest, AProcessThatDoesNotExistHasNone) {
    EXPECT_EQ(VelaReportingUtilityProcessNameForPID(processes_, 8), std::nullopt);
    EXPECT_TRUE(log_.lines().empty());
}

TEST_F(ProcessNameTest, IsTheWholeCommandName) {
    EXPECT_EQ(nameOf("audioserver"), "audioserver");
    EXPECT_EQ(nameOf("a) b (c\n"), "a) b (c\n");
    EXPECT_EQ(nameOf("fifteen bytes15"), "fifteen bytes15");
    EXPECT_EQ(nameOf(""), "");
    EXPECT_EQ(nameOf("caf\u00e9"), "caf\u00e9");
    EXPECT_TRUE(log_.lines().empty());
}

TEST_F(ProcessNameTest, ACharacterCutByTheSystemIsLeftOut) {
    EXPECT_EQ(nameOf("aaaaaaaaaaaaaa\xC3"), "aaaaaaaaaaaaaa");
    EXPECT_EQ(nameOf("aaaaaaaaaaaa\xF0\x9F\x94"), "aaaaaaaaaaaa");
}

TEST_F(ProcessNameTest, OtherBytesThatAreNotUtf8GiveNone) {
    EXPECT_EQ(nameOf("a\xFF"
                     "b"),
              std::nullopt);
    EXPECT_EQ(nameOf("\x80\x80\x80\x80"), std::nullopt);
}

TEST_F(ProcessNameTest, InfoIsTrueOnlyForAWholeRecord) {
    processes_.add({.pid = 7, .parent = 3, .commandName = "player", .startTimeTicks = 5});
    platform::ProcessRecord record;
    EXPECT_TRUE(VelaReportingUtilityProcessInfoForPID(processes_, 7, record));
    EXPECT_EQ(record.commandName, "player");
    EXPECT_EQ(record.parent, 3);
    EXPECT_FALSE(VelaReportingUtilityProcessInfoForPID(processes_, 8, record));
    EXPECT_FALSE(VelaReportingUtilityProcessInfoForPID(processes_, 0, record));
    EXPECT_EQ(record.commandName, "player");
}

TEST(NumberTest, TheMinimumPlayingTimeIsHalfASecondForEveryType) {
    for (const std::uint32_t type : {0U, 11U, 12U, 65535U}) {
        EXPECT_EQ(VelaReportingUtilityVolumeMinimumPlayingTime(type), 0.5);
    }
}

TEST(NumberTest, RoundsHalvesAwayFromZero) {
    EXPECT_EQ(VelaReportingUtilityRoundWithPlaces(2.5, 0), 3.0);
    EXPECT_EQ(VelaReportingUtilityRoundWithPlaces(-2.5, 0), -3.0);
    EXPECT_EQ(VelaReportingUtilityRoundWithPlaces(0.125, 2), 0.13);
    EXPECT_EQ(VelaReportingUtilityRoundWithPlaces(-0.125, 2), -0.13);
    EXPECT_EQ(VelaReportingUtilityRoundWithPlaces(2.4999, 0), 2.0);
}

TEST(NumberTest, NegativePlacesRoundToTensAndHundreds) {
    EXPECT_EQ(VelaReportingUtilityRoundWithPlaces(1234, -2), 1200.0);
    EXPECT_EQ(VelaReportingUtilityRoundWithPlaces(1250, -2), 1300.0);
    EXPECT_EQ(VelaReportingUtilityRoundWithPlaces(4, -1), 0.0);
}

constexpr std::array<double, 3> kOneTwoThree = {1, 2, 3};

TEST(BucketTest, TheNearestBucketIsTaken) {
    EXPECT_EQ(VelaReportingUtilityBucketNumberToString(2.2, kOneTwoThree, 0), "2");
    EXPECT_EQ(VelaReportingUtilityBucketNumberToString(10, kOneTwoThree, 0), "3");
    EXPECT_EQ(VelaReportingUtilityBucketNumberToString(-4, kOneTwoThree, 0), "1");
}

TEST(BucketTest, OfTwoEquallyNearTheLaterIsTaken) {
    EXPECT_EQ(VelaReportingUtilityBucketNumberToString(2.5, kOneTwoThree, 0), "3");
    EXPECT_EQ(VelaReportingUtilityBucketNumberToString(1.5, kOneTwoThree, 0), "2");
}

TEST(BucketTest, TheWalkStopsWhereTheDistanceFirstGrows) {
    EXPECT_EQ(VelaReportingUtilityBucketNumberToString(2, std::array{1.0, 5.0, 2.0}, 0), "1");
    EXPECT_EQ(VelaReportingUtilityBucketNumberToString(2, std::array{1.0, 3.0, 2.0}, 0), "2");
}

TEST(BucketTest, WithoutBucketsThereIsNone) {
    EXPECT_EQ(VelaReportingUtilityBucketNumberToString(2, {}, 1), std::nullopt);
}

TEST(BucketTest, AFractionHasOneDigitAtLeastAndAsManyAsGivenAtMost) {
    const auto form = [](double bucket, std::uint32_t digits) {
        return VelaReportingUtilityBucketNumberToString(bucket, std::array{bucket}, digits).value();
    };
    EXPECT_EQ(form(0, 4), "0.0");
    EXPECT_EQ(form(0.0625, 4), "0.0625");
    EXPECT_EQ(form(0.125, 4), "0.125");
    EXPECT_EQ(form(0.5, 4), "0.5");
    EXPECT_EQ(form(1, 4), "1.0");
    EXPECT_EQ(form(10, 1), "10.0");
    EXPECT_EQ(form(0.5, 1), "0.5");
    EXPECT_EQ(form(1, 1), "1.0");
    EXPECT_EQ(form(0.0625, 2), "0.06");
    EXPECT_EQ(form(3, 0), "3");
    EXPECT_EQ(form(18000, 0), "18000");
    EXPECT_EQ(form(0.25, 0xFFFFFFFF), "0.25");
}

TEST(BucketTest, TheLocaleDoesNotMatter) {
    const std::string before = std::setlocale(LC_ALL, nullptr);
    bool changed = false;
    for (const char* locale : {"de_DE.UTF-8", "fr_FR.UTF-8", "de_DE", "fr_FR"}) {
        changed = changed || std::setlocale(LC_ALL, locale) != nullptr;
    }
    EXPECT_EQ(VelaReportingUtilityBucketNumberToString(0.5, std::array{0.5}, 4), "0.5");
    EXPECT_EQ(VelaReportingUtilityBucketNumberToString(18000, std::array{18000.0}, 0), "18000");
    EXPECT_EQ(textualForm(Value(0.5)), "0.5");
    std::setlocale(LC_ALL, before.c_str());
    if (!changed) {
        GTEST_SKIP() << "no locale with a decimal comma is installed; tried in the one that is in force";
    }
}

TEST(SwitchTest, MessagesAndTransactionsAreAlwaysAllowed) {
    EXPECT_TRUE(VelaReportingUtilityShouldSendMessage());
    EXPECT_TRUE(VelaReportingUtilityAllowSessionTransactions());
}

TEST(InternalBuildTest, IsTheDevicesAnswer) {
    testing::FakeDeviceProperties device;
    device.setBoolean("InternalBuild", true);
    const VelaReportingBuildType buildType(device);
    EXPECT_TRUE(VelaReportingUtilityIsInternalBuild());
}

TEST(InternalBuildTest, WithoutAnAnswerItStaysFalse) {
    testing::FakeDeviceProperties device;
    const VelaReportingBuildType buildType(device);
    EXPECT_FALSE(VelaReportingUtilityIsInternalBuild());
    device.setBoolean("InternalBuild", true);
    EXPECT_FALSE(VelaReportingUtilityIsInternalBuild());
    EXPECT_EQ(device.booleanQueries(), 1U);
}

TEST(InternalBuildTest, IsNotAskedBeforeItIsWanted) {
    testing::FakeDeviceProperties device;
    const VelaReportingBuildType buildType(device);
    EXPECT_EQ(device.booleanQueries(), 0U);
}

TEST(InternalBuildTest, IsAskedOnceByManyThreads) {
    testing::FakeDeviceProperties device;
    device.setBoolean("InternalBuild", true);
    const VelaReportingBuildType buildType(device);
    std::vector<std::thread> threads;
    for (int index = 0; index < 8; ++index) {
        threads.emplace_back([] { EXPECT_TRUE(VelaReportingUtilityIsInternalBuild()); });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(device.booleanQueries(), 1U);
}

TEST(InternalBuildTest, IsFalseWhereNobodyAsksADevice) { EXPECT_FALSE(VelaReportingUtilityIsInternalBuild()); }

class WaitTest : public ::testing::Test {
protected:
    using Line = CapturedLine;

    bool wait() {
        return VelaReportingUtilityWait(*condition_, 2.0, flag_, "waiting for it", "it never came",
                                        VelaReportingSnagLogCategory());
    }
    static Line line(LogLevel level, std::string message) {
        return {level, "velarb", "VelaReportingUtility", std::move(message)};
    }

    testing::CapturingLog log_;
    testing::ManualClock clock_;
    testing::ManualWorkQueues queues_{clock_};
    std::unique_ptr<platform::Condition> condition_ = queues_.makeCondition();
    bool flag_ = false;
};

TEST_F(WaitTest, AFlagThatIsSetEndsItWithoutWaitingOrLogging) {
    flag_ = true;
    const platform::MonotonicTime before = clock_.monotonicNow();
    EXPECT_TRUE(wait());
    EXPECT_TRUE(log_.lines().empty());
    EXPECT_EQ(clock_.monotonicNow(), before);
}

TEST_F(WaitTest, ASignalWithTheFlagEndsItWithTrue) {
    queues_.addConditionStep([this](platform::Condition& condition) { VelaReportingUtilitySignal(condition, flag_); });
    EXPECT_TRUE(wait());
    EXPECT_EQ(log_.lines(),
              (std::vector<Line>{line(LogLevel::Info, "waiting for it"), line(LogLevel::Info, "continuing")}));
    EXPECT_TRUE(flag_);
}

TEST_F(WaitTest, TheTimeLimitEndsItWithFalse) {
    const platform::MonotonicTime before = clock_.monotonicNow();
    EXPECT_FALSE(wait());
    EXPECT_EQ(log_.lines(),
              (std::vector<Line>{line(LogLevel::Info, "waiting for it"), line(LogLevel::Error, "it never came")}));
    EXPECT_EQ(clock_.monotonicNow() - before, std::chrono::seconds(2));
}

TEST_F(WaitTest, EveryRoundWaitsTheFullTime) {
    const platform::MonotonicTime before = clock_.monotonicNow();
    for (int round = 0; round < 2; ++round) {
        queues_.addConditionStep([this](platform::Condition& condition) {
            clock_.advance(std::chrono::milliseconds(1500));
            condition.signal();
        });
    }
    EXPECT_FALSE(wait());
    EXPECT_EQ(clock_.monotonicNow() - before, std::chrono::seconds(5));
    EXPECT_EQ(log_.lines(),
              (std::vector<Line>{line(LogLevel::Info, "waiting for it"), line(LogLevel::Info, "continuing"),
                                 line(LogLevel::Info, "waiting for it"), line(LogLevel::Info, "continuing"),
                                 line(LogLevel::Info, "waiting for it"), line(LogLevel::Error, "it never came")}));
}

TEST_F(WaitTest, AFlagSetWhenTheTimeIsOverIsNotSeen) {
    queues_.addConditionStep([this](platform::Condition&) {
        clock_.advance(std::chrono::seconds(2));
        flag_ = true;
    });
    EXPECT_FALSE(wait());
}

TEST_F(WaitTest, UnlocksWhicheverWayItEnds) {
    EXPECT_FALSE(wait());
    flag_ = true;
    EXPECT_TRUE(wait());
    condition_->lock();
    condition_->unlock();
}

} // namespace

} // namespace vela
