#include "reporters/pipewire/Pods.h"

#include <array>
#include <charconv>
#include <pipewire/keys.h>
#include <spa/debug/types.h>
#include <spa/param/audio/format.h>
#include <spa/param/audio/type-info.h>
#include <spa/param/param.h>
#include <spa/param/profiler.h>
#include <spa/param/props.h>
#include <spa/pod/iter.h>
#include <spa/utils/dict.h>
#include <string_view>

namespace vela::reporter {

namespace {

constexpr std::size_t kMostChannels = SPA_AUDIO_MAX_CHANNELS;

/// Null when it is missing, or leaves a choice. A choice of one is a value too: streams give their formats as such.
const spa_pod* valueOf(const spa_pod* object, std::uint32_t key) {
    const spa_pod_prop* const property = spa_pod_find_prop(object, nullptr, key);
    if (property == nullptr) {
        return nullptr;
    }
    std::uint32_t count = 0;
    std::uint32_t choice = SPA_CHOICE_None;
    const spa_pod* const value = spa_pod_get_values(&property->value, &count, &choice);
    return choice == SPA_CHOICE_None && count > 0 ? value : nullptr;
}

/// Steps over the members of a struct. Each get() takes the next one, of whatever type, and answers whether it was of
/// the type asked for.
class StructReader {
public:
    explicit StructReader(const spa_pod* pod) : body_(pod) {
        if (pod != nullptr && spa_pod_is_struct(pod) != 0) {
            member_ = static_cast<const spa_pod*>(SPA_POD_BODY_CONST(pod));
        }
    }

