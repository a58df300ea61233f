#include "common/values/Dictionary.h"
#include "common/values/Json.h"

#include <cmath>
#include <cstdint>
#include <gtest/gtest.h>
#include <limits>
#include <nlohmann/json.hpp>
#include <random>

namespace vela {

namespace {

std::string json(const Value& value) { return jsonText(value); }

TEST(JsonTest, NumbersKeepTheirKind) {
    EXPECT_EQ(json(true), "true");
    EXPECT_EQ(json(false), "false");
    EXPECT_EQ(json(1), "1");
    EXPECT_EQ(json(std::numeric_limits<std::int64_t>::min()), "-9223372036854775808");
    EXPECT_EQ(json(std::numeric_limits<std::uint64_t>::max()), "18446744073709551615");
    EXPECT_EQ(json(1.0), "1.0");
    EXPECT_EQ(json(-0.0), "-0.0");
    EXPECT_EQ(json(0.5), "0.5");
    EXPECT_EQ(json(123.0), "123.0");
    EXPECT_EQ(json(1e300), "1e+300");
    EXPECT_EQ(json(0.1F), "0.1");
    EXPECT_EQ(json(10.0F), "10.0");
}

TEST(JsonTest, WhatJsonCannotSayIsNull) {
    EXPECT_EQ(json(std::nan("")), "null");
    EXPECT_EQ(json(std::numeric_limits<double>::infinity()), "null");
    EXPECT_EQ(json(-std::numeric_limits<float>::infinity()), "null");
    EXPECT_EQ(json(Value()), "null");
    EXPECT_EQ(json(Date{std::nan("")}), "null");
}

TEST(JsonTest, DataIsBase64) {
    EXPECT_EQ(json(Data("")), "\"\"");
    EXPECT_EQ(json(Data("f")), "\"Zg==\"");
    EXPECT_EQ(json(Data("fo")), "\"Zm8=\"");
    EXPECT_EQ(json(Data("foo")), "\"Zm9v\"");
    EXPECT_EQ(json(Data("foob")), "\"Zm9vYg==\"");
    EXPECT_EQ(json(Data("\xfb\xff\xfe")), "\"+//+\"");
}

TEST(JsonTest, DatesAreIso8601Utc) {
    EXPECT_EQ(json(Date{0}), "\"1970-01-01T00:00:00Z\"");
    EXPECT_EQ(json(Date{1795228205.25}), "\"2026-11-21T02:30:05.250Z\"");
    EXPECT_EQ(json(Date{-0.5}), "\"1969-12-31T23:59:59.500Z\"");
}

TEST(JsonTest, StringsAreEscaped) {
    EXPECT_EQ(json("plain"), "\"plain\"");
    EXPECT_EQ(json("say \"no\" \\ /"), "\"say \\\"no\\\" \\\\ /\"");
    EXPECT_EQ(json("\b\f\n\r\t"), "\"\\b\\f\\n\\r\\t\"");
    EXPECT_EQ(json("\x01\x1f\x7f"), "\"\\u0001\\u001f\\u007f\"");
    EXPECT_EQ(json("\u0080\u009b\u009f\u00a0"), "\"\\u0080\\u009b\\u009f\u00a0\"");
    EXPECT_EQ(json(std::string_view("a\0b", 3)), "\"a\\u0000b\"");
    EXPECT_EQ(json("caf\u00e9 \U0001F50A"), "\"caf\u00e9 \U0001F50A\"");
}

TEST(JsonTest, InvalidUtf8BecomesTheReplacementCharacter) {
    EXPECT_EQ(json("a\xFFz"), "\"a\uFFFDz\"");
    EXPECT_EQ(json("\xE2\x82"), "\"\uFFFD\uFFFD\"");
}

// A special byte at every place of texts around the eight that are looked at together.
TEST(JsonTest, FindsWhatToEscapeAtEveryPlace) {
    for (const std::string special : {"\"", "\\", "\n", "\x7f", "\u00e9"}) {
        for (std::size_t length = 0; length < 20; ++length) {
            for (std::size_t place = 0; place <= length; ++place) {
                std::string text(length, 'x');
                text.insert(place, special);
                EXPECT_EQ(nlohmann::json::parse(json(std::string_view(text))).get<std::string>(), text);
            }
        }
    }
}

TEST(JsonTest, ContainersAreCompactByDefault) {
    EXPECT_EQ(json(Dictionary{{"b", 1}, {"a", Array{true, "x", Dictionary{}}}}), R"({"b":1,"a":[true,"x",{}]})");
    EXPECT_EQ(json(Array{}), "[]");
}

TEST(JsonTest, PrettyHasTwoSpacesAndOneValueALine) {
    const Value value = Array{Dictionary{{"Volume_State_1", Dictionary{{"a", 1}, {"b", Array{}}}}}, 2};
    EXPECT_EQ(jsonText(value, JsonLayout::Pretty), "[\n"
                                                   "  {\n"
                                                   "    \"Volume_State_1\": {\n"
                                                   "      \"a\": 1,\n"
                                                   "      \"b\": []\n"
                                                   "    }\n"
                                                   "  },\n"
                                                   "  2\n"
                                                   "]");
}

TEST(JsonTest, KeysAreEscapedToo) {
    EXPECT_EQ(json(Dictionary{{"say \"no\"", 1}, {"caf\u00e9", 2}, {"", 3}}), R"({"say \"no\"":1,"café":2,"":3})");
}

TEST(JsonTest, AppendsBehindWhatIsThere) {
    std::string text = "data: ";
    appendJson(text, Value(Array{1}));
    EXPECT_EQ(text, "data: [1]");
    appendJsonString(text, " x");
    EXPECT_EQ(text, "data: [1]\" x\"");
}

TEST(JsonTest, LongTextsArriveWhole) {
    const std::string text(100000, 'x');
    EXPECT_EQ(json(std::string_view(text)), '"' + text + '"');
    const std::string data(100001, 'x');
    EXPECT_EQ(json(Data(data)).size(), 2 + (data.size() + 2) / 3 * 4);
}

Value randomValue(std::mt19937& random, int depth) {
    switch (random() % (depth > 0 ? 8 : 6)) {
    case 0:
        return random() % 2 == 0;
    case 1:
        return static_cast<std::int64_t>(random()) - 2147483648;
    case 2:
        return std::ldexp(static_cast<double>(random()), static_cast<int>(random() % 200) - 100);
    case 3:
        return static_cast<double>(random() % 100000) / 64;
    case 4:
        return std::string_view(std::string(random() % 40, static_cast<char>('a' + random() % 26)));
    case 5:
        return "\"\\\n\u20ac";
    case 6: {
        ArrayBuilder builder;
        for (auto count = random() % 5; count > 0; --count) {
            builder.add(randomValue(random, depth - 1));
        }
        return builder.build();
    }
    default: {
        DictionaryBuilder builder;
        for (auto count = random() % 5; count > 0; --count) {
            builder.add("key " + std::to_string(count), randomValue(random, depth - 1));
        }
        return builder.build();
    }
    }
}

nlohmann::ordered_json peerOf(ValueRef value) {
    switch (value.kind()) {
    case ValueKind::Boolean:
        return value.boolean();
    case ValueKind::Integer:
        return value.integer();
    case ValueKind::Real:
        return value.real();
    case ValueKind::String:
        return std::string(value.text());
    case ValueKind::Array: {
        auto list = nlohmann::ordered_json::array();
        for (const ValueRef element : value.array()) {
            list.push_back(peerOf(element));
        }
        return list;
    }
    default: {
        auto object = nlohmann::ordered_json::object();
        for (const auto& [key, element] : value.dictionary()) {
            object[std::string(key.text())] = peerOf(element);
        }
        return object;
    }
    }
}

TEST(JsonTest, AnotherParserReadsTheSame) {
    // NOLINTNEXTLINE(cert-msc32-c,cert-msc51-cpp): a failure must be met again
    std::mt19937 random(11);
    for (int round = 0; round < 3000; ++round) {
        const Value value = randomValue(random, 4);
        const nlohmann::ordered_json expected = peerOf(value);
        EXPECT_EQ(nlohmann::ordered_json::parse(jsonText(value)), expected);
        EXPECT_EQ(nlohmann::ordered_json::parse(jsonText(value, JsonLayout::Pretty)), expected);
        if (!expected.is_number_float()) {
            EXPECT_EQ(nlohmann::ordered_json::parse(jsonText(value)).dump(2), expected.dump(2));
        }
    }
}

TEST(JsonTest, ADictionarysValuesAreAnArray) {
    std::string text = "before";
    appendJsonValues(text, Dictionary{{"a", 1}, {"b", "two"}, {"c", Dictionary{{"d", 1.0}}}, {"e", Array{1, 2}}});
    EXPECT_EQ(text, R"(before[1,"two",{"d":1.0},[1,2]])");
    appendJsonValues(text, Dictionary());
    EXPECT_EQ(text, R"(before[1,"two",{"d":1.0},[1,2]][])");
}

} // namespace

} // namespace vela
