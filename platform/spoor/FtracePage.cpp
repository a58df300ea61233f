#include "platform/spoor/FtracePage.h"

#include <algorithm>
#include <bit>
#include <charconv>
#include <cstring>

namespace vela::platform::spoor {

namespace {

// The first word of an event: 5 bits of kind, 27 bits of time since the event before, the kind in the lower bits on
// machines that store the lower byte first.
//
//     1 to 28  an event of 4 * kind bytes
//     0        an event whose size in bytes, this word's included, stands in the next word
//     29       nothing: without a time to the page's end, else as many bytes as the next word says
//     30       time only: the next word has its bits from 27 on
//     31       a time since the clock's begin: 27 bits here, 32 in the next word, the rest as before
constexpr std::uint32_t kKindBits = 5;
constexpr std::uint32_t kTimeBits = 27;
constexpr std::uint32_t kLargestInPlace = 28;
constexpr std::uint32_t kPadding = 29;
constexpr std::uint32_t kTimeExtend = 30;
constexpr std::uint32_t kTimeStamp = 31;
constexpr std::uint64_t kTimeStampMask = (std::uint64_t{1} << 59U) - 1;

// A page's word of size and flags.
constexpr std::uint64_t kSizeMask = 0xFFFFF;
constexpr std::uint64_t kMissedEvents = std::uint64_t{1} << 31U;
constexpr std::uint64_t kMissedStored = std::uint64_t{1} << 30U;

/// Fields beyond this are none of a page's head or of an event's.
constexpr std::size_t kLargestOffset = 256;

template <class Word>
Word wordAt(std::span<const char> bytes, std::size_t offset) {
    Word word{};
    std::memcpy(&word, bytes.data() + offset, sizeof(word));
    return word;
}

struct EventHead {
    std::uint32_t kind;
    std::uint32_t time;
};

EventHead headOf(std::uint32_t word) {
    if constexpr (std::endian::native == std::endian::little) {
        return {word & ((1U << kKindBits) - 1), word >> kKindBits};
    } else {
        return {word >> kTimeBits, word & ((1U << kTimeBits) - 1)};
    }
}

/// The number behind `name` in `text`: "offset:" and then "8;".
std::optional<std::size_t> numberBehind(std::string_view text, std::string_view name) {
    const std::size_t place = text.find(name);
    if (place == std::string_view::npos) {
        return std::nullopt;
    }
    text.remove_prefix(place + name.size());
    text.remove_prefix(std::min(text.size(), text.find_first_not_of(" \t")));
    std::size_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    return error == std::errc() && number <= (1U << 16U) ? std::optional(number) : std::nullopt;
}

/// The line of the field `name`: its type and its name are between "field:" and the first semicolon.
std::string_view lineOf(std::string_view text, std::string_view name) {
    for (std::size_t begin = 0; begin < text.size();) {
        const std::size_t end = std::min(text.find('\n', begin), text.size());
        const std::string_view line = text.substr(begin, end - begin);
        const std::string_view declared = line.substr(0, line.find(';'));
        if (declared.find("field:") != std::string_view::npos && declared.ends_with(name)) {
            return line;
        }
        begin = end + 1;
    }
    return {};
}

bool readOffset(std::string_view text, std::string_view field, std::size_t& offset) {
    const auto found = numberBehind(lineOf(text, field), "offset:");
    if (!found || *found > kLargestOffset) {
        return false;
    }
    offset = *found;
    return true;
}

/// Walks the events of one page.
class PageWalk {
public:
    PageWalk(std::span<const char> events, std::uint64_t time, const FtraceLayout& layout, std::uint32_t cpu,
             std::vector<TraceRecord>& records)
        : events_(events),
          time_(time),
          layout_(layout),
          cpu_(cpu),
          records_(records) {}

    void walk() {
        while (events_.size() - place_ >= kWord && step()) {
        }
    }

private:
    static constexpr std::size_t kWord = sizeof(std::uint32_t);

    /// Takes one event. False at the end, and where the bytes make no sense.
    bool step() {
        const EventHead head = headOf(wordAt<std::uint32_t>(events_, place_));
        place_ += kWord;
        if (head.kind == kPadding && head.time == 0) {
            return false;
        }
        if (head.kind >= 1 && head.kind <= kLargestInPlace) {
            time_ += head.time;
            return take(head.kind * kWord);
        }
        if (events_.size() - place_ < kWord) {
            return false;
        }
        const auto next = wordAt<std::uint32_t>(events_, place_);
        switch (head.kind) {
        case kTimeExtend:
            time_ += head.time + (std::uint64_t{next} << kTimeBits);
            place_ += kWord;
            return true;
        case kTimeStamp:
            time_ = (time_ & ~kTimeStampMask) | ((head.time + (std::uint64_t{next} << kTimeBits)) & kTimeStampMask);
            place_ += kWord;
            return true;
        case kPadding:
            time_ += head.time;
            return skip(next);
        default: // the size counts its own word
            time_ += head.time;
            place_ += kWord;
            return next >= kWord && take(next - kWord);
        }
    }

