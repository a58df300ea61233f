#include "cli/MessageTimes.h"
#include "common/values/Json.h"
#include "testing/ManualClock.h"

#include <cmath>
#include <gtest/gtest.h>

namespace vela {
namespace {

using namespace std::chrono_literals;

class MessageTimesTest : public ::testing::Test {
protected:
    std::string stamped(std::string_view operation, std::vector<Value> arguments) {
        const platform::MonotonicTime start = clock_.monotonicNow();
        clock_.advance(1500ms);
        addMessageTimes(*findOperation(operation), arguments, clock_, start);
        return jsonText(arguments[0]);
    }
    testing::ManualClock clock_;
};

TEST_F(MessageTimesTest, AMessageGetsTheTimesThatItHasNot) {
    const std::string text =
        stamped("sendMessage", {Dictionary{{"a", 1}, {"velareporting_timestamp", 5.5}, {"systemuptime_sec", 7}}, 4, 1});
    EXPECT_EQ(text, R"({"a":1,"velareporting_timestamp":5.5,"systemuptime_sec":7,"processuptime_ms":1500})");
}

TEST_F(MessageTimesTest, TheTimesAreThoseOfTheClock) {
    std::vector<Value> arguments{Dictionary(), 4, 1};
    addMessageTimes(*findOperation("sendMessage"), arguments, clock_, clock_.monotonicNow());
    const Dictionary message = arguments[0].ref().dictionary();
    using Seconds = std::chrono::duration<double>;
    EXPECT_EQ(message.find("velareporting_timestamp"), Value(Seconds(clock_.now().time_since_epoch()).count()));
    EXPECT_EQ(message.find("systemuptime_sec"), Value(std::lround(Seconds(clock_.systemUptime()).count())));
}

TEST_F(MessageTimesTest, OnlyMessagesGetThem) { EXPECT_EQ(stamped("setConfiguration", {Dictionary(), 42}), "{}"); }

} // namespace
} // namespace vela
