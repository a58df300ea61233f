// The C API of channels over the publisher of channel files. No exception leaves it.
#include "client/include/vela/channels.h"

#include "client/CallerStructs.h"
#include "platform/hwstats/ChannelFileNames.h"
#include "platform/hwstats/ChannelPublisher.h"

#include <cerrno>
#include <cstdlib>
#include <memory>
#include <optional>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

using vela::client::copyIn;
using vela::client::copyOut;
using vela::client::copyText;
using vela::platform::HwStatsFormat;
using vela::platform::hwstats::ChannelDescription;
using vela::platform::hwstats::ChannelPublisher;
using vela::platform::hwstats::ChannelTable;
using vela::platform::hwstats::kMostFileChannels;
using vela::platform::hwstats::kMostParts;
using vela::platform::hwstats::kNoState;
using vela::platform::hwstats::PublishedChannel;

static_assert(VELA_REPORTING_NO_STATE == kNoState);

struct VelaReportingChannel {
    PublishedChannel channel;
};

struct VelaReportingChannels {
    std::unique_ptr<ChannelPublisher> publisher;
    /// Copies of the publisher's: where their values stand is the same.
    std::vector<VelaReportingChannel> channels;
};

namespace {

VelaReportingStatus refuse(VelaReportingStatus status, const std::string& text, VelaReportingError* error) {
    if (error != nullptr) {
        VelaReportingError full{};
        copyText(text, full.text);
        copyOut(full, error);
    }
    return status;
}

std::optional<std::string> optionalText(const char* text) {
    return text == nullptr ? std::nullopt : std::optional<std::string>(text);
}

/// The description that a definition gives; what cannot be is left to the publisher to say. None where there are
/// pointers missing, or numbers that no pointer could stand for.
std::optional<ChannelDescription> descriptionOf(const VelaReportingChannelDefinition& definition) {
    if (definition.name == nullptr || (definition.bounds == nullptr && definition.boundCount != 0) ||
        (definition.states == nullptr && definition.stateCount != 0) || definition.boundCount > kMostParts + 1 ||
        definition.stateCount > kMostParts || definition.format > VelaReportingChannelFormatHistogram) {
        return std::nullopt;
    }
    static_assert(static_cast<int>(HwStatsFormat::Simple) == VelaReportingChannelFormatCounter &&
                  static_cast<int>(HwStatsFormat::State) == VelaReportingChannelFormatState &&
                  static_cast<int>(HwStatsFormat::Histogram) == VelaReportingChannelFormatHistogram);
    ChannelDescription description{
        static_cast<HwStatsFormat>(definition.format), definition.name, optionalText(definition.unit), {}, {}};
    if (definition.boundCount != 0) {
        description.bounds.assign(definition.bounds, definition.bounds + definition.boundCount);
    }
    for (std::size_t i = 0; i < definition.stateCount; ++i) {
        if (definition.states[i] == nullptr) {
            return std::nullopt;
        }
        description.states.emplace_back(definition.states[i]);
    }
    return description;
}

/// The table of all definitions, which stand `definitions->size` bytes apart.
std::optional<ChannelTable> tableOf(const VelaReportingChannelsOptions& options,
                                    const VelaReportingChannelDefinition* definitions, std::size_t count) {
    ChannelTable table{optionalText(options.driver), optionalText(options.group), optionalText(options.subGroup), {}};
    if (!table.driverName || (!table.group && !table.subGroup) || definitions == nullptr || count > kMostFileChannels) {
        return std::nullopt;
    }
    const std::size_t distance = definitions->size;
    for (std::size_t i = 0; i < count; ++i) {
        const auto* const bytes = reinterpret_cast<const unsigned char*>(definitions) + i * distance;
        const void* const place = bytes;
        const auto* const given = static_cast<const VelaReportingChannelDefinition*>(place);
        VelaReportingChannelDefinition definition{};
        if (given->size != distance || !copyIn(given, definition)) {
            return std::nullopt;
        }
        std::optional<ChannelDescription> description = descriptionOf(definition);
        if (!description) {
            return std::nullopt;
        }
        table.channels.push_back(std::move(*description));
    }
    return table;
}

/// Programs with more rights than their users publish in the system's folder only.
std::string folderOf(const VelaReportingChannelsOptions& options) {
    if (options.folder != nullptr) {
        return options.folder;
    }
    const auto variable = [](const char* name) {
        const char* const value = secure_getenv(name); // NOLINT(concurrency-mt-unsafe): as every library
        return std::string(value != nullptr ? value : "");
    };
    vela::platform::hwstats::PublisherEnvironment environment;
    environment.velaRuntime = variable("VELA_RUNTIME");
    environment.runtimeHome = variable("XDG_RUNTIME_DIR");
    return vela::platform::hwstats::makeChannelFolder(environment);
}

} // namespace

