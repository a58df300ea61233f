#include "cli/TimeArgument.h"
#include "testing/ManualClock.h"

#include <gtest/gtest.h>

namespace vela {
namespace {

using namespace std::chrono_literals;

class TimeArgumentTest : public ::testing::Test {
protected:
    std::optional<double> read(std::string_view text) { return readTime(text, clock_); }
    double now() { return std::chrono::duration<double>(clock_.now().time_since_epoch()).count(); }
    testing::ManualClock clock_;
};

TEST_F(TimeArgumentTest, ATimeAgoIsBeforeNow) {
    EXPECT_EQ(read("90s"), now() - 90);
    EXPECT_EQ(read("10m"), now() - 600);
    EXPECT_EQ(read("1.5h"), now() - 5400);
    EXPECT_EQ(read("2d"), now() - 172800);
}

TEST_F(TimeArgumentTest, ANumberIsSecondsSince1970) { EXPECT_EQ(read("1700000000.5"), 1700000000.5); }

TEST_F(TimeArgumentTest, ADateIsInLocalTime) {
    clock_.setLocalOffset(3600s);
    EXPECT_EQ(read("2026-11-21"), 1795219200.0 - 3600);
    EXPECT_EQ(read("2026-11-21T09:30"), 1795219200.0 + 9.5 * 3600 - 3600);
    EXPECT_EQ(read("2026-11-21 09:30:15"), 1795219200.0 + 9.5 * 3600 + 15 - 3600);
}

TEST_F(TimeArgumentTest, AnythingElseIsNoTime) {
    for (const char* text : {"", "s", "-5s", "yesterday", "2026-13-01", "2026-11-31", "2026-11-21T24:00",
                             "2026-11-21T09", "2026-11-21x", "inf", "nan", "2026-1-1"}) {
        EXPECT_EQ(read(text), std::nullopt) << text;
    }
}

TEST_F(TimeArgumentTest, TimesAreShownInLocalTime) {
    clock_.setLocalOffset(3600s);
    EXPECT_EQ(localTimeText(1795219200.25, clock_), "2026-11-21 01:00:00.250");
    EXPECT_EQ(localTimeText(0, clock_), "1970-01-01 01:00:00.000");
}

} // namespace
} // namespace vela
