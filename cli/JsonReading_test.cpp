#include "cli/JsonReading.h"
#include "common/values/Dictionary.h"
#include "common/values/Json.h"

#include <gtest/gtest.h>
#include <limits>
#include <string>

namespace vela {
namespace {

Value read(std::string_view text) {
    platform::Result<Value> value = readJson(text);
    EXPECT_TRUE(value) << text;
    return value ? *std::move(value) : Value();
}
std::string faultOf(std::string_view text, std::size_t depth = 128) {
    const platform::Result<Value> value = readJson(text, depth);
    return value ? "no fault" : value.failure().description;
}

TEST(JsonReadingTest, EveryKindOfValueIsRead) {
    EXPECT_EQ(read("true"), Value(true));
    EXPECT_EQ(read("-42"), Value(-42));
    EXPECT_EQ(read("42"), Value(42));
    EXPECT_EQ(read("9223372036854775808").kind(), ValueKind::Unsigned);
    EXPECT_EQ(read("1.0"), Value(1.0));
    EXPECT_EQ(read("\"a \\u00e4\""), Value("a \xC3\xA4"));
    EXPECT_EQ(read("[1,[]]"), Value(Array{1, Array()}));
    EXPECT_EQ(read("{}"), Value(Dictionary()));
}

TEST(JsonReadingTest, KeysKeepTheirOrder) {
    EXPECT_EQ(jsonText(read(R"({"z":1,"a":{"y":2,"b":[]}})")), R"({"z":1,"a":{"y":2,"b":[]}})");
}

TEST(JsonReadingTest, ARepeatedKeyTakesItsLastValue) {
    EXPECT_EQ(jsonText(read(R"({"a":1,"b":2,"a":3})")), R"({"a":3,"b":2})");
}

TEST(JsonReadingTest, DataAndDatesAreObjectsOfOneKey) {
    EXPECT_EQ(read(R"({"$data":"AQL/"})"), Value(Data("\x01\x02\xFF")));
    EXPECT_EQ(read(R"({"$data":"AQ=="})"), Value(Data("\x01")));
    EXPECT_EQ(read(R"({"$date":1.5})"), Value(Date{1.5}));
    EXPECT_EQ(faultOf(R"({"$data":"A?"})"), "\"$data\" is not base64");
    EXPECT_TRUE(read(R"({"$date":1.5,"b":1})").ref().isDictionary());
}

TEST(JsonReadingTest, NullIsRefused) { EXPECT_EQ(faultOf("[null]"), "null is no value of a property list"); }

TEST(JsonReadingTest, WhatIsNoJsonIsRefusedWithItsPlace) {
    EXPECT_EQ(faultOf(R"({"a":})"), "no JSON at byte 6");
    EXPECT_EQ(faultOf("1 2"), "no JSON at byte 3");
    EXPECT_EQ(faultOf(""), "no JSON at byte 1");
}

TEST(JsonReadingTest, TheDepthIsBounded) {
    EXPECT_EQ(faultOf("[[]]", 2), "no fault");
    EXPECT_EQ(faultOf("[[[]]]", 2), "more than 2 containers inside each other");
    EXPECT_EQ(faultOf(std::string(100000, '[')), "more than 128 containers inside each other");
}

} // namespace
} // namespace vela