extern "C" {

VelaReportingStatus VelaReportingChannelsCreate(const VelaReportingChannelsOptions* options,
                                                const VelaReportingChannelDefinition* definitions, size_t count,
                                                VelaReportingChannels** channels, VelaReportingError* error) noexcept
    try {
    if (channels != nullptr) {
        *channels = nullptr;
    }
    VelaReportingChannelsOptions known{};
    if (options == nullptr || channels == nullptr || !copyIn(options, known)) {
        return refuse(VelaReportingStatusInvalidArgument, "options or channels are missing", error);
    }
    const std::optional<ChannelTable> table = tableOf(known, definitions, count);
    if (!table) {
        return refuse(VelaReportingStatusInvalidArgument,
                      "a driver, a group, a definition or something in one is missing, or there are too many", error);
    }
    const std::string folder = folderOf(known);
    if (folder.empty()) {
        const std::string reason = std::generic_category().message(errno);
        return refuse(VelaReportingStatusNoResources, "no folder to publish in: " + reason, error);
    }
    auto publisher = ChannelPublisher::create(
        folder, known.publisher != nullptr ? known.publisher : program_invocation_short_name, *table);
    if (!publisher) {
        const bool isSystem = publisher.failure().code != EINVAL;
        return refuse(isSystem ? VelaReportingStatusNoResources : VelaReportingStatusInvalidArgument,
                      publisher.failure().description, error);
    }
    auto made = std::make_unique<VelaReportingChannels>();
    made->publisher = *std::move(publisher);
    for (const PublishedChannel& channel : made->publisher->channels()) {
        made->channels.push_back({channel});
    }
    *channels = made.release();
    return VelaReportingStatusOk;
} catch (...) {
    return VelaReportingStatusNoResources;
}

void VelaReportingChannelsDestroy(VelaReportingChannels* channels) noexcept {
    const std::unique_ptr<VelaReportingChannels> owner(channels);
}

VelaReportingChannel* VelaReportingChannelsGet(VelaReportingChannels* channels, size_t index) noexcept {
    return channels == nullptr || index >= channels->channels.size() ? nullptr : &channels->channels[index];
}

void VelaReportingCounterAdd(VelaReportingChannel* channel, int64_t change) noexcept {
    if (channel != nullptr) {
        channel->channel.add(change);
    }
}

void VelaReportingCounterSet(VelaReportingChannel* channel, int64_t value) noexcept {
    if (channel != nullptr) {
        channel->channel.set(value);
    }
}

void VelaReportingHistogramRecord(VelaReportingChannel* channel, int64_t value) noexcept {
    if (channel != nullptr) {
        channel->channel.record(value);
    }
}

void VelaReportingStateEnter(VelaReportingChannel* channel, uint64_t state) noexcept {
    if (channel != nullptr) {
        channel->channel.enter(state, vela::platform::hwstats::monotonicNanoseconds());
    }
}

void VelaReportingStateEnterAt(VelaReportingChannel* channel, uint64_t state, uint64_t nanoseconds) noexcept {
    if (channel != nullptr) {
        channel->channel.enter(state, nanoseconds);
    }
}

} // extern "C"
