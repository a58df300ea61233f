#include "shaping/RapidMessages.h"
#include "shaping/Shaping_test.h"
#include "testing/CapturingLog.h"

#include <array>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>

namespace vela {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr const char* kAccessory = "spatial-audio-accessory-feature";
constexpr const char* kSpatialization = "spatializationEnabled";

std::vector<Dictionary> combine(const std::vector<Dictionary>& messages, double maximumPausetime = 2.0) {
    const std::array keys = {Key(kAccessory), Key(kSpatialization)};
    return combineRapidMessages(storedMessages(messages), keys, maximumPausetime);
}

/// A combinable message.
Dictionary spatialAt(double time) { return messageAt(time, {{kSpatialization, true}}); }
Dictionary spatialWithoutTime() { return {{kSpatialization, true}}; }
Dictionary plainAt(double time) { return messageAt(time, {{"NexoSessionVolume", 0.5}}); }

TEST(RapidMessagesTest, NoMessagesGiveNone) { EXPECT_THAT(combine({}), IsEmpty()); }

TEST(RapidMessagesTest, MessagesWithoutACombinableKeyComeOutInOrder) {
    EXPECT_THAT(combine({plainAt(3.0), Dictionary(), plainAt(1.0), {{"session_duration", 4}}}),
                ElementsAre(plainAt(3.0), Dictionary(), plainAt(1.0), Dictionary{{"session_duration", 4}}));
}

TEST(RapidMessagesTest, AMessageWithoutACombinableKeyIsTheSameObject) {
    const Dictionary plain = plainAt(10.5);
    const std::vector<Dictionary> output = combine({spatialAt(10.0), plain, spatialAt(11.0)});
    ASSERT_EQ(output.size(), 2U);
    EXPECT_TRUE(output[1].isSameObject(plain));
}

TEST(RapidMessagesTest, ACombinableMessageIsANewDictionaryEvenAlone) {
    const Dictionary spatial = spatialAt(10.0);
    const std::vector<Dictionary> output = combine({spatial});
    EXPECT_THAT(output, ElementsAre(spatial));
    EXPECT_FALSE(output[0].isSameObject(spatial));
}

TEST(RapidMessagesTest, TheInputKeepsItsMessages) {
    const std::array keys = {Key(kAccessory), Key(kSpatialization)};
    const std::vector<Dictionary> messages = {spatialAt(10.0), plainAt(10.5), messageAt(11.0, {{kAccessory, 7}})};
    const std::vector<StoredMessage> stored = storedMessages(messages);
    combineRapidMessages(stored, keys, 2.0);
    for (std::size_t index = 0; index < messages.size(); ++index) {
        EXPECT_TRUE(stored[index].message.isSameObject(messages[index]));
    }
    EXPECT_THAT(messages, ElementsAre(spatialAt(10.0), plainAt(10.5), messageAt(11.0, {{kAccessory, 7}})));
}

TEST(RapidMessagesTest, KindAndCountAreNotLookedAt) {
    const std::array keys = {Key(kSpatialization)};
    const std::vector<StoredMessage> oneKind = {{0, 1, spatialAt(1.0)}, {0, 2, spatialAt(2.0)}};
    const std::vector<StoredMessage> oddNumbers = {{9, 0, spatialAt(1.0)}, {4, 0xFFFFFFFF, spatialAt(2.0)}};
    EXPECT_THAT(combineRapidMessages(oneKind, keys, 2.0), ElementsAre(spatialAt(2.0)));
    EXPECT_THAT(combineRapidMessages(oddNumbers, keys, 2.0), ElementsAre(spatialAt(2.0)));
}

TEST(RapidMessagesTest, TwoCallsGiveTheSameAndLogNothing) {
    const testing::CapturingLog log;
    const std::vector<Dictionary> messages = {spatialAt(10.0), plainAt(10.5), spatialAt(11.0), spatialAt(20.0)};
    const std::vector<Dictionary> first = combine(messages);
    EXPECT_EQ(combine(messages), first);
    EXPECT_EQ(first.size(), 3U);
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST(RapidMessagesTest, OtherKeysAndPausesAreTakenFromTheArguments) {
    const std::array keys = {Key("quality")};
    const std::vector<StoredMessage> stored =
        storedMessages({messageAt(1.0, {{"quality", 1}}), messageAt(1.0, {{"quality", 2}}),
                        messageAt(1.5, {{"quality", 3}}), spatialAt(1.5), spatialAt(1.5)});
    EXPECT_THAT(combineRapidMessages(stored, keys, 0.0),
                ElementsAre(messageAt(1.0, {{"quality", 2}}), messageAt(1.5, {{"quality", 3}}), spatialAt(1.5),
                            spatialAt(1.5)));
    EXPECT_THAT(combineRapidMessages(stored, {}, 0.0).size(), 5U);
}

TEST(RapidMessagesTest, ACombinableKeyCountsWhateverItsValue) {
    for (const Value& value : {Value(false), Value(0), Value(""), Value(Dictionary()), Value(Array())}) {
        EXPECT_THAT(combine({messageAt(1.0, {{kAccessory, value}}), spatialAt(1.0)}).size(), 1U);
    }
}

TEST(RapidMessagesTest, MessagesWithDifferentCombinableKeysMerge) {
    EXPECT_THAT(combine({messageAt(1.0, {{kSpatialization, true}}), messageAt(1.5, {{kAccessory, 3}})}),
                ElementsAre(messageAt(1.5, {{kSpatialization, true}, {kAccessory, 3}})));
}

TEST(RapidMessagesTest, APauseOfExactlyTheMaximumIsOneGroup) {
    EXPECT_THAT(combine({spatialAt(10.0), spatialAt(12.0)}), ElementsAre(spatialAt(12.0)));
}

TEST(RapidMessagesTest, ALongerPauseMakesTwoGroups) {
    EXPECT_THAT(combine({spatialAt(10.0), spatialAt(12.5)}), ElementsAre(spatialAt(10.0), spatialAt(12.5)));
}

TEST(RapidMessagesTest, PausesAreComparedWithoutTolerance) {
    EXPECT_EQ(combine({spatialAt(2.4), spatialAt(4.4)}).size(), 2U); // 2.0000000000000004
    EXPECT_EQ(combine({spatialAt(0.3), spatialAt(2.3)}).size(), 1U); // 1.9999999999999998
}

TEST(RapidMessagesTest, ThePauseIsMeasuredFromThePreviousMember) {
    EXPECT_THAT(combine({spatialAt(10.0), spatialAt(11.9), spatialAt(13.8)}), ElementsAre(spatialAt(13.8)));
}

TEST(RapidMessagesTest, ANegativePauseJoinsAndItsTimeIsTheNextOnesStart) {
    EXPECT_THAT(combine({spatialAt(10.0), spatialAt(3.0)}), ElementsAre(spatialAt(3.0)));
    EXPECT_THAT(combine({spatialAt(10.0), spatialAt(3.0), spatialAt(5.5)}),
                ElementsAre(spatialAt(3.0), spatialAt(5.5)));
}

TEST(RapidMessagesTest, PlainMessagesBetweenDoNotEndAGroup) {
    EXPECT_THAT(combine({spatialAt(10.0), plainAt(10.5), messageAt(11.0, {{kAccessory, true}})}),
                ElementsAre(messageAt(11.0, {{kSpatialization, true}, {kAccessory, true}}), plainAt(10.5)));
    EXPECT_THAT(combine({spatialAt(10.0), plainAt(9000.0), plainAt(-5.0), spatialAt(11.0)}),
                ElementsAre(spatialAt(11.0), plainAt(9000.0), plainAt(-5.0)));
}

TEST(RapidMessagesTest, ANewGroupMakesTheOlderOneFinal) {
    EXPECT_THAT(combine({spatialAt(10.0), spatialAt(20.0), messageAt(11.0, {{"late", 1}, {kAccessory, 2}})}),
                ElementsAre(spatialAt(10.0), messageAt(11.0, {{kSpatialization, true}, {"late", 1}, {kAccessory, 2}})));
}

TEST(RapidMessagesTest, TheLaterValueOfAKeyWinsAndOtherKeysStay) {
    const Dictionary first = messageAt(
        1.0, {{kAccessory, 1}, {"audiotag", "VolumeStart"}, {"session_output_running", true}, {"only first", "kept"}});
    const Dictionary second = messageAt(
        2.0,
        {{kAccessory, 2}, {"audiotag", "OutputStop"}, {"session_output_running", false}, {"only second", "kept too"}});
    EXPECT_THAT(combine({first, second}), ElementsAre(messageAt(2.0, {{kAccessory, 2},
                                                                      {"audiotag", "OutputStop"},
                                                                      {"session_output_running", false},
                                                                      {"only first", "kept"},
                                                                      {"only second", "kept too"}})));
}

TEST(RapidMessagesTest, KeysStandInTheOrderInWhichTheyCameFirst) {
    const std::vector<Dictionary> output =
        combine({{{"z", 1}, {kSpatialization, 1}, {"y", 1}}, {{"a", 2}, {"y", 2}, {"z", 2}, {kAccessory, 2}}});
    ASSERT_EQ(output.size(), 1U);
    EXPECT_THAT(keysOf(output[0]), ElementsAre("z", kSpatialization, "y", "a", kAccessory));
}

TEST(RapidMessagesTest, TheTimeOfACombinedMessageIsItsLastMembers) {
    const std::vector<Dictionary> output = combine({spatialAt(10.0), plainAt(10.5), spatialAt(11.0)});
    ASSERT_EQ(output.size(), 2U);
    EXPECT_EQ(output[0].find("velareporting_timestamp").doubleValue(), 11.0);
    EXPECT_EQ(output[1].find("velareporting_timestamp").doubleValue(), 10.5);
}

TEST(RapidMessagesTest, ALastMemberWithoutTimeLeavesTheEarlierTime) {
    EXPECT_THAT(combine({spatialAt(10.0), spatialWithoutTime()}), ElementsAre(spatialAt(10.0)));
}

TEST(RapidMessagesTest, AMissingTimeCountsAsZeroInTheTest) {
    EXPECT_EQ(combine({spatialAt(-5.0), spatialWithoutTime()}).size(), 2U);
    EXPECT_EQ(combine({spatialAt(-2.0), spatialWithoutTime()}).size(), 1U);
    EXPECT_EQ(combine({spatialAt(10.0), spatialWithoutTime()}).size(), 1U);
}

TEST(RapidMessagesTest, AfterAMemberWithoutTimeTheNextAlwaysJoins) {
    EXPECT_THAT(combine({spatialAt(10.0), spatialWithoutTime(), spatialAt(500.0)}), ElementsAre(spatialAt(500.0)));
    EXPECT_THAT(combine({spatialWithoutTime(), spatialAt(500.0), spatialAt(503.0)}),
                ElementsAre(spatialAt(500.0), spatialAt(503.0)));
}

TEST(RapidMessagesTest, IntegerTimesAreNumbers) {
    const auto at = [](std::int64_t time) {
        return Dictionary{{"velareporting_timestamp", time}, {kSpatialization, true}};
    };
    EXPECT_EQ(combine({at(10), at(12)}).size(), 1U);
    EXPECT_EQ(combine({at(10), at(13)}).size(), 2U);
}

TEST(RapidMessagesTest, ATimeThatIsNoNumberIsZeroAndCountsAsPresent) {
    const Dictionary text = {{"velareporting_timestamp", "soon"}, {kSpatialization, true}};
    EXPECT_EQ(combine({text, spatialAt(2.0)}).size(), 1U);
    EXPECT_EQ(combine({text, spatialAt(2.5)}).size(), 2U);
    EXPECT_EQ(combine({spatialAt(-2.5), text}).size(), 2U);
}

TEST(RapidMessagesTest, ATimeThatIsNotANumberNeverMakesAPause) {
    EXPECT_EQ(combine({spatialAt(1.0), spatialAt(std::numeric_limits<double>::quiet_NaN()), spatialAt(900.0)}).size(),
              1U);
}

TEST(RapidMessagesTest, ALongBurstKeepsTheLastValueOfEveryKey) {
    std::vector<Dictionary> messages;
    DictionaryBuilder expected;
    expected.add("velareporting_timestamp", 999.0);
    expected.add(kSpatialization, 999);
    for (int index = 0; index < 1000; ++index) {
        messages.push_back(messageAt(index, {{kSpatialization, index}, {"key " + std::to_string(index % 300), index}}));
    }
    for (int key = 0; key < 300; ++key) {
        expected.add("key " + std::to_string(key), key < 100 ? 900 + key : 600 + key);
    }
    const Dictionary merged = expected.build();
    const std::vector<Dictionary> output = combine(messages);
    ASSERT_THAT(output, ElementsAre(merged));
    EXPECT_TRUE(output[0].hasSameKeysInOrder(merged));
}

} // namespace

} // namespace vela
