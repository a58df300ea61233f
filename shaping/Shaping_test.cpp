// Random sessions through the product and through a second version of each operation, which follows the rules step by
// step with whole dictionaries and no thought of cost. Results and log lines must be the same.
#include "shaping/Shaping_test.h"

#include "shaping/RapidMessages.h"
#include "shaping/VolumeMessages.h"
#include "testing/CapturingLog.h"

#include <algorithm>
#include <cmath>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <memory>
#include <random>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace vela {

namespace {

// The second versions.

struct PlainCombined {
    Dictionary message;
    bool combined = false;
};

std::vector<PlainCombined> combinePlainly(const std::vector<StoredMessage>& messages,
                                          const std::vector<std::string>& keys, double maximumPause) {
    std::vector<std::shared_ptr<PlainCombined>> output;
    std::shared_ptr<PlainCombined> group;
    bool hasLastTime = false;
    double lastTime = 0;
    for (const StoredMessage& stored : messages) {
        const Dictionary& message = stored.message;
        bool combinable = false;
        for (const std::string& key : keys) {
            combinable = combinable || message.contains(std::string_view(key));
        }
        if (!combinable) {
            output.push_back(std::make_shared<PlainCombined>(PlainCombined{message, false}));
            continue;
        }
        const ValueRef timestamp = message.find("velareporting_timestamp");
        const double time = timestamp ? timestamp.doubleValue() : 0.0;
        if (group == nullptr || (hasLastTime && time - lastTime > maximumPause)) {
            group = std::make_shared<PlainCombined>(PlainCombined{Dictionary(), true});
            output.push_back(group);
        }
        for (const auto& [key, value] : message) {
            group->message = group->message.setting(key, Value(value));
        }
        hasLastTime = static_cast<bool>(timestamp);
        lastTime = time;
    }
    std::vector<PlainCombined> result;
    for (const std::shared_ptr<PlainCombined>& element : output) {
        result.push_back(*element);
    }
    return result;
}

double plainNumber(ValueRef value) { return value.isNumber() ? value.doubleValue() : 0.0; }

bool plainVolumesDiffer(ValueRef left, ValueRef right) {
    const auto isCounted = [](ValueRef value) { return value.isNumber() && value.kind() != ValueKind::Boolean; };
    return isCounted(left) && isCounted(right) ? left.doubleValue() != right.doubleValue() : !(left == right);
}

std::string plainBucket(double number, const std::vector<std::pair<double, const char*>>& buckets) {
    std::string nearest;
    double best = std::numeric_limits<double>::infinity();
    for (const auto& [bucket, text] : buckets) {
        if (std::abs(number - bucket) <= best) {
            best = std::abs(number - bucket);
            nearest = text;
        }
    }
    return nearest;
}

const std::vector<std::pair<double, const char*>> kPlainVolumes = {
    {0, "0.0"},          {1.0 / 16, "0.0625"},  {2.0 / 16, "0.125"},  {3.0 / 16, "0.1875"},
    {4.0 / 16, "0.25"},  {5.0 / 16, "0.3125"},  {6.0 / 16, "0.375"},  {7.0 / 16, "0.4375"},
    {8.0 / 16, "0.5"},   {9.0 / 16, "0.5625"},  {10.0 / 16, "0.625"}, {11.0 / 16, "0.6875"},
    {12.0 / 16, "0.75"}, {13.0 / 16, "0.8125"}, {14.0 / 16, "0.875"}, {15.0 / 16, "0.9375"},
    {1, "1.0"}};
const std::vector<std::pair<double, const char*>> kPlainTimes = {
    {0, "0"},     {1, "1"},       {5, "5"},       {10, "10"},     {30, "30"},      {60, "60"},
    {300, "300"}, {1800, "1800"}, {3600, "3600"}, {7200, "7200"}, {18000, "18000"}};

struct PlainResult {
    std::vector<Dictionary> messages;
    std::vector<std::string> lines;
};

bool plainConditionsDiffer(const Dictionary& message, const Dictionary& state) {
    const auto inBoth = [&](const char* key) { return message.contains(key) && state.contains(key); };
    bool differ = false;
    for (const char* key : {"session_selected_format", "active_devices"}) {
        differ = differ || (inBoth(key) && textualForm(message.find(key)) != textualForm(state.find(key)));
    }
    for (const char* key : {"spatializationEnabled", "ringerstate"}) {
        differ = differ || (message.contains(key) && plainNumber(message.find(key)) != plainNumber(state.find(key)));
    }
    return differ || (inBoth("NexoSessionVolume") &&
                      plainVolumesDiffer(message.find("NexoSessionVolume"), state.find("NexoSessionVolume")));
}

Dictionary plainVolumeMessage(const Dictionary& state, const Value& process, double seconds, int index) {
    const auto known = [&](const char* key) { return Value(state.find(key)); };
    const double volume = plainNumber(state.find("NexoSessionVolume"));
    return {{"session_selected_format", known("session_selected_format")},
            {"active_devices", known("active_devices")},
            {"HostApplicationDisplayID", process},
            {"NexoSessionVolume", known("NexoSessionVolume")},
            {"NexoSessionVolumeBucketed", plainBucket(volume, kPlainVolumes).c_str()},
            {"play_seconds", static_cast<float>(seconds)},
            {"spatial-audio-accessory-feature", known("spatial-audio-accessory-feature")},
            {"spatializationEnabled", known("spatializationEnabled")},
            {"ringerstate", known("ringerstate")},
            {"mChannelsPerFrame", known("mChannelsPerFrame")},
            {"play_secondsBucketed", plainBucket(seconds, kPlainTimes).c_str()},
            {"msgidx", index}};
}

PlainResult createPlainly(const std::vector<StoredMessage>& messages, const Value& process, double minimum) {
    const std::string operation = "createVolumeMessages:process:minimumPlaytime:";
    Dictionary state = {{"session_selected_format", "unknown"},
                        {"active_devices", "unknown"},
                        {"spatial-audio-accessory-feature", false},
                        {"spatializationEnabled", false},
                        {"ringerstate", false},
                        {"mChannelsPerFrame", -1}};
    bool running = false;
    Value start;
    int index = 1;
    PlainResult result;
    const auto log = [&](const std::string& text, const char* action) {
        result.lines.push_back(text + " { func=" + operation + ", action=" + action +
                               ", count=" + std::to_string(result.messages.size()) + " }");
    };
    result.lines.push_back("entering createVolumeMessages " + operation);
    for (const PlainCombined& element :
         combinePlainly(messages, {"spatial-audio-accessory-feature", "spatializationEnabled"}, 2.0)) {
        const Dictionary& message = element.message;
        const double time = plainNumber(message.find("velareporting_timestamp"));
        const bool wasRunning = plainNumber(state.find("session_output_running")) != 0;
        bool changed = message.contains("session_duration");
        if (message.contains("session_output_running")) {
            running = plainNumber(message.find("session_output_running")) != 0;
            start = !wasRunning && running ? Value(time) : start;
            changed = changed || (wasRunning && !running);
        } else {
            running = running && !message.contains("session_duration");
        }
        changed = changed || (running && plainConditionsDiffer(message, state));
        if (wasRunning && changed) {
            const double seconds = time - plainNumber(start);
            if (seconds <= minimum || !process || !state.contains("NexoSessionVolume")) {
                log("skipped volume message, too short", "skip");
            } else {
                result.messages.push_back(plainVolumeMessage(state, process, seconds, index));
                ++index;
                log("added volume message", "add");
            }
            start = time;
        }
        start = running ? start : Value();
        state = state.merging(message);
    }
    for (Dictionary& message : result.messages) {
        message = message.setting(Key("msgcnt"), static_cast<std::uint64_t>(result.messages.size()));
    }
    log("returning volume message", "return");
    return result;
}

// Random sessions.

class RandomSession {
public:
    explicit RandomSession(std::uint32_t seed) : engine_(seed) {}

