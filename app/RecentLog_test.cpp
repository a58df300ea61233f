#include "app/RecentLog.h"
#include "common/VelaReportingLogCategories.h"
#include "testing/CapturingLog.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela {
namespace {

using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::SizeIs;

class CountingSink final : public platform::LogSink {
public:
    explicit CountingSink(int& lines) : lines_(lines) {}
    void write(const platform::LogRecord&) override { ++lines_; }
    std::uint64_t lost() const override { return 3; }

private:
    int& lines_;
};

class RecentLogTest : public ::testing::Test {
protected:
    void write(std::string_view text) {
        log_.write({platform::LogLevel::Info, "com.orvex.vela", "velars", "Source", "Source.cpp", 1, text, text, {}});
    }
    int passed_ = 0;
    RecentLog log_{std::make_unique<CountingSink>(passed_)};
};

TEST_F(RecentLogTest, LinesAreKeptAndPassedOn) {
    write("one");
    write("two");
    EXPECT_THAT(log_.lines(), ElementsAre("info velars one", "info velars two"));
    EXPECT_EQ(passed_, 2);
    EXPECT_EQ(log_.lost(), 3U);
}

TEST_F(RecentLogTest, TheOldestLinesGoFirst) {
    for (std::size_t number = 0; number <= RecentLog::kMostLines; ++number) {
        write("line " + std::to_string(number));
    }
    EXPECT_THAT(log_.lines(), SizeIs(500));
    EXPECT_THAT(log_.lines().front(), EndsWith("line 1"));
}

TEST_F(RecentLogTest, LongLinesAreBoundedByTheirBytes) {
    const std::string line(100 * 1024, 'x');
    write(line);
    write(line);
    write(line);
    EXPECT_THAT(log_.lines(), SizeIs(2));
}

} // namespace
} // namespace vela