    /// Null at the end.
    const spa_pod* next() {
        if (member_ == nullptr || !spa_pod_is_inside(SPA_POD_BODY_CONST(body_), SPA_POD_BODY_SIZE(body_), member_)) {
            return nullptr;
        }
        const spa_pod* const pod = member_;
        member_ = static_cast<const spa_pod*>(spa_pod_next(member_));
        return pod;
    }
    bool get(std::int32_t& value) {
        const spa_pod* const pod = next();
        return pod != nullptr && spa_pod_get_int(pod, &value) == 0;
    }
    bool get(std::int64_t& value) {
        const spa_pod* const pod = next();
        return pod != nullptr && spa_pod_get_long(pod, &value) == 0;
    }
    bool get(std::string& value) {
        const spa_pod* const pod = next();
        const char* text = nullptr;
        if (pod == nullptr || spa_pod_get_string(pod, &text) != 0 || text == nullptr) {
            return false;
        }
        value = text;
        return true;
    }
    void skip(int count) {
        for (int i = 0; i < count; ++i) {
            next();
        }
    }

private:
    const spa_pod* body_;
    const spa_pod* member_ = nullptr;
};

bool readNodeCycle(const spa_pod* block, NodeCycle& node) {
    StructReader reader(block);
    std::int32_t id = 0;
    std::int64_t previous = 0;
    std::int32_t status = 0;
    if (!reader.get(id) || !reader.get(node.name) || !reader.get(previous) || !reader.get(node.signal) ||
        !reader.get(node.awake) || !reader.get(node.finish) || !reader.get(status)) {
        return false;
    }
    node.id = static_cast<std::uint32_t>(id);
    node.status = status;
    return true;
}

std::optional<Cycle> readCycle(const spa_pod* pod) {
    const auto* const object = reinterpret_cast<const spa_pod_object*>(pod);
    Cycle cycle;
    bool hasDriver = false;
    const spa_pod_prop* property = nullptr;
    SPA_POD_OBJECT_FOREACH(object, property) {
        StructReader reader(&property->value);
        std::int32_t xruns = 0;
        if (property->key == SPA_PROFILER_info) {
            reader.skip(4); // counter and three loads
            if (reader.get(xruns)) {
                cycle.xruns = xruns;
            }
        } else if (property->key == SPA_PROFILER_clock) {
            reader.skip(6); // flags, ID, name, time, rate, position
            reader.get(cycle.frames);
        } else if (property->key == SPA_PROFILER_driverBlock) {
            hasDriver = readNodeCycle(&property->value, cycle.driver);
        } else if (property->key == SPA_PROFILER_followerBlock) {
            NodeCycle follower;
            if (readNodeCycle(&property->value, follower)) {
                cycle.followers.push_back(std::move(follower));
            }
        }
    }
    return hasDriver ? std::optional(std::move(cycle)) : std::nullopt;
}

std::optional<std::uint64_t> readNumber(const spa_dict* properties, const char* key) {
    const std::string text = readText(properties, key);
    std::uint64_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    const bool isWhole = error == std::errc() && end == text.data() + text.size() && !text.empty();
    return isWhole ? std::optional(number) : std::nullopt;
}

std::optional<std::uint32_t> readID(const spa_dict* properties, const char* key) {
    const std::optional<std::uint64_t> number = readNumber(properties, key);
    return number ? std::optional(static_cast<std::uint32_t>(*number)) : std::nullopt;
}

} // namespace

std::optional<Volume> readVolume(const spa_pod* parameter) {
    if (parameter == nullptr || !spa_pod_is_object_type(parameter, SPA_TYPE_OBJECT_Props)) {
        return std::nullopt;
    }
    Volume volume;
    bool isThere = false;
    if (const spa_pod* const value = valueOf(parameter, SPA_PROP_volume)) {
        float number = 1;
        isThere = spa_pod_get_float(value, &number) == 0;
        volume.volume = static_cast<double>(number);
    }
    if (const spa_pod* const value = valueOf(parameter, SPA_PROP_mute)) {
        isThere = spa_pod_get_bool(value, &volume.muted) == 0 || isThere;
    }
    if (const spa_pod* const value = valueOf(parameter, SPA_PROP_channelVolumes)) {
        std::array<float, kMostChannels> channels{};
        const std::uint32_t count = spa_pod_copy_array(value, SPA_TYPE_Float, channels.data(), channels.size());
        volume.channels.assign(channels.begin(), channels.begin() + count);
        isThere = isThere || count > 0;
    }
    return isThere ? std::optional(std::move(volume)) : std::nullopt;
}

std::optional<Format> readFormat(const spa_pod* parameter) {
    if (parameter == nullptr || !spa_pod_is_object_type(parameter, SPA_TYPE_OBJECT_Format)) {
        return std::nullopt;
    }
    const spa_pod* const encoding = valueOf(parameter, SPA_FORMAT_AUDIO_format);
    const spa_pod* const rate = valueOf(parameter, SPA_FORMAT_AUDIO_rate);
    const spa_pod* const channels = valueOf(parameter, SPA_FORMAT_AUDIO_channels);
    std::uint32_t type = 0;
    std::int32_t hertz = 0;
    std::int32_t count = 0;
    if (encoding == nullptr || spa_pod_get_id(encoding, &type) != 0 || rate == nullptr ||
        spa_pod_get_int(rate, &hertz) != 0 || channels == nullptr || spa_pod_get_int(channels, &count) != 0 ||
        hertz < 1 || count < 1) {
        return std::nullopt;
    }
    const char* const name = spa_debug_type_find_short_name(spa_type_audio_format, type);
    return Format{name == nullptr ? "unknown" : name, static_cast<std::uint32_t>(hertz),
                  static_cast<std::uint32_t>(count)};
}

std::vector<Cycle> readCycles(const spa_pod* batch) {
    std::vector<Cycle> cycles;
    StructReader reader(batch);
    while (const spa_pod* const pod = reader.next()) {
        if (!spa_pod_is_object_type(pod, SPA_TYPE_OBJECT_Profiler)) {
            continue;
        }
        if (std::optional<Cycle> cycle = readCycle(pod)) {
            cycles.push_back(*std::move(cycle));
        }
    }
    return cycles;
}

std::string readText(const spa_dict* properties, const char* key) {
    const char* const text = properties == nullptr ? nullptr : spa_dict_lookup(properties, key);
    return text == nullptr ? std::string() : std::string(text);
}

NodeProperties readNodeProperties(const spa_dict* properties) {
    NodeProperties node;
    node.serial = readNumber(properties, PW_KEY_OBJECT_SERIAL).value_or(0);
    node.mediaClass = readText(properties, PW_KEY_MEDIA_CLASS);
    node.role = readText(properties, PW_KEY_MEDIA_ROLE);
    node.eventId = readText(properties, "event.id");
    node.application = readText(properties, PW_KEY_APP_NAME);
    node.name = readText(properties, PW_KEY_NODE_NAME);
    node.client = readID(properties, PW_KEY_CLIENT_ID);
    return node;
}

std::optional<Link> readLink(const spa_dict* properties) {
    const std::optional<std::uint32_t> output = readID(properties, PW_KEY_LINK_OUTPUT_NODE);
    const std::optional<std::uint32_t> input = readID(properties, PW_KEY_LINK_INPUT_NODE);
    return output && input ? std::optional(Link{*output, *input}) : std::nullopt;
}

} // namespace vela::reporter
