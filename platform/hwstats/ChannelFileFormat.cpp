#include "platform/hwstats/ChannelFileFormat.h"

#include "common/values/Utf8.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

namespace vela::platform::hwstats {

namespace {

constexpr std::uint16_t kAbsentText = 0xFFFF;

Failure refused(std::string reason) { return {EINVAL, std::move(reason)}; }

/// Texts become parts of keys and lines of logs.
bool isText(std::string_view text) {
    const auto isControl = [](char character) {
        return static_cast<unsigned char>(character) < ' ' || character == '\x7F';
    };
    return text.size() <= kMostTextBytes && std::ranges::none_of(text, isControl) && isValidUtf8(text);
}

bool isRising(const std::vector<std::int64_t>& bounds) {
    return std::ranges::adjacent_find(bounds, std::ranges::greater_equal()) == bounds.end();
}

/// Why a channel cannot be, or "".
std::string faultOf(const ChannelDescription& channel) {
    if (channel.name.empty() || !isText(channel.name) || (channel.unit && !isText(*channel.unit))) {
        return "a channel's name or unit is empty, too long or no text";
    }
    const std::size_t parts = channel.parts();
    switch (channel.format) {
    case HwStatsFormat::Simple:
        return channel.bounds.empty() && channel.states.empty() ? "" : "a counter has neither buckets nor states";
    case HwStatsFormat::Histogram:
        if (!channel.states.empty() || parts == 0 || parts > kMostParts || !isRising(channel.bounds)) {
            return "a histogram has 1 to " + std::to_string(kMostParts) + " buckets with rising bounds";
        }
        return "";
    case HwStatsFormat::State:
        if (!channel.bounds.empty() || parts == 0 || parts > kMostParts ||
            !std::ranges::all_of(channel.states, [](const auto& name) { return !name.empty() && isText(name); })) {
            return "a state channel has 1 to " + std::to_string(kMostParts) + " states with names";
        }
        return "";
    default:
        return "a channel is of no known format or has parts that do not suit it";
    }
}

/// Why the table, its channels apart, cannot be, or "".
std::string faultOfNames(const ChannelTable& table) {
    for (const auto* text : {&table.driverName, &table.group, &table.subGroup}) {
        if (*text && (text->value().empty() || !isText(**text))) {
            return "the driver's name or a group is empty, too long or no text";
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

    std::size_t rest() const { return rest_.size(); }
    bool failed() const { return failed_; }

private:
    std::string_view take(std::size_t size) {
        if (failed_ || size > rest_.size()) {
            failed_ = true;
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
    if (channel.format == HwStatsFormat::Histogram && (parts + 1) * sizeof(std::int64_t) <= cursor.rest()) {
        channel.bounds.resize(parts + 1);
        for (std::int64_t& bound : channel.bounds) {
            bound = cursor.number<std::int64_t>();
        }
    }
    if (channel.format == HwStatsFormat::State && parts * sizeof(std::uint16_t) <= cursor.rest()) {
        channel.states.resize(parts);
        for (std::string& state : channel.states) {
            state = cursor.text();
        }
    }
    if (channel.parts() != parts) {
        channel.format = HwStatsFormat::None; // parts that its format does not have, or that are not there
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
    for (std::uint32_t i = 0; i < channelCount && !cursor.failed(); ++i) {
        table->channels.push_back(takeChannel(cursor));
        if (std::string fault = faultOf(table->channels.back()); !fault.empty()) {
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
