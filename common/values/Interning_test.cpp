#include "common/values/Dictionary.h"
#include "common/values/Key.h"

#include <cstdint>
#include <gtest/gtest.h>
#include <string>
#include <thread>
#include <vector>

namespace vela {

namespace {

TEST(KeyTest, EqualTextsAreTheSameObject) {
    const Key first("audiotag");
    const Key second(std::string("audio") + "tag");
    EXPECT_EQ(first.object(), second.object());
    EXPECT_EQ(first, second);
    EXPECT_FALSE(first == Key("audiotags"));
    EXPECT_EQ(first.text(), "audiotag");
}

TEST(KeyTest, HoldsAnyBytes) {
    const std::string odd("a\0b\xFF", 4);
    EXPECT_EQ(Key(odd).text(), odd);
    EXPECT_EQ(Key("").text(), "");
}

TEST(KeyTest, IsTheSameObjectInEveryThread) {
    const Key here("a key of several threads");
    const detail::KeyObject* there = nullptr;
    std::thread([&there] { there = Key("a key of several threads").object(); }).join();
    EXPECT_EQ(here.object(), there);
}

TEST(InterningTest, KeysThatNobodyUsesDoNotPileUp) {
    for (int index = 0; index < 200000; ++index) {
        const Dictionary dictionary = {{"invented " + std::to_string(index), index}};
        EXPECT_EQ(dictionary.size(), 1U);
    }
    // The tables are swept when they have doubled; what the caches of this thread hold comes on top.
    EXPECT_LT(internedCounts().keys, 10000U);
    EXPECT_LT(internedCounts().shapes, 10000U);
}

// The tables are swept when they have grown by 4 MiB; what the caches of this thread hold comes on top.
constexpr std::uint64_t kMostBytes = std::uint64_t{16} * 1024 * 1024;

TEST(InterningTest, LargeKeysThatNobodyUsesDoNotPileUp) {
    std::string key(std::size_t{1024} * 1024, 'k');
    for (int index = 0; index < 100; ++index) {
        key.replace(0, 3, std::to_string(100 + index));
        const Dictionary dictionary = {{key, index}};
        EXPECT_EQ(dictionary.setting(Key("other"), 1).removing(Key("other")), dictionary);
    }
    EXPECT_LT(internedCounts().bytes, kMostBytes);
}

TEST(InterningTest, ManyKeysOfOneDictionaryThatNobodyUsesDoNotPileUp) {
    for (int index = 0; index < 100; ++index) {
        DictionaryBuilder builder;
        for (int key = 0; key < 5'000; ++key) {
            builder.add("invented " + std::to_string(index) + " and " + std::to_string(key), key);
        }
        EXPECT_EQ(builder.build().size(), 5'000U);
    }
    EXPECT_LT(internedCounts().bytes, kMostBytes);
}

TEST(InterningTest, KeysInUseSurviveTheSweeps) {
    const Key kept("kept key");
    const Dictionary message = {{"kept key", 1}, {"kept too", 2}};
    for (int index = 0; index < 50000; ++index) {
        const Key passing("passing " + std::to_string(index));
        EXPECT_NE(passing.object(), kept.object());
    }
    EXPECT_EQ(Key("kept key").object(), kept.object());
    EXPECT_EQ(message.find("kept too").integer(), 2);
    EXPECT_TRUE(message.hasSameKeysInOrder({{"kept key", 3}, {"kept too", 4}}));
}

TEST(InterningTest, ThreadsThatInventKeysAgreeOnThem) {
    constexpr int kThreads = 4;
    constexpr int kKeys = 20000;
    std::vector<std::vector<Dictionary>> made(kThreads);
    std::vector<std::thread> threads;
    threads.reserve(kThreads);
    for (std::vector<Dictionary>& mine : made) {
        threads.emplace_back([&mine] {
            for (int index = 0; index < kKeys; ++index) {
                const std::string name = std::to_string(index % 5000);
                DictionaryBuilder builder;
                builder.add("first " + name, index);
                builder.add("second " + name, "text");
                Dictionary message = builder.build().setting(Key("audiotag"), "x").replacingSpacesInKeys();
                if (index % 100 == 0) {
                    mine.push_back(message.removing(Key("audiotag")));
                }
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    for (const std::vector<Dictionary>& mine : made) {
        ASSERT_EQ(mine.size(), made[0].size());
        for (std::size_t index = 0; index < mine.size(); ++index) {
            EXPECT_EQ(mine[index], made[0][index]);
            EXPECT_TRUE(mine[index].hasSameKeysInOrder(made[0][index]));
        }
    }
}

TEST(InterningTest, ADictionaryMayBeDestroyedByAnotherThread) {
    for (int round = 0; round < 1000; ++round) {
        Dictionary shared = {{"text " + std::to_string(round), "a text that two threads hold"}};
        std::thread other([copy = shared] { EXPECT_EQ(copy.size(), 1U); });
        shared = Dictionary();
        other.join();
    }
}

} // namespace

} // namespace vela
