#include "platform/hwstats/ChannelFileReader.h"
#include "platform/hwstats/ChannelTables_test.h"

#include <functional>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::platform::hwstats {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

/// Bytes whose owner changes them between two readings.
class ChangingBytes final : public ByteSource {
public:
    explicit ChangingBytes(std::string bytes) : bytes_(std::move(bytes)) {}

    bool readAt(std::span<char> bytes, std::uint64_t offset) override {
        if (before_) {
            before_(++readings_);
        }
        if (offset > bytes_.size() || bytes.size() > bytes_.size() - offset) {
            return false;
        }
        std::memcpy(bytes.data(), bytes_.data() + offset, bytes.size());
        return true;
    }

    std::string bytes_;
    /// Called before each reading, with its number from 1.
    std::function<void(int)> before_;
    int readings_ = 0;
};

class ChannelFileReaderTest : public ::testing::Test {
protected:
    ChannelFileReaderTest()
        : header_(*readChannelFileHeader(file_, file_.bytes_.size())),
          table_(*readChannelTable(file_, header_)),
          values_(valuesOffset(header_.descriptionBytes)) {}

    /// Offset of a word of a channel's copy 0 or 1, or of its sequence number.
    std::size_t sequenceOf(std::size_t channel) const {
        std::size_t offset = values_;
        for (std::size_t i = 0; i < channel; ++i) {
            offset += blockBytes(table_->channels[i]);
        }
        return offset;
    }
    std::size_t wordOf(std::size_t channel, std::size_t copy, std::size_t word) const {
        return sequenceOf(channel) + 16 + 8 * (copy * fileWords(table_->channels[channel]) + word);
    }
    void put(std::size_t offset, std::uint64_t word) { putAt(file_.bytes_, offset, word); }
    /// What the counter reads as; none where it is unreadable.
    std::optional<std::uint64_t> counter() {
        const auto values = readChannelValues(file_, header_, *table_, 0);
        return values->unreadable.empty() || !values->unreadable[0] ? std::optional(values->words[0]) : std::nullopt;
    }

    ChangingBytes file_{fileOf(exampleTable())};
    const ChannelFileHeader header_;
    const std::shared_ptr<const ChannelTable> table_;
    const std::size_t values_;
};

TEST_F(ChannelFileReaderTest, TheTableIsReadBack) {
    EXPECT_EQ(*table_, exampleTable());
    EXPECT_EQ(header_.generation, 77U);
    EXPECT_EQ(header_.pid, 12);
}

TEST_F(ChannelFileReaderTest, AnEvenNumberMeansTheFirstCopyAndAnOddOneTheSecond) {
    put(wordOf(0, 0, 0), 5);
    put(wordOf(0, 1, 0), 6);
    put(sequenceOf(0), 2);
    EXPECT_EQ(counter(), 5U);
    put(sequenceOf(0), 3);
    EXPECT_EQ(counter(), 6U) << "its publisher stopped in the midst of an update: nothing is lost";
}

TEST_F(ChannelFileReaderTest, AllFormatsAreCopied) {
    put(wordOf(0, 0, 0), 1);
    for (std::size_t word = 0; word < 4; ++word) {
        put(wordOf(1, 0, word), 10 + word);
    }
    for (std::size_t word = 0; word < 6; ++word) {
        put(wordOf(2, 0, word), 20 + word);
    }
    const auto values = readChannelValues(file_, header_, *table_, 0);
    EXPECT_THAT(values->words, ElementsAre(1, 10, 11, 12, 13, 22, 23, 24, 25));
    EXPECT_THAT(values->unreadable, IsEmpty());
}

