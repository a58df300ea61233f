#include "platform/hwstats/ChannelFileFormat.h"

#include "common/values/Utf8.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <utility>

namespace vela::platform::hwstats {

namespace {

constexpr std::uint16_t kAbsentText = 0xFFFF;
/// A counter with a name of one letter.
constexpr std::size_t kLeastChannelBytes = 8;

Failure refused(std::string reason) { return {EINVAL, std::move(reason)}; }

/// Why a text cannot be, or "". Texts become parts of keys and lines of logs.
std::string faultOfText(const std::string& what, std::string_view text) {
    const auto isControl = [](char character) {
        return static_cast<unsigned char>(character) < ' ' || character == '\x7F';
    };
    if (text.size() > kMostTextBytes) {
        return what + " has " + std::to_string(text.size()) + " bytes, more than " + std::to_string(kMostTextBytes);
    }
    if (std::ranges::any_of(text, isControl)) {
        return what + " has control characters";
    }
    return isValidUtf8(text) ? "" : what + " is no UTF-8";
}

std::string faultOfName(const std::string& what, std::string_view name) {
    return name.empty() ? what + " is empty" : faultOfText(what, name);
}

bool isRising(const std::vector<std::int64_t>& bounds) {
    return std::ranges::adjacent_find(bounds, std::ranges::greater_equal()) == bounds.end();
}

std::string faultOfStates(const std::vector<std::string>& states) {
    if (states.empty() || states.size() > kMostParts) {
        return "a state channel has 1 to " + std::to_string(kMostParts) + " states";
    }
    for (const std::string& state : states) {
        if (std::string fault = faultOfName("a state's name", state); !fault.empty()) {
            return fault;
        }
    }
    return "";
}

/// Why a channel cannot be, or "".
std::string faultOf(const ChannelDescription& channel) {
    if (std::string fault = faultOfName("a channel's name", channel.name); !fault.empty()) {
        return fault;
    }
    if (std::string fault = faultOfText("a channel's unit", channel.unit.value_or("")); !fault.empty()) {
        return fault;
    }
    const std::size_t parts = channel.parts();
    if (channel.format == HwStatsFormat::Simple) {
        return channel.bounds.empty() && channel.states.empty() ? "" : "a counter has neither buckets nor states";
    }
    if (channel.format == HwStatsFormat::Histogram && channel.states.empty()) {
        const bool isRight = parts > 0 && parts <= kMostParts && isRising(channel.bounds);
        return isRight ? "" : "a histogram has 1 to " + std::to_string(kMostParts) + " buckets with rising bounds";
    }
    if (channel.format == HwStatsFormat::State && channel.bounds.empty()) {
        return faultOfStates(channel.states);
    }
    return "a channel is of no known format or has parts that do not suit it";
}

/// Why the table, its channels apart, cannot be, or "".
std::string faultOfNames(const ChannelTable& table) {
    const std::array<std::pair<const char*, const std::optional<std::string>&>, 3> names{
        {{"the driver's name", table.driverName}, {"the group", table.group}, {"the subgroup", table.subGroup}}};
    for (const auto& [what, name] : names) {
        if (std::string fault = name ? faultOfName(what, *name) : ""; !fault.empty()) {
            return fault;
        }
    }
    if (table.channels.empty() || table.channels.size() > kMostFileChannels) {
        return "a driver has 1 to " + std::to_string(kMostFileChannels) + " channels";
    }
    return "";
}

std::string faultOf(const ChannelTable& table) {
    if (std::string fault = faultOfNames(table); !fault.empty()) {
        return fault;
    }
    for (const ChannelDescription& channel : table.channels) {
        if (std::string fault = faultOf(channel); !fault.empty()) {
            return fault;
        }
    }
    return "";
}

template <class Number>
void put(std::string& bytes, Number number) {
    const std::size_t before = bytes.size();
    bytes.resize(before + sizeof(number));
    std::memcpy(bytes.data() + before, &number, sizeof(number));
}

void putText(std::string& bytes, const std::optional<std::string>& text) {
    put(bytes, text ? static_cast<std::uint16_t>(text->size()) : kAbsentText);
    bytes += text.value_or("");
}

/// Takes values off the front of a description. Once something is missing, it answers zeros and empty texts.
class Cursor {
public:
    explicit Cursor(std::string_view bytes) : rest_(bytes) {}

    template <class Number>
    Number number() {
        Number number = 0;
        if (const std::string_view bytes = take(sizeof(number)); !bytes.empty()) {
            std::memcpy(&number, bytes.data(), bytes.size());
        }
        return number;
    }
    std::optional<std::string> optionalText() {
        const auto size = number<std::uint16_t>();
        return size == kAbsentText ? std::nullopt : std::optional(std::string(take(size)));
    }
    std::string text() { return optionalText().value_or(""); }

