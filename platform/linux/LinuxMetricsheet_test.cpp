// Performance-data files, byte for byte, and how they come to stand where they belong.
#include "platform/linux/LinuxFileSystem.h"
#include "platform/linux/LinuxMetricsheet.h"
#include "testing/FakeFileSystem.h"
#include "testing/TemporaryFolder.h"

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <sys/stat.h>
#include <vector>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr const char* kHeading = "{\"format\":\"metricsheet\",\"writer\":\"VelaReporting\",\"version\":4}\n";

class LinuxMetricsheetTest : public ::testing::Test {
protected:
    std::unique_ptr<MetricsheetWriter> open() { return metricsheet_.openWriter(path_, "VelaReporting", 4); }
    std::string content() const { return *files_.readFile(path_, std::size_t{64} << 20U); }
    std::vector<std::string> names() const {
        std::vector<std::string> names;
        for (const auto& entry : std::filesystem::directory_iterator(folder_.path())) {
            names.push_back(entry.path().filename());
        }
        return names;
    }

    const testing::TemporaryFolder folder_;
    const std::string path_ = folder_ / "tracing_results.msj";
    LinuxFileSystem files_;
    LinuxMetricsheet metricsheet_{files_};
};

TEST_F(LinuxMetricsheetTest, ValuesStandInTheOrderWritten) {
    const auto writer = open();
    writer->newValue("open", 123, kMetricsheetUnitNanoseconds);
    writer->newValue("close", 0, kMetricsheetUnitNanoseconds);
    writer->newValue("open", 12345678, kMetricsheetUnitNanoseconds);
    ASSERT_TRUE(writer->close());
    EXPECT_EQ(content(), std::string(kHeading) + "{\"name\":\"open\",\"value\":123.0,\"unit\":\"nanoseconds\"}\n"
                                                 "{\"name\":\"close\",\"value\":0.0,\"unit\":\"nanoseconds\"}\n"
                                                 "{\"name\":\"open\",\"value\":12345678.0,\"unit\":\"nanoseconds\"}\n");
}

TEST_F(LinuxMetricsheetTest, WithoutValuesThereIsTheFirstLine) {
    ASSERT_TRUE(open()->close());
    EXPECT_EQ(content(), kHeading);
}

TEST_F(LinuxMetricsheetTest, ValuesAreTheFewestDigitsThatReadBack) {
    const auto writer = open();
    for (const double value : {0.5, 9007199254740993.0, 18446744073709551516.0, 1e-7}) {
        writer->newValue("v", value, "u");
    }
    ASSERT_TRUE(writer->close());
    EXPECT_EQ(content(), std::string(kHeading) + "{\"name\":\"v\",\"value\":0.5,\"unit\":\"u\"}\n"
                                                 "{\"name\":\"v\",\"value\":9007199254740992.0,\"unit\":\"u\"}\n"
                                                 "{\"name\":\"v\",\"value\":1.8446744073709552e+19,\"unit\":\"u\"}\n"
                                                 "{\"name\":\"v\",\"value\":1e-07,\"unit\":\"u\"}\n");
}

TEST_F(LinuxMetricsheetTest, NamesAreEscaped) {
    const auto writer = metricsheet_.openWriter(path_, "a \"writer\"", 4);
    writer->newValue("a \"b\" \\ \n\x01 \xC3\xA4 \xFF", 1, "\t");
    ASSERT_TRUE(writer->close());
    EXPECT_EQ(content(), "{\"format\":\"metricsheet\",\"writer\":\"a \\\"writer\\\"\",\"version\":4}\n"
                         "{\"name\":\"a \\\"b\\\" \\\\ \\n\\u0001 \xC3\xA4 \xEF\xBF\xBD\",\"value\":1.0,"
                         "\"unit\":\"\\t\"}\n");
}

TEST_F(LinuxMetricsheetTest, ANewFileReplacesTheOldOne) {
    ASSERT_TRUE(open()->close());
    const auto writer = open();
    writer->newValue("v", 1, "u");
    EXPECT_EQ(content(), kHeading) << "the old one stands until the new one is closed";
    ASSERT_TRUE(writer->close());
    EXPECT_EQ(content(), std::string(kHeading) + "{\"name\":\"v\",\"value\":1.0,\"unit\":\"u\"}\n");
    EXPECT_THAT(names(), ElementsAre("tracing_results.msj"));
}

TEST_F(LinuxMetricsheetTest, AWriterThatIsNotClosedLeavesNothing) {
    open()->newValue("v", 1, "u");
    EXPECT_THAT(names(), IsEmpty());
}

TEST_F(LinuxMetricsheetTest, EverybodyMayReadIt) {
    const mode_t umaskBefore = umask(0077);
    ASSERT_TRUE(open()->close());
    umask(umaskBefore);
    struct stat status {};
    ASSERT_EQ(stat(path_.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0644U);
}

TEST_F(LinuxMetricsheetTest, ALinkInTheFilesPlaceIsReplacedAndNotFollowed) {
    const testing::TemporaryFolder elsewhere;
    std::filesystem::create_symlink(elsewhere / "victim", path_);
    ASSERT_TRUE(open()->close());
    EXPECT_FALSE(std::filesystem::exists(elsewhere / "victim"));
    EXPECT_FALSE(std::filesystem::is_symlink(path_));
    EXPECT_EQ(content(), kHeading);
}

TEST_F(LinuxMetricsheetTest, AFolderThatIsNotThereCannotBeWrittenTo) {
    EXPECT_EQ(metricsheet_.openWriter(folder_ / "missing/results.msj", "VelaReporting", 4), nullptr);
    EXPECT_EQ(metricsheet_.openWriter("", "VelaReporting", 4), nullptr);
}

TEST_F(LinuxMetricsheetTest, AFolderInTheFilesPlaceFailsAtTheClose) {
    std::filesystem::create_directory(path_);
    auto writer = open();
    ASSERT_NE(writer, nullptr);
    const auto closed = writer->close();
    writer.reset();
    ASSERT_FALSE(closed);
    EXPECT_EQ(closed.failure().code, EISDIR);
    EXPECT_THAT(names(), ElementsAre("tracing_results.msj"));
}

TEST(LinuxMetricsheetFailureTest, ADiskThatIsFullFailsAtTheClose) {
    testing::FakeFileSystem files;
    ASSERT_TRUE(files.createDirectories("/t", 0777));
    LinuxMetricsheet metricsheet(files);
    const auto writer = metricsheet.openWriter("/t/r.msj", "VelaReporting", 4);
    files.failOn("/t/r.msj", ENOSPC);
    EXPECT_EQ(writer->close().failure().description, "write /t/r.msj: No space left on device");
    EXPECT_EQ(metricsheet.openWriter("/t/r.msj", "VelaReporting", 4), nullptr);
}

TEST(LinuxMetricsheetFailureTest, LongFilesAreWrittenInPieces) {
    testing::FakeFileSystem files;
    ASSERT_TRUE(files.createDirectories("/t", 0777));
    LinuxMetricsheet metricsheet(files);
    const auto writer = metricsheet.openWriter("/t/r.msj", "VelaReporting", 4);
    for (int i = 0; i < 100'000; ++i) {
        writer->newValue("a name of some length", i, kMetricsheetUnitNanoseconds);
    }
    ASSERT_TRUE(writer->close());
    EXPECT_GT(files.contentOf("/t/r.msj")->size(), 6'000'000U);
    EXPECT_LT(files.longestPiece(), 1'100'000U);
}

} // namespace

} // namespace vela::platform