    bool skip(std::size_t bytes) {
        if (bytes == 0 || bytes > events_.size() - place_) {
            return false;
        }
        place_ += bytes;
        return true;
    }

    bool take(std::size_t bytes) {
        const std::size_t aligned = (bytes + kWord - 1) / kWord * kWord;
        if (bytes == 0 || aligned > events_.size() - place_) {
            return false;
        }
        readEvent(events_.subspan(place_, bytes));
        place_ += aligned;
        return true;
    }

    void readEvent(std::span<const char> event) {
        constexpr std::size_t kPayload = sizeof(MarkerEvent) - sizeof(MarkerEvent::code);
        if (event.size() < layout_.payloadOffset + kPayload || event.size() < layout_.codeOffset + kWord ||
            event.size() < layout_.threadOffset + kWord || wordAt<std::uint16_t>(event, 0) != layout_.eventID) {
            return;
        }
        const auto wordsAndPid = wordAt<std::uint32_t>(event, layout_.payloadOffset);
        TraceRecord record{time_, wordAt<std::uint32_t>(event, layout_.codeOffset),
                           cpu_,  wordAt<std::uint32_t>(event, layout_.threadOffset),
                           {},    static_cast<std::int32_t>(wordsAndPid >> kBitsOfCount)};
        if ((wordsAndPid & ((1U << kBitsOfCount) - 1)) != record.arguments.size()) {
            return; // somebody else's marker
        }
        std::memcpy(record.arguments.data(), event.data() + layout_.payloadOffset + kWord, sizeof(record.arguments));
        records_.push_back(record);
    }

    const std::span<const char> events_;
    std::size_t place_ = 0;
    std::uint64_t time_;
    const FtraceLayout& layout_;
    const std::uint32_t cpu_;
    std::vector<TraceRecord>& records_;
};

} // namespace

std::optional<FtraceLayout> parseFtraceLayout(std::string_view headerPage, std::string_view rawDataFormat) {
    FtraceLayout layout;
    const auto eventID = numberBehind(rawDataFormat, "ID:");
    const auto commitBytes = numberBehind(lineOf(headerPage, " commit"), "size:");
    if (!eventID || *eventID > UINT16_MAX || !commitBytes || (*commitBytes != 4 && *commitBytes != 8) ||
        !readOffset(headerPage, " commit", layout.commitOffset) ||
        !readOffset(headerPage, " data", layout.dataOffset) ||
        !readOffset(rawDataFormat, " common_pid", layout.threadOffset) ||
        !readOffset(rawDataFormat, " id", layout.codeOffset) ||
        !readOffset(rawDataFormat, " buf[]", layout.payloadOffset)) {
        return std::nullopt;
    }
    layout.eventID = static_cast<std::uint16_t>(*eventID);
    layout.commitBytes = *commitBytes;
    const bool isSound =
        layout.commitOffset >= sizeof(std::uint64_t) && layout.commitOffset + layout.commitBytes <= layout.dataOffset;
    return isSound ? std::optional(layout) : std::nullopt;
}

std::uint64_t parseFtracePage(std::span<const char> page, const FtraceLayout& layout, std::uint32_t cpu,
                              std::vector<TraceRecord>& records) {
    if (page.size() < layout.dataOffset || page.size() < layout.commitOffset + layout.commitBytes ||
        page.size() < sizeof(std::uint64_t)) {
        return 0;
    }
    const std::uint64_t commit = layout.commitBytes == sizeof(std::uint64_t)
                                     ? wordAt<std::uint64_t>(page, layout.commitOffset)
                                     : wordAt<std::uint32_t>(page, layout.commitOffset);
    const std::span<const char> data = page.subspan(layout.dataOffset);
    const std::size_t bytes = std::min(data.size(), static_cast<std::size_t>(commit & kSizeMask));
    PageWalk(data.first(bytes), wordAt<std::uint64_t>(page, 0), layout, cpu, records).walk();
    if ((commit & kMissedEvents) == 0) {
        return 0;
    }
    if ((commit & kMissedStored) == 0 || data.size() - bytes < layout.commitBytes) {
        return 1;
    }
    return layout.commitBytes == sizeof(std::uint64_t) ? wordAt<std::uint64_t>(data, bytes)
                                                       : wordAt<std::uint32_t>(data, bytes);
}

} // namespace vela::platform::spoor