    std::vector<StoredMessage> make() {
        clock_ = pick({0.0, 3.0, 1.7e9});
        // Few kinds of values make sessions with long stretches, many make ones that use every comparison.
        odd_ = chance(0.5);
        std::vector<Dictionary> messages;
        const std::size_t size = below(40);
        while (messages.size() < size) {
            messages.push_back(message());
        }
        return storedMessages(messages);
    }

    bool chance(double probability) { return std::uniform_real_distribution<>(0, 1)(engine_) < probability; }

    template <class Type>
    Type pick(std::initializer_list<Type> choices) {
        return *(choices.begin() + below(choices.size()));
    }

private:
    std::size_t below(std::size_t end) { return std::uniform_int_distribution<std::size_t>(0, end - 1)(engine_); }

    Value flag() {
        if (!odd_) {
            return chance(0.5);
        }
        return pick<Value>({true, false, 1, 0, 1.0, 0.0, 2, -0.0, 1.0F, "on", Array{1}, Value(~std::uint64_t{0})});
    }

    Value text() {
        if (!odd_) {
            return pick<Value>({"Speaker", "Headphones"});
        }
        return pick<Value>({"Speaker", "", "unknown", "1", 1, true, Array{"a", "b"}, "(a, b)", Date{5}});
    }

    Value volume() {
        if (!odd_) {
            return pick<Value>({0.25, 0.5, 0.53125, 0.8});
        }
        return pick<Value>({0.5, 0.5F, 0.1, 0.1F, 1, 1.0, true, 0, false, "0.5", "loud", 7, -2, Dictionary{{"a", 1}}});
    }

