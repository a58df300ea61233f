#include "platform/hwstats/ChannelTables_test.h"
#include "platform/hwstats/Samples.h"
#include "platform/hwstats/SystemTree_test.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>

namespace vela::platform::hwstats {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

const auto kTable = std::make_shared<const ChannelTable>(exampleTable());

/// frames; least, greatest and hits of busy; transitions and residencies of stream.
SampleBlock block(std::vector<std::uint64_t> words, std::uint64_t generation = 1) {
    SampleBlock made;
    made.key = "file:a";
    made.table = kTable;
    made.words = std::move(words);
    made.generation = generation;
    made.wholeWhenNew = true;
    return made;
}

Samples samplesOf(std::vector<SampleBlock> blocks, std::uint64_t time = 0) {
    Samples samples;
    samples.blocks = std::move(blocks);
    samples.time = time;
    return samples;
}

std::vector<std::string> difference(const Samples& previous, const Samples& current) {
    return linesOf(*differenceOf(previous, current));
}

const std::vector<std::uint64_t> kBefore{5, 1, 9, 3, 4, 2, 100, 1, 50};
const std::vector<std::uint64_t> kAfter{7, 0, 12, 4, 4, 3, 150, 1, 90};

TEST(SamplesTest, ValuesAreHandedOut) {
    EXPECT_THAT(linesOf(samplesOf({block(kBefore)})),
                ElementsAre("Driver/Speaker/Stats frames: 5", "Driver/Speaker/Stats busy[us]: 1..9 0-10:3 10-20:4",
                            "Driver/Speaker/Stats stream: idle 2x 100, running 1x 50"));
}

TEST(SamplesTest, IteratingStopsWhenTheCallerSaysSo) {
    int calls = 0;
    UniqueFunction<int(const HwStatsChannel&)> use = [&](const HwStatsChannel&) { return ++calls == 2 ? 1 : 0; };
    iterateSamples(samplesOf({block(kBefore)}), use);
    EXPECT_EQ(calls, 2);
}

TEST(SamplesTest, CountersLoseWhatTheyHadAndLeastAndGreatestStay) {
    EXPECT_THAT(difference(samplesOf({block(kBefore)}), samplesOf({block(kAfter)})),
                ElementsAre("Driver/Speaker/Stats frames: 2", "Driver/Speaker/Stats busy[us]: 0..12 0-10:1 10-20:0",
                            "Driver/Speaker/Stats stream: idle 1x 50, running 0x 40"));
}

TEST(SamplesTest, TheTimeBetweenTheSamplesIsTheWholeOfADutyCycle) {
    std::vector<double> cycles;
    UniqueFunction<int(const HwStatsChannel&)> use = [&](const HwStatsChannel& channel) {
        for (const HwStatsState& state : channel.states) {
            cycles.push_back(state.dutyCycle);
        }
        return 0;
    };
    iterateSamples(*differenceOf(samplesOf({block(kBefore)}, 1'000), samplesOf({block(kAfter)}, 1'200)), use);
    EXPECT_THAT(cycles, ElementsAre(0.25, 0.2)) << "50 and 40 of 200";
    cycles.clear();
    iterateSamples(*differenceOf(samplesOf({block(kBefore)}, 1'000), samplesOf({block(kAfter)}, 1'010)), use);
    EXPECT_THAT(cycles, ElementsAre(50.0 / 90, 40.0 / 90)) << "never above 1 in all";
    cycles.clear();
    iterateSamples(samplesOf({block({0, 0, 0, 0, 0, 0, 0, 0, 0})}), use);
    EXPECT_THAT(cycles, ElementsAre(0.0, 0.0));
}

TEST(SamplesTest, ANewPublisherCountsWhole) {
    EXPECT_EQ(difference(samplesOf({}), samplesOf({block(kAfter)}))[0], "Driver/Speaker/Stats frames: 7");
}

TEST(SamplesTest, APublisherThatWasOnlyMissedDoesNotCount) {
    Samples missed;
    missed.missed.insert("file:a");
    EXPECT_THAT(difference(missed, samplesOf({block(kAfter)})), IsEmpty());
    Samples incomplete;
    incomplete.incomplete = true;
    EXPECT_THAT(difference(incomplete, samplesOf({block(kAfter)})), IsEmpty());
}

TEST(SamplesTest, ANewKernelCounterDoesNotCount) {
    SampleBlock kernel = block(kAfter);
    kernel.wholeWhenNew = false;
    EXPECT_THAT(difference(samplesOf({}), samplesOf({kernel})), IsEmpty());
}

TEST(SamplesTest, ARestartedPublisherCountsSinceItsRestart) {
    EXPECT_EQ(difference(samplesOf({block(kBefore, 1)}), samplesOf({block(kAfter, 2)})),
              linesOf(samplesOf({block(kAfter)})));
}

TEST(SamplesTest, AChannelWhoseCounterWentBackCountsSinceThenAndNoOther) {
    std::vector<std::uint64_t> words = kAfter;
    words[0] = 4;
    words[4] = 1; // of busy
    EXPECT_THAT(difference(samplesOf({block(kBefore)}), samplesOf({block(words)})),
                ElementsAre("Driver/Speaker/Stats frames: 4", "Driver/Speaker/Stats busy[us]: 0..12 0-10:4 10-20:1",
                            "Driver/Speaker/Stats stream: idle 1x 50, running 0x 40"));
}

TEST(SamplesTest, CountersAreSigned) {
    const auto asWord = [](std::int64_t number) { return static_cast<std::uint64_t>(number); };
    std::vector<std::uint64_t> before = kBefore;
    std::vector<std::uint64_t> after = kBefore;
    before[0] = asWord(-5);
    after[0] = asWord(-2);
    EXPECT_EQ(difference(samplesOf({block(before)}), samplesOf({block(after)}))[0], "Driver/Speaker/Stats frames: 3");
    before[0] = asWord(std::numeric_limits<std::int64_t>::min());
    after[0] = asWord(std::numeric_limits<std::int64_t>::max());
    EXPECT_EQ(difference(samplesOf({block(before)}), samplesOf({block(after)}))[0], "Driver/Speaker/Stats frames: -1")
        << "beyond 64 bits it wraps";
}

TEST(SamplesTest, AnUnreadableChannelHasNoDifference) {
    for (const bool before : {true, false}) {
        SampleBlock unreadable = block(kBefore);
        unreadable.unreadable = {false, true, false};
        const auto lines = before ? difference(samplesOf({unreadable}), samplesOf({block(kAfter)}))
                                  : difference(samplesOf({block(kBefore)}), samplesOf({unreadable}));
        EXPECT_EQ(lines.size(), 2U);
        EXPECT_EQ(lines[0].substr(0, 28), "Driver/Speaker/Stats frames:");
        EXPECT_EQ(lines[1].substr(0, 28), "Driver/Speaker/Stats stream:");
    }
}

TEST(SamplesTest, WhatHadEndedBeforeHasNothingToSay) {
    SampleBlock ended = block(kBefore);
    ended.ended = true;
    EXPECT_THAT(difference(samplesOf({ended}), samplesOf({ended})), IsEmpty());
    EXPECT_EQ(difference(samplesOf({block(kBefore)}), samplesOf({ended})).size(), 3U);
}

TEST(SamplesTest, TheUncountedEndOfADeadPublishersStateIsNoStepBack) {
    std::vector<std::uint64_t> words = kAfter;
    words[6] = 90; // the time since it entered the state, 100 before, is unknown now
    SampleBlock ended = block(words);
    ended.ended = true;
    EXPECT_EQ(difference(samplesOf({block(kBefore)}), samplesOf({ended}))[2],
              "Driver/Speaker/Stats stream: idle 1x 0, running 0x 40");
}

TEST(SamplesTest, ChannelsOfAnotherTableAreFoundByName) {
    BlockBuilder before("cpuidle:", "cpuidle");
    before.state("cpu0", {{"C1", 1, 10}});
    before.state("cpu1", {{"C1", 2, 20}});
    before.state("cpu3", {{"C1", 2, 20}});
    BlockBuilder after("cpuidle:", "cpuidle");
    after.state("cpu1", {{"C1", 5, 50}});
    after.state("cpu2", {{"C1", 9, 90}});
    after.state("cpu3", {{"C1", 2, 20}, {"C2", 2, 20}});
    EXPECT_THAT(
        difference(samplesOf({std::move(before).build("Tarn", {})}), samplesOf({std::move(after).build("Tarn", {})})),
        ElementsAre("cpuidle/Tarn/- cpu1: C1 3x 30"))
        << "cpu2 is new, cpu3 has other states, cpu0 is gone";
}

TEST(SamplesTest, NamesakesAreMatchedInOrder) {
    BlockBuilder before("input:", "input");
    before.simple("pad", "", 1);
    before.simple("pad", "", 10);
    BlockBuilder after("input:", "input");
    after.simple("pad", "", 2);
    after.simple("pad", "", 13);
    after.simple("pad", "", 99);
    EXPECT_THAT(difference(samplesOf({std::move(before).build("g", {})}), samplesOf({std::move(after).build("g", {})})),
                ElementsAre("input/g/- pad: 1", "input/g/- pad: 3"));
}

// --- Suffixes ---

SampleBlock named(const std::string& driver, const std::vector<std::string>& names) {
    BlockBuilder builder("k:" + driver, driver);
    for (const std::string& name : names) {
        builder.simple(name, "", 1);
    }
    return std::move(builder).build("g", {});
}

std::vector<std::string> suffixed(std::vector<SampleBlock> blocks) {
    Samples samples = samplesOf(std::move(blocks));
    addSuffixes(samples);
    std::vector<std::string> names = linesOf(samples);
    for (std::string& name : names) {
        name = name.substr(0, name.find(':'));
    }
    return names;
}

TEST(SuffixesTest, NamesThatDifferStayAsTheyAre) {
    EXPECT_THAT(suffixed({named("d", {"a_b", "ac"}), named("e", {"a_b"})}),
                ElementsAre("d/g/- a_b", "d/g/- ac", "e/g/- a_b"));
}

TEST(SuffixesTest, NamesThatWouldBecomeOneGetNumbers) {
    EXPECT_THAT(suffixed({named("d", {"a_b", "ab", "a b"})}), ElementsAre("d/g/- a_b", "d/g/- ab.2", "d/g/- a b.3"));
}

TEST(SuffixesTest, DriversThatWouldBecomeOneAreToldApartByTheirChannels) {
    EXPECT_THAT(suffixed({named("drv<1>", {"a"}), named("drv<2>", {"a"}), named("d_rv", {"a", "b"})}),
                ElementsAre("drv<1>/g/- a", "drv<2>/g/- a.2", "d_rv/g/- a.3", "d_rv/g/- b"));
}

TEST(SuffixesTest, ANumberThatIsTakenIsPassedOver) {
    EXPECT_THAT(suffixed({named("d", {"a", "a.2", "a_"})}), ElementsAre("d/g/- a", "d/g/- a.2", "d/g/- a_.3"));
}

TEST(SuffixesTest, FormatsHaveNamesOfTheirOwn) {
    BlockBuilder builder("k:", "d");
    builder.simple("a", "", 1);
    builder.state("a", {{"s", 1, 1}});
    EXPECT_THAT(suffixed({std::move(builder).build("g", {})}), ElementsAre("d/g/- a", "d/g/- a"));
}

TEST(SuffixesTest, ThousandsOfNamesakesAreNamedInOneGo) {
    const auto names = suffixed({named("d", std::vector<std::string>(20'000, "a"))});
    EXPECT_EQ(names.back(), "d/g/- a.20000");
}

} // namespace
} // namespace vela::platform::hwstats
