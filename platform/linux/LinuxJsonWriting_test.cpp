#include "common/values/Dictionary.h"
#include "platform/linux/LinuxJsonWriting.h"

#include <gtest/gtest.h>

namespace vela::platform {

namespace {

TEST(LinuxJsonWritingTest, ALayoutIsFollowed) {
    const LinuxJsonWriting json;
    const Value value(Dictionary{{"b", true}, {"a", 1.0}});
    EXPECT_EQ(*json.write(value, JsonLayout::Compact), R"({"b":true,"a":1.0})");
    EXPECT_EQ(*json.write(value, JsonLayout::Pretty), "{\n  \"b\": true,\n  \"a\": 1.0\n}");
}

} // namespace

} // namespace vela::platform