    Value time() {
        if (odd_ && chance(0.05)) {
            return pick<Value>({"later", true, Array{}, 17});
        }
        if (chance(0.1)) {
            return clock_ - pick({0.25, 1.0, 7.5}); // out of order
        }
        clock_ += pick({0.0, 0.25, 0.5, 0.6, 1.0, 2.0, 2.5, 3.0, 7.5, 20.0, 4000.0});
        if (chance(0.1) && clock_ < 1e9) {
            return static_cast<std::int64_t>(clock_);
        }
        return clock_;
    }

    Dictionary message() {
        std::vector<std::pair<const char*, Value>> entries;
        const auto maybe = [&](double probability, const char* key, const Value& value) {
            if (chance(probability)) {
                entries.emplace_back(key, value);
            }
        };
        maybe(0.9, "velareporting_timestamp", time());
        maybe(0.3, "session_output_running", chance(0.7) ? Value(chance(0.7)) : flag());
        maybe(0.05, "session_duration", flag());
        maybe(0.15, "session_selected_format", text());
        maybe(0.15, "active_devices", text());
        maybe(0.15, "spatializationEnabled", flag());
        maybe(0.15, "ringerstate", flag());
        maybe(0.3, "NexoSessionVolume", volume());
        maybe(0.1, "spatial-audio-accessory-feature", flag());
        maybe(0.1, "mChannelsPerFrame", chance(0.5) ? Value(2) : text());
        maybe(0.1, "play_seconds", 5);
        maybe(0.1, "msgidx", 9);
        maybe(0.1, "other", text());
        if (!repeated_.empty() && chance(0.05)) {
            return repeated_;
        }
        std::shuffle(entries.begin(), entries.end(), engine_);
        DictionaryBuilder builder;
        for (const auto& [key, value] : entries) {
            builder.add(key, value);
        }
        repeated_ = builder.build();
        return repeated_;
    }

    std::mt19937 engine_;
    double clock_ = 0;
    bool odd_ = false;
    Dictionary repeated_;
};

/// Equal in every detail: keys, their order, values, their kinds.
void expectIdentical(const Dictionary& actual, const Dictionary& expected) {
    EXPECT_EQ(actual, expected);
    ASSERT_EQ(keysOf(actual), keysOf(expected));
    for (const auto& [key, value] : actual) {
        EXPECT_EQ(value.kind(), expected.find(key).kind()) << key.text();
    }
}

constexpr std::uint32_t kSessions = 6000;

TEST(ShapingTest, RapidMessagesAreThoseOfThePlainVersion) {
    std::size_t combined = 0;
    for (std::uint32_t seed = 0; seed < kSessions; ++seed) {
        SCOPED_TRACE("seed " + std::to_string(seed));
        RandomSession session(seed);
        const std::vector<StoredMessage> messages = session.make();
        const double pause = session.pick({0.0, 0.5, 2.0, 3.0, -1.0});
        const auto texts = session.pick<std::vector<std::string>>(
            {{"spatial-audio-accessory-feature", "spatializationEnabled"}, {"NexoSessionVolume"}, {"other"}, {}});
        const std::vector<PlainCombined> expected = combinePlainly(messages, texts, pause);
        const std::vector<Key> keys(texts.begin(), texts.end());
        const std::vector<Dictionary> actual = combineRapidMessages(messages, keys, pause);
        ASSERT_EQ(actual.size(), expected.size());
        std::size_t input = 0; // of the plain messages
        for (std::size_t index = 0; index < actual.size(); ++index) {
            expectIdentical(actual[index], expected[index].message);
            if (expected[index].combined) {
                ++combined;
                continue;
            }
            while (input < messages.size() && !messages[input].message.isSameObject(actual[index])) {
                ++input;
            }
            ASSERT_LT(input, messages.size()) << "not one of the messages, in their order";
            ++input;
        }
    }
    EXPECT_GT(combined, kSessions); // the sessions did what the test is about
}

TEST(ShapingTest, VolumeMessagesAreThoseOfThePlainVersion) {
    testing::CapturingLog log;
    std::size_t made = 0;
    for (std::uint32_t seed = 0; seed < kSessions; ++seed) {
        SCOPED_TRACE("seed " + std::to_string(seed));
        RandomSession session(seed);
        const std::vector<StoredMessage> messages = session.make();
        const Value process = session.pick<Value>({"com.example.player", "com.example.player", "", 7, Value()});
        const double minimum = session.pick({0.5, 0.5, 0.0, 2.5, -1.0});
        const PlainResult expected = createPlainly(messages, process, minimum);
        log.clear();
        const std::vector<Dictionary> actual = createVolumeMessages(messages, process, minimum);
        ASSERT_EQ(actual.size(), expected.messages.size());
        for (std::size_t index = 0; index < actual.size(); ++index) {
            expectIdentical(actual[index], expected.messages[index]);
        }
        std::vector<std::string> lines;
        for (const testing::CapturedLine& line : log.lines()) {
            lines.push_back(line.message);
        }
        ASSERT_EQ(lines, expected.lines);
        made += actual.size();
    }
    EXPECT_GT(made, kSessions);
}

} // namespace

} // namespace vela
