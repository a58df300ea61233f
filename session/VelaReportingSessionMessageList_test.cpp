#include "session/Session_test.h"
#include "session/VelaReportingSessionMessageList.h"

#include <map>
#include <random>

namespace vela {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class VelaReportingSessionMessageListTest : public ::testing::Test {
protected:
    VelaReportingSessionMessageListTest() {
        const MutexLock lock(list_.mutex());
        list_.begin();
    }
    /// Whether the message is redundant.
    bool identify(std::uint32_t category, std::uint16_t type, const Dictionary& message) {
        const MutexLock lock(list_.mutex());
        return list_.createMessageIdentifierWithCategory(category, type, message);
    }
    std::optional<std::uint32_t> count(std::string_view identifier) {
        const MutexLock lock(list_.mutex());
        return list_.messageIdentifierCount(identifier);
    }
    std::vector<std::string> recorded() { return recordedBy(list_); }
    std::vector<std::string> keys() { return recordedKeysOf(list_); }

    testing::CapturingLog log_;
    VelaReportingSessionMessageList list_;
};

TEST_F(VelaReportingSessionMessageListTest, TheFirstOfAnIdentifierHasTheCountOne) {
    EXPECT_FALSE(identify(1, 1, {{"a", 1}}));
    EXPECT_THAT(recorded(), ElementsAre("Generic_Start_1 {a = 1;}"));
    EXPECT_EQ(count("Generic_Start"), 1U);
    EXPECT_EQ(count("Generic_Stop"), std::nullopt);
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingSessionMessageListTest, FlagsStandInTheIdentifier) {
    identify(0x10000004, 1, {{"a", 1}});
    identify(0xFFFFFFFF, 65535, {{"a", 1}});
    EXPECT_THAT(keys(), ElementsAre("DSP_Playback_Start_1", "Undefined_Unknown_1"));
}

TEST_F(VelaReportingSessionMessageListTest, DifferentMessagesCountOn) {
    EXPECT_FALSE(identify(1, 1, {{"a", 1}, {"velareporting_timestamp", 1.5}}));
    EXPECT_FALSE(identify(1, 1, {{"a", 2}, {"velareporting_timestamp", 2.5}}));
    EXPECT_THAT(recorded(), ElementsAre("Generic_Start_1 {a = 1; velareporting_timestamp = 1.5;}",
                                        "Generic_Start_2 {a = 2; velareporting_timestamp = 2.5;}"));
    EXPECT_EQ(count("Generic_Start"), 2U);
}

TEST_F(VelaReportingSessionMessageListTest, ARepeatIsRedundant) {
    identify(1, 1, {{"a", 1}});
    EXPECT_TRUE(identify(1, 1, {{"a", 1}}));
    EXPECT_THAT(keys(), ElementsAre("Generic_Start_1"));
    EXPECT_EQ(count("Generic_Start"), 1U);
    EXPECT_THAT(log_.lines(), ElementsAre(sessionLine(LogLevel::Debug, "dropping redundant event")));
}

class IgnoredKeyTest : public VelaReportingSessionMessageListTest, public ::testing::WithParamInterface<const char*> {};
INSTANTIATE_TEST_SUITE_P(VelaReportingSessionMessageList, IgnoredKeyTest,
                         ::testing::Values("velareporting_timestamp", "systemuptime_sec", "processuptime_ms"));

TEST_P(IgnoredKeyTest, AnotherTimeIsStillARepeat) {
    identify(1, 1, {{"a", 1}, {GetParam(), 1}});
    EXPECT_TRUE(identify(1, 1, {{"a", 1}, {GetParam(), 2}}));
}

TEST_P(IgnoredKeyTest, ATimeThatOnlyTheNewOneHasIsStillARepeat) {
    identify(1, 1, {{"a", 1}});
    EXPECT_TRUE(identify(1, 1, {{"a", 1}, {GetParam(), 2}}));
}

TEST_P(IgnoredKeyTest, ATimeThatOnlyTheOldOneHasIsStillARepeat) {
    identify(1, 1, {{GetParam(), 1}, {"a", 1}});
    EXPECT_TRUE(identify(1, 1, {{"a", 1}}));
}

TEST_F(VelaReportingSessionMessageListTest, PublishedKeysThatNobodyReadsAreComparedLikeOthers) {
    identify(1, 1, {{"a", 1}, {"_comparison_field_blacklist", "a"}, {"_throttle_seconds", 60}});
    EXPECT_FALSE(identify(1, 1, {{"a", 2}, {"_comparison_field_blacklist", "a"}, {"_throttle_seconds", 60}}));
    EXPECT_FALSE(identify(1, 1, {{"a", 2}, {"_comparison_field_blacklist", "b"}, {"_throttle_seconds", 60}}));
    EXPECT_FALSE(identify(1, 1, {{"a", 2}, {"_comparison_field_blacklist", "b"}, {"_throttle_seconds", 61}}));
    EXPECT_TRUE(identify(1, 1, {{"a", 2}, {"_comparison_field_blacklist", "b"}, {"_throttle_seconds", 61}}));
}

TEST_F(VelaReportingSessionMessageListTest, TheTagCounts) {
    identify(1, 1, {{"audiotag", "a"}});
    EXPECT_FALSE(identify(1, 1, {{"audiotag", "b"}}));
}

TEST_F(VelaReportingSessionMessageListTest, ValuesAreComparedExactly) {
    identify(1, 1, {{"a", 1}});
    EXPECT_FALSE(identify(1, 1, {{"a", true}}));
    EXPECT_FALSE(identify(1, 1, {{"a", 1.0}}));
    EXPECT_FALSE(identify(1, 1, {{"a", "1"}}));
    EXPECT_FALSE(identify(1, 1, {{"a", Array{1}}}));
    EXPECT_EQ(count("Generic_Start"), 5U);
}

TEST_F(VelaReportingSessionMessageListTest, NestedValuesAreCompared) {
    identify(1, 1, {{"a", Dictionary{{"b", Array{1, 2}}}}});
    EXPECT_TRUE(identify(1, 1, {{"a", Dictionary{{"b", Array{1, 2}}}}}));
    EXPECT_FALSE(identify(1, 1, {{"a", Dictionary{{"b", Array{2, 1}}}}}));
}

TEST_F(VelaReportingSessionMessageListTest, TimesInsideAValueCount) {
    identify(1, 1, {{"a", Dictionary{{"velareporting_timestamp", 1}}}});
    EXPECT_FALSE(identify(1, 1, {{"a", Dictionary{{"velareporting_timestamp", 2}}}}));
}

TEST_F(VelaReportingSessionMessageListTest, TheOrderOfKeysDoesNotMatter) {
    identify(1, 1, {{"a", 1}, {"b", 2}});
    EXPECT_TRUE(identify(1, 1, {{"b", 2}, {"a", 1}}));
}

TEST_F(VelaReportingSessionMessageListTest, AMissingKeyIsADifference) {
    identify(1, 1, {{"a", 1}, {"b", 2}});
    EXPECT_FALSE(identify(1, 1, {{"a", 1}}));
    EXPECT_FALSE(identify(1, 1, {{"a", 1}, {"b", 2}}));
}

TEST_F(VelaReportingSessionMessageListTest, CategoryElevenIsNeverRedundant) {
    identify(11, 1, {{"a", 1}});
    EXPECT_FALSE(identify(11, 1, {{"a", 1}}));
    EXPECT_THAT(keys(), ElementsAre("Error_Start_1", "Error_Start_2"));
}

TEST_F(VelaReportingSessionMessageListTest, TypeSixIsNeverRedundant) {
    identify(4, 6, {{"a", 1}});
    EXPECT_FALSE(identify(4, 6, {{"a", 1}}));
    EXPECT_THAT(keys(), ElementsAre("Playback_Error_1", "Playback_Error_2"));
}

TEST_F(VelaReportingSessionMessageListTest, CategoryElevenWithAFlagMayBeRedundant) {
    identify(0x0800000B, 1, {{"a", 1}});
    EXPECT_TRUE(identify(0x0800000B, 1, {{"a", 1}}));
    EXPECT_THAT(keys(), ElementsAre("Session_Error_Start_1"));
}

TEST_F(VelaReportingSessionMessageListTest, CategoriesAndTypesOfOneNameShareAnIdentifier) {
    identify(0, 0, {{"a", 1}});
    EXPECT_TRUE(identify(16, 0, {{"a", 1}}));
    EXPECT_TRUE(identify(0, 19, {{"a", 1}}));
    EXPECT_TRUE(identify(65535, 20, {{"a", 1}}));
    EXPECT_FALSE(identify(16, 0, {{"a", 2}}));
    EXPECT_TRUE(identify(0, 0, {{"a", 2}}));
    EXPECT_THAT(keys(), ElementsAre("Undefined_Generic_1", "Undefined_Generic_2"));
}

TEST_F(VelaReportingSessionMessageListTest, FlagsWithoutANameShareAnIdentifier) {
    identify(0x00010002, 1, {{"a", 1}});
    EXPECT_TRUE(identify(0x30000002, 1, {{"a", 1}}));
    EXPECT_FALSE(identify(2, 1, {{"a", 1}}));
    EXPECT_THAT(keys(), ElementsAre("_Record_Start_1", "Record_Start_1"));
}

TEST_F(VelaReportingSessionMessageListTest, OnlyTheLastOfAnIdentifierIsCompared) {
    EXPECT_FALSE(identify(1, 1, {{"a", 1}}));
    EXPECT_FALSE(identify(1, 1, {{"a", 2}}));
    EXPECT_FALSE(identify(1, 1, {{"a", 1}}));
    EXPECT_EQ(count("Generic_Start"), 3U);
}

TEST_F(VelaReportingSessionMessageListTest, OtherIdentifiersDoNotInterrupt) {
    EXPECT_FALSE(identify(1, 1, {{"a", 1}}));
    EXPECT_FALSE(identify(2, 1, {{"a", 1}}));
    EXPECT_TRUE(identify(1, 1, {{"a", 1}}));
}

TEST_F(VelaReportingSessionMessageListTest, ARepeatIsComparedWithTheStoredMessage) {
    identify(1, 1, {{"a", 1}, {"velareporting_timestamp", 1}});
    EXPECT_TRUE(identify(1, 1, {{"a", 1}, {"velareporting_timestamp", 2}}));
    EXPECT_TRUE(identify(1, 1, {{"a", 1}, {"velareporting_timestamp", 3}}));
    EXPECT_THAT(recorded(), ElementsAre("Generic_Start_1 {a = 1; velareporting_timestamp = 1;}"));
}

TEST_F(VelaReportingSessionMessageListTest, WithoutAListNothingIsRecordedOrRedundant) {
    VelaReportingSessionMessageList none;
    const MutexLock lock(none.mutex());
    EXPECT_FALSE(none.createMessageIdentifierWithCategory(1, 1, {{"a", 1}}));
    EXPECT_FALSE(none.createMessageIdentifierWithCategory(1, 1, {{"a", 1}}));
    EXPECT_FALSE(none.exists());
    EXPECT_TRUE(none.messages().empty());
    EXPECT_EQ(none.messageIdentifierCount("Generic_Start"), std::nullopt);
    EXPECT_THAT(log_.lines(), IsEmpty());
}

TEST_F(VelaReportingSessionMessageListTest, ANewListForgetsCountsAndMessages) {
    identify(1, 1, {{"a", 1}});
    {
        const MutexLock lock(list_.mutex());
        list_.clear();
        EXPECT_FALSE(list_.exists());
        list_.begin();
    }
    EXPECT_EQ(count("Generic_Start"), std::nullopt);
    EXPECT_FALSE(identify(1, 1, {{"a", 1}}));
    EXPECT_THAT(keys(), ElementsAre("Generic_Start_1"));
}

TEST_F(VelaReportingSessionMessageListTest, AClearedListHoldsNoMessage) {
    const std::string text(64, 'x');
    const Dictionary message{{"a", std::string_view(text)}};
    identify(1, 1, message);
    const MutexLock lock(list_.mutex());
    EXPECT_TRUE(list_.messages()[0].message.isSameObject(message)); // shared, not copied
    list_.clear();
    EXPECT_TRUE(list_.messages().empty());
}

// The rules again, as they are told: strings for identifiers, a walk from the end.
class PlainList {
public:
    bool identify(std::uint32_t category, std::uint16_t type, const Dictionary& message) {
        const std::string identifier =
            VelaReportingUtilityCategoryString(category) + "_" + std::string(VelaReportingUtilityTypeString(type));
        const auto known = counts.find(identifier);
        if (known == counts.end()) {
            counts[identifier] = 1;
            messages.emplace_back(identifier + "_1", message);
            return false;
        }
        Dictionary last;
        for (auto entry = messages.rbegin(); entry != messages.rend(); ++entry) {
            if (entry->first == identifier + "_" + std::to_string(known->second)) {
                last = entry->second;
                break;
            }
        }
        if (withoutTimes(last) == withoutTimes(message) && category != 11 && type != 6) {
            return true;
        }
        messages.emplace_back(identifier + "_" + std::to_string(++known->second), message);
        return false;
    }

