#include "platform/linux/FileDescriptor.h"
#include "platform/linux/StandardErrorLog.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <map>
#include <string>
#include <thread>
#include <vector>

namespace vela::platform {

namespace {

constexpr std::size_t kEverything = 64 * 1024 * 1024;

struct Pipe {
    explicit Pipe(int flags = 0) {
        std::array<int, 2> ends{};
        EXPECT_EQ(pipe2(ends.data(), O_CLOEXEC | flags), 0);
        reader = FileDescriptor(ends[0]);
        writer = FileDescriptor(ends[1]);
    }
    /// Everything that was written; no more can be.
    std::string content() {
        writer = FileDescriptor();
        std::string bytes;
        EXPECT_TRUE(readToEnd(reader, bytes, kEverything));
        return bytes;
    }

    FileDescriptor reader;
    FileDescriptor writer;
};

LogRecord recordOf(LogLevel level, std::string_view text) {
    return {.level = level,
            .subsystem = "com.orvex.vela",
            .category = "velarr",
            .sourceName = "VelaReportingSession",
            .sourceFile = "session/VelaReportingSession.cpp",
            .line = 42,
            .text = text,
            .message = text,
            .reporter = std::nullopt};
}

void writeEachLevel(StandardErrorLog& log) {
    for (const LogLevel level : {LogLevel::Debug, LogLevel::Info, LogLevel::Default, LogLevel::Error}) {
        log.write(recordOf(level, "text"));
    }
}

TEST(StandardErrorLogTest, ALineBeginsWithItsLevelAndCategory) {
    Pipe pipe;
    StandardErrorLog log(pipe.writer.get());
    writeEachLevel(log);
    EXPECT_EQ(pipe.content(), "debug velarr text\ninfo velarr text\ndefault velarr text\nerror velarr text\n");
    EXPECT_EQ(log.lost(), 0U);
}

TEST(StandardErrorLogTest, AServiceManagerIsToldThePriority) {
    Pipe pipe;
    StandardErrorLog log(pipe.writer.get(), StandardErrorLog::Style::ServiceManager);
    writeEachLevel(log);
    EXPECT_EQ(pipe.content(), "<7>velarr text\n<6>velarr text\n<5>velarr text\n<3>velarr text\n");
}

TEST(StandardErrorLogTest, ForAServiceManagerEveryLineOfAMessageHasThePriority) {
    Pipe pipe;
    StandardErrorLog log(pipe.writer.get(), StandardErrorLog::Style::ServiceManager);
    log.write(recordOf(LogLevel::Error, "first\nsecond"));
    EXPECT_EQ(pipe.content(), "<3>velarr first\n<3>second\n");
}

TEST(StandardErrorLogTest, LargeLinesOfManyThreadsDoNotMix) {
    Pipe pipe;
    StandardErrorLog log(pipe.writer.get());
    // Above PIPE_BUF, so that the pipe itself would mix them, and above the pipe's room.
    constexpr std::size_t kBytes = 100000;
    constexpr int kLines = 20;
    std::string content;
    std::thread reader([&pipe, &content] { EXPECT_TRUE(readToEnd(pipe.reader, content, kEverything)); });
    std::vector<std::thread> writers;
    for (const char letter : {'a', 'b', 'c', 'd'}) {
        writers.emplace_back([&log, letter] {
            for (int line = 0; line < kLines; ++line) {
                log.write(recordOf(LogLevel::Info, std::string(kBytes, letter)));
            }
        });
    }
    for (std::thread& writer : writers) {
        writer.join();
    }
    pipe.writer = FileDescriptor();
    reader.join();
    std::map<std::string, int> lines;
    for (std::size_t begin = 0; begin < content.size();) {
        const std::size_t end = content.find('\n', begin);
        ASSERT_NE(end, std::string::npos);
        ++lines[content.substr(begin, end - begin)];
        begin = end + 1;
    }
    EXPECT_EQ(lines.size(), 4U);
    for (const char letter : {'a', 'b', 'c', 'd'}) {
        EXPECT_EQ(lines["info velarr " + std::string(kBytes, letter)], kLines);
    }
}

TEST(StandardErrorLogTest, WhatCannotBeWrittenIsCounted) {
    Pipe pipe;
    StandardErrorLog log(pipe.reader.get());
    log.write(recordOf(LogLevel::Error, "text"));
    log.write(recordOf(LogLevel::Error, "text"));
    EXPECT_EQ(log.lost(), 2U);
}

TEST(StandardErrorLogTest, AFullPipeThatDoesNotBlockLosesLinesAndRecovers) {
    Pipe pipe(O_NONBLOCK);
    StandardErrorLog log(pipe.writer.get());
    const auto room = static_cast<std::size_t>(fcntl(pipe.writer.get(), F_GETPIPE_SZ));
    const std::string large(room, 'x');
    log.write(recordOf(LogLevel::Info, large)); // fits in part
    EXPECT_EQ(log.lost(), 1U);
    log.write(recordOf(LogLevel::Info, "full"));
    EXPECT_EQ(log.lost(), 2U);
    std::string part(room + 1, '\0');
    ASSERT_EQ(read(pipe.reader.get(), part.data(), part.size()), static_cast<ssize_t>(room));
    EXPECT_TRUE(part.starts_with("info velarr xxx"));
    log.write(recordOf(LogLevel::Error, "after"));
    log.write(recordOf(LogLevel::Error, "and after"));
    EXPECT_EQ(pipe.content(), "\nerror velarr after\nerror velarr and after\n");
    EXPECT_EQ(log.lost(), 2U);
}

} // namespace

} // namespace vela::platform
