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
    EXPECT_EQ(read(R"({"$data":"AQ"})"), Value(Data("\x01")));
    EXPECT_EQ(read(R"({"$data":""})"), Value(Data("")));
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

TEST(JsonReadingTest, WhatIsNoBase64IsRefusedWithItsText) {
    EXPECT_EQ(faultOf(R"({"$data":"A"})"),
              "\"$data\" is not base64: \"A\" has 1 digits, one more than a multiple of 4");
    EXPECT_EQ(faultOf(R"({"$data":"AQIDB==="})"),
              "\"$data\" is not base64: \"AQIDB===\" has 5 digits, one more than a multiple of 4");
    EXPECT_EQ(faultOf(R"({"$data":"A?=="})"), "\"$data\" is not base64: \"A?==\" has other characters than A-Z, a-z, "
                                              "0-9, +, / and a padding of =");
    const std::string padded = " ends with \"=\", but not so that its length is the next multiple of 4";
    EXPECT_EQ(faultOf(R"({"$data":"AQ="})"), "\"$data\" is not base64: \"AQ=\"" + padded);
    EXPECT_EQ(faultOf(R"({"$data":"AQID===="})"), "\"$data\" is not base64: \"AQID====\"" + padded);
    EXPECT_EQ(faultOf(R"({"$data":"="})"), "\"$data\" is not base64: \"=\"" + padded);
    EXPECT_EQ(faultOf(R"({"$data":")" + std::string(101, 'A') + R"("})"),
              "\"$data\" is not base64: \"" + std::string(80, 'A') +
                  "...\" has 101 digits, one more than a multiple of 4");
}

TEST(JsonReadingTest, WholeNumbersBeyond64BitsAreRefused) {
    const std::string limit = " is no whole number from -9223372036854775808 to 18446744073709551615";
    EXPECT_EQ(read("18446744073709551615"), Value(std::numeric_limits<std::uint64_t>::max()));
    EXPECT_EQ(faultOf("18446744073709551616"), "18446744073709551616" + limit);
    EXPECT_EQ(read("-9223372036854775808"), Value(std::numeric_limits<std::int64_t>::min()));
    EXPECT_EQ(faultOf("[-9223372036854775809]"), "-9223372036854775809" + limit);
    EXPECT_EQ(faultOf(std::string(400, '1')), std::string(80, '1') + "..." + limit);
    EXPECT_EQ(read("18446744073709551616.0"), Value(18446744073709551616.0));
    EXPECT_EQ(read("1e19"), Value(1e19));
}

TEST(JsonReadingTest, RealsBeyondTheirRangeAreRefused) {
    EXPECT_EQ(faultOf("1e309"), "1e309 is beyond the largest real, 1.7976931348623157e308");
    EXPECT_EQ(faultOf("-1e309"), "-1e309 is beyond the largest real, 1.7976931348623157e308");
}

} // namespace
} // namespace vela