    std::map<std::string, std::uint32_t> counts;
    std::vector<std::pair<std::string, Dictionary>> messages;

private:
    static Dictionary withoutTimes(const Dictionary& message) {
        return message.removing(Key("processuptime_ms"))
            .removing(Key("systemuptime_sec"))
            .removing(Key("velareporting_timestamp"));
    }
};

Dictionary randomMessage(std::mt19937& random) {
    DictionaryBuilder message;
    const auto below = [&random](std::uint32_t limit) { return static_cast<std::uint32_t>(random() % limit); };
    const bool turned = below(2) == 0;
    for (std::uint32_t step = 0; step < 6; ++step) {
        switch (turned ? 5 - step : step) {
        case 0:
            message.add("a", below(2));
            break;
        case 1:
            message.add("b", below(8) == 0 ? Value(true) : Value(1));
            break;
        case 2:
            if (below(2) == 0) {
                message.add("velareporting_timestamp", below(100));
            }
            break;
        case 3:
            if (below(3) == 0) {
                message.add("systemuptime_sec", below(100));
            }
            break;
        case 4:
            if (below(3) == 0) {
                message.add("processuptime_ms", below(100));
            }
            break;
        default:
            if (below(10) == 0) {
                message.add("c", below(8) == 0 ? Value(Array{1, "two"}) : Value("text"));
            }
            break;
        }
    }
    return message.build();
}

class RandomMessagesTest : public ::testing::TestWithParam<unsigned> {};
INSTANTIATE_TEST_SUITE_P(VelaReportingSessionMessageList, RandomMessagesTest, ::testing::Range(1U, 9U));

TEST_P(RandomMessagesTest, AreIdentifiedAsByAWalkFromTheEnd) {
    // Numbers that share names, errors, flags, and more pairs than the list remembers.
    constexpr std::uint32_t kCategories[] = {0,  1,  2,          4,          11,         14,         15,
                                             16, 17, 0x0800000B, 0x10000004, 0x00010002, 0x30000002, 0xFFFFFFFF};
    constexpr std::uint16_t kTypes[] = {0, 1, 2, 6, 11, 19, 65535};
    std::mt19937 random(GetParam());
    VelaReportingSessionMessageList list;
    PlainList plain;
    const MutexLock lock(list.mutex());
    list.begin();
    int redundant = 0;
    for (int number = 0; number < 3'000; ++number) {
        const std::uint32_t category = kCategories[random() % std::size(kCategories)];
        const std::uint16_t type = kTypes[random() % std::size(kTypes)];
        const Dictionary message = randomMessage(random);
        const bool answer = list.createMessageIdentifierWithCategory(category, type, message);
        redundant += answer ? 1 : 0;
        ASSERT_EQ(answer, plain.identify(category, type, message)) << number << ' ' << textualForm(Value(message));
    }
    EXPECT_GT(redundant, 100);
    ASSERT_EQ(list.messages().size(), plain.messages.size());
    for (std::size_t index = 0; index < plain.messages.size(); ++index) {
        ASSERT_EQ(list.keyOf(list.messages()[index]), plain.messages[index].first);
        ASSERT_TRUE(list.messages()[index].message.isSameObject(plain.messages[index].second));
    }
    for (const auto& [identifier, count] : plain.counts) {
        EXPECT_EQ(list.messageIdentifierCount(identifier), count) << identifier;
    }
}

TEST(SessionMessageListSizeTest, AStoredMessageTakesSixteenBytes) { EXPECT_EQ(sizeof(StoredMessage), 16U); }

} // namespace

} // namespace vela