TEST_F(ChannelFileReaderTest, TheTimeInThePresentStateIsAdded) {
    put(wordOf(2, 0, 0), 1); // running
    put(wordOf(2, 0, 1), 1'000);
    put(wordOf(2, 0, 5), 7);
    const auto residency = [&](std::uint64_t now) { return readChannelValues(file_, header_, *table_, now)->words[8]; };
    EXPECT_EQ(residency(1'500), 507U);
    EXPECT_EQ(residency(900), 7U) << "entered after the reading began";
    EXPECT_EQ(residency(0), 7U) << "the publisher is gone";
    put(wordOf(2, 0, 0), kNoState);
    EXPECT_EQ(residency(1'500), 7U);
    put(wordOf(2, 0, 0), 2);
    EXPECT_EQ(residency(1'500), 7U) << "no such state";
}

TEST_F(ChannelFileReaderTest, AnUpdateDuringTheReadingIsReadAnew) {
    put(wordOf(0, 0, 0), 5);
    file_.before_ = [this](int reading) {
        if (reading == 2) { // between the numbers and the values
            put(wordOf(0, 0, 0), 6);
            put(wordOf(0, 1, 0), 6);
            put(sequenceOf(0), 2);
        }
    };
    EXPECT_EQ(counter(), 6U);
    EXPECT_EQ(file_.readings_, 6) << "three for all, three for the one that changed";
}

TEST_F(ChannelFileReaderTest, AnUpdateAfterTheValuesWereReadIsReadAnew) {
    put(wordOf(0, 0, 0), 5);
    file_.before_ = [this](int reading) {
        if (reading == 3) {
            put(sequenceOf(0), 1);
            put(wordOf(0, 0, 0), 6);
        }
    };
    EXPECT_EQ(counter(), 0U) << "the second copy, which stands still meanwhile";
}

TEST_F(ChannelFileReaderTest, AChannelThatAlwaysChangesIsUnreadableAfterABoundedNumberOfAttempts) {
    file_.before_ = [this](int reading) { put(sequenceOf(0), static_cast<std::uint64_t>(reading) * 2); };
    EXPECT_EQ(counter(), std::nullopt);
    EXPECT_EQ(file_.readings_, 3 + 32 * 3);
    put(wordOf(1, 0, 2), 9);
    EXPECT_EQ(readChannelValues(file_, header_, *table_, 0)->words[3], 9U) << "the others are read";
}

TEST_F(ChannelFileReaderTest, AFileThatShrinksIsAFailureAtAnyReading) {
    const std::string whole = file_.bytes_;
    for (int cut = 1; cut <= 6; ++cut) {
        file_.bytes_ = whole;
        file_.readings_ = 0;
        file_.before_ = [this, cut](int reading) {
            if (reading <= 3) {
                put(sequenceOf(0), static_cast<std::uint64_t>(reading) * 2); // so that there are six
            }
            if (reading == cut) {
                file_.bytes_.resize(10);
            }
        };
        const auto values = readChannelValues(file_, header_, *table_, 0);
        ASSERT_FALSE(static_cast<bool>(values)) << cut;
        EXPECT_EQ(values.failure().description, "it became shorter while it was read");
        file_.before_ = {};
    }
}

TEST_F(ChannelFileReaderTest, ShortFilesAreRefused) {
    ChangingBytes empty("");
    EXPECT_EQ(readChannelFileHeader(empty, 0).failure().description, "it is shorter than a header");
    ChangingBytes cut(file_.bytes_.substr(0, 100));
    EXPECT_EQ(readChannelFileHeader(cut, 100).failure().description, "it is shorter than it says");
    EXPECT_EQ(readChannelTable(cut, header_).failure().description, "it became shorter while it was read");
}

TEST_F(ChannelFileReaderTest, ASizeOtherThanThatOfTheChannelsIsRefused) {
    ChannelFileHeader header = header_;
    header.fileBytes -= 1;
    EXPECT_EQ(readChannelTable(file_, header).failure().description, "its size is not that of its channels");
}

TEST_F(ChannelFileReaderTest, AbsurdValuesOverflowNothing) {
    for (std::size_t offset = values_; offset < file_.bytes_.size(); offset += 8) {
        put(offset, ~std::uint64_t{0});
    }
    put(wordOf(2, 1, 0), 0);
    put(wordOf(2, 1, 1), 1);
    EXPECT_TRUE(static_cast<bool>(readChannelValues(file_, header_, *table_, ~std::uint64_t{0})));
}

} // namespace
} // namespace vela::platform::hwstats
