// Trace parameters files on disk, in the three formats, with the true readers.
#include "common/values/Dictionary.h"
#include "platform/linux/LinuxFileSystem.h"
#include "platform/plist/PropertyListCodec.h"
#include "testing/TemporaryFolder.h"
#include "tracing/TraceParamsParser.h"
#include "tracing/TraceParamsParser_test.h"

#include <filesystem>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

namespace vela {

namespace {

using platform::Identity;
using platform::PropertyListFormat;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

class TraceParamsFileTest : public ::testing::Test {
protected:
    TraceParamsFileTest() { std::filesystem::permissions(folder_.path(), std::filesystem::perms{0755}); }

    TraceParams load(const std::string& name) {
        return std::move(*TraceParamsParser::initWithFileName(name, client_, {fileSystem_, codec_}).loadTraceParams());
    }
    void write(const std::string& name, const std::string& content, std::uint32_t permissions = 0644) {
        ASSERT_TRUE(fileSystem_.writeFileAtomically(folder_ / name, content, permissions));
    }
    TraceParams loadWritten(const std::string& content) {
        write("traces.plist", content);
        return load(folder_ / "traces.plist");
    }
    std::string firstError() const {
        for (const auto& line : log_.lines()) {
            if (line.level == LogLevel::Error) {
                return line.message;
            }
        }
        return {};
    }

    static Value example() {
        const Dictionary interval{{"Name", "open"},
                                  {"Type", "Interval"},
                                  {"SpoorCodeBegin", "0x21040010"},
                                  {"SpoorCodeEnd", 21040014},
                                  {"EventsMatchedBy", "Thread"}};
        const Dictionary impulse{{"Name", "tick"}, {"Type", "Impulse"}, {"SpoorCodeBegin", 4660}};
        return Dictionary{{"Children", Array{Value(Dictionary{{"Name", "Start"},
                                                              {"TraceType", "Milestone"},
                                                              {"IsCritical", true},
                                                              {"Children", Array{interval, impulse}}})}}};
    }

    testing::CapturingLog log_;
    platform::LinuxFileSystem fileSystem_;
    platform::PropertyListCodec codec_;
    const testing::TemporaryFolder folder_;
    Identity client_{geteuid(), getegid(), {}};
};

TEST_F(TraceParamsFileTest, AllFormatsGiveTheSameRecord) {
    for (const auto format : {PropertyListFormat::Xml, PropertyListFormat::Binary, PropertyListFormat::Text}) {
        const TraceParams params = loadWritten(*codec_.write(example(), format));
        EXPECT_EQ(params.name, "Start");
        EXPECT_EQ(params.type, 1);
        EXPECT_THAT(pointsOf(params),
                    ElementsAre("open interval 553910288 553910292 thread", "tick impulse 18016 18016 process"));
    }
    for (const auto& line : log_.lines()) {
        EXPECT_EQ(line.level, LogLevel::Info) << line;
    }
}

TEST_F(TraceParamsFileTest, ARelativeNameIsLookedForInTheCurrentDirectory) {
    const std::filesystem::path before = std::filesystem::current_path();
    write("traces.plist", "{ Children = ({ Name = here; }); }");
    std::filesystem::current_path(folder_.path());
    EXPECT_EQ(load("traces.plist").name, "here");
    std::filesystem::current_path(before);
}

TEST_F(TraceParamsFileTest, AFileOfAnotherUserIsReadAsFarAsItsModeAllows) {
    client_ = {4001, 4101, {}};
    write("open", "{ Children = ({ Name = public; }); }", 0644);
    write("private", "{ Children = ({ Name = secret; }); }", 0600);
    EXPECT_EQ(load(folder_ / "open").name, "public");
    EXPECT_EQ(load(folder_ / "private").name, "");
    EXPECT_EQ(firstError(),
              "Reading from plist file failed with error: open " + (folder_ / "private") + ": Permission denied");
}

TEST_F(TraceParamsFileTest, WhatIsNoRegularFileIsRefusedAtOnce) {
    ASSERT_EQ(mkfifo((folder_ / "fifo").c_str(), 0600), 0);
    for (const std::string& path : {folder_ / "fifo", std::string("/dev/zero"), folder_.path()}) {
        log_.clear();
        EXPECT_EQ(load(path).name, "");
        EXPECT_EQ(firstError(), "Reading from plist file failed with error: read " + path + ": not a regular file");
    }
}

TEST_F(TraceParamsFileTest, AFileThatIsTooLargeIsRefused) {
    EXPECT_EQ(loadWritten(std::string(256 * 1024 + 1, ' ')).name, "");
    EXPECT_THAT(firstError(), HasSubstr("larger than its limit of 262144 bytes"));
}

// Forty objects, each an array that holds the next one twice: a million millions of values in a kilobyte.
TEST_F(TraceParamsFileTest, SharedReferencesDoNotExpand) {
    constexpr int kLevels = 40;
    std::string bytes = "bplist00";
    std::string offsets;
    const auto begin = [&] { offsets += static_cast<char>(bytes.size()); };
    begin();
    bytes += std::string("\xD1\x01\x02", 3); // {Children = the first array}
    begin();
    bytes += "\x58"
             "Children";
    for (int level = 0; level < kLevels; ++level) {
        begin();
        const char next = static_cast<char>(3 + level);
        bytes += std::string{'\xA2', next, next};
    }
    begin();
    bytes += "\x51x";
    const std::size_t table = bytes.size();
    bytes += offsets;
    bytes += std::string("\0\0\0\0\0\0\x01\x01", 8);
    for (const std::uint64_t number : {std::uint64_t{kLevels + 3}, std::uint64_t{0}, std::uint64_t{table}}) {
        bytes += std::string(7, '\0') + static_cast<char>(number);
    }
    EXPECT_EQ(loadWritten(bytes).name, "");
    EXPECT_THAT(firstError(), HasSubstr("values"));
    EXPECT_EQ(log_.lines().back().message, "No valid input found in plist.");
}

TEST_F(TraceParamsFileTest, EveryFileOfTheLargestSizeIsReadInBoundedTime) {
    constexpr std::size_t kBytes = 256 * 1024;
    const auto repeated = [](const std::string& unit, const std::string& before, const std::string& after) {
        std::string text = before;
        while (text.size() + unit.size() + after.size() <= kBytes) {
            text += unit;
        }
        return text + after;
    };
    for (const std::string& content :
         {std::string(kBytes, '('), std::string(kBytes, '{'), std::string(kBytes, '"'), std::string(kBytes, '\\'),
          repeated("{},", "{Children=(", ");}"), repeated("{},", "{Children=({Children=(", ");});}"),
          repeated("\\\"", "{Children=(\"", "\");}"),
          repeated("<string>a b</string>",
                   "<plist><dict><key>Children"
                   "</key><array>",
                   "</array></dict></plist>"),
          repeated("<array>", "<plist>", "")}) {
        log_.clear();
        const TraceParams params = loadWritten(content);
        EXPECT_LE(params.dataParams.size(), 65536U);
    }
}

} // namespace

} // namespace vela