    /// Whether that many bytes are left. If not, they are missing.
    bool offers(std::size_t bytes) {
        failed_ = failed_ || bytes > rest_.size();
        return !failed_;
    }
    std::size_t rest() const { return rest_.size(); }
    bool failed() const { return failed_; }

private:
    std::string_view take(std::size_t size) {
        if (!offers(size)) {
            return {};
        }
        const std::string_view taken = rest_.substr(0, size);
        rest_.remove_prefix(size);
        return taken;
    }

    std::string_view rest_;
    bool failed_ = false;
};

ChannelDescription takeChannel(Cursor& cursor) {
    ChannelDescription channel;
    channel.format = static_cast<HwStatsFormat>(cursor.number<std::uint8_t>());
    channel.name = cursor.text();
    channel.unit = cursor.optionalText();
    const std::size_t parts = cursor.number<std::uint16_t>();
    if (channel.format == HwStatsFormat::Histogram && cursor.offers((parts + 1) * sizeof(std::int64_t))) {
        channel.bounds.resize(parts + 1);
        for (std::int64_t& bound : channel.bounds) {
            bound = cursor.number<std::int64_t>();
        }
    }
    if (channel.format == HwStatsFormat::State && cursor.offers(parts * sizeof(std::uint16_t))) {
        channel.states.resize(parts);
        for (std::string& state : channel.states) {
            state = cursor.text();
        }
    }
    if (channel.parts() != parts) {
        channel.format = HwStatsFormat::None; // parts that its format does not have
    }
    return channel;
}

} // namespace

std::size_t valuesBytes(const ChannelTable& table) {
    std::size_t bytes = 0;
    for (const ChannelDescription& channel : table.channels) {
        bytes += blockBytes(channel);
    }
    return bytes;
}

Result<std::string> encodeDescription(const ChannelTable& table) {
    if (std::string fault = faultOf(table); !fault.empty()) {
        return refused(std::move(fault));
    }
    std::string bytes;
    putText(bytes, table.driverName);
    putText(bytes, table.group);
    putText(bytes, table.subGroup);
    for (const ChannelDescription& channel : table.channels) {
        put(bytes, static_cast<std::uint8_t>(channel.format));
        putText(bytes, channel.name);
        putText(bytes, channel.unit);
        put(bytes, static_cast<std::uint16_t>(channel.parts()));
        for (const std::int64_t bound : channel.bounds) {
            put(bytes, bound);
        }
        for (const std::string& state : channel.states) {
            putText(bytes, state);
        }
    }
    if (valuesOffset(bytes.size()) + valuesBytes(table) > kMostFileBytes) {
        return refused("the channels need more than " + std::to_string(kMostFileBytes) + " bytes");
    }
    return bytes;
}

Result<std::shared_ptr<const ChannelTable>> decodeDescription(std::string_view description,
                                                              std::uint32_t channelCount) {
    Cursor cursor(description);
    auto table = std::make_shared<ChannelTable>();
    table->driverName = cursor.optionalText();
    table->group = cursor.optionalText();
    table->subGroup = cursor.optionalText();
    table->channels.reserve(std::min<std::size_t>(channelCount, description.size() / kLeastChannelBytes));
    for (std::uint32_t i = 0; i < channelCount && !cursor.failed(); ++i) {
        const ChannelDescription& channel = table->channels.emplace_back(takeChannel(cursor));
        if (std::string fault = cursor.failed() ? "" : faultOf(channel); !fault.empty()) {
            return refused("channel " + std::to_string(i) + ": " + fault);
        }
    }
    if (cursor.failed() || cursor.rest() != 0) {
        return refused(cursor.failed() ? "its description ends too early" : "its description is too long");
    }
    if (std::string fault = faultOfNames(*table); !fault.empty()) {
        return refused(std::move(fault));
    }
    return std::shared_ptr<const ChannelTable>(std::move(table));
}

Result<Done> checkHeader(const ChannelFileHeader& header, std::uint64_t fileBytes) {
    if (header.magic != kChannelFileMagic) {
        return refused("it is no channel file");
    }
    if (header.byteOrder != kChannelFileByteOrder) {
        return refused("it comes from a machine of another byte order");
    }
    if (header.version != kChannelFileVersion) {
        return refused("its version is " + std::to_string(header.version) + ", not " +
                       std::to_string(kChannelFileVersion));
    }
    if (header.fileBytes > kMostFileBytes) {
        return refused("it is larger than " + std::to_string(kMostFileBytes) + " bytes");
    }
    if (header.fileBytes > fileBytes) {
        return refused("it is shorter than it says");
    }
    if (header.channelCount == 0 || header.channelCount > kMostFileChannels) {
        return refused("it has " + std::to_string(header.channelCount) + " channels, not 1 to " +
                       std::to_string(kMostFileChannels));
    }
    if (valuesOffset(header.descriptionBytes) >= header.fileBytes) {
        return refused("its description leaves no room for values");
    }
    return Done();
}

} // namespace vela::platform::hwstats
