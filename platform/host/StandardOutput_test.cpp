#include "platform/host/StandardOutput.h"

#include <array>
#include <csignal>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sstream>
#include <thread>
#include <unistd.h>

namespace vela::platform {
namespace {

class StandardOutputTest : public ::testing::Test {
protected:
    void SetUp() override {
        static_cast<void>(std::signal(SIGPIPE, SIG_IGN)); // it cannot fail for a signal that exists
        ASSERT_EQ(pipe2(ends_.data(), O_CLOEXEC), 0);
    }
    void TearDown() override {
        closeReader();
        close(ends_[1]);
    }
    int writer() const { return ends_[1]; }
    void closeReader() {
        if (ends_[0] >= 0) {
            close(ends_[0]);
            ends_[0] = -1;
        }
    }
    /// What stands in the pipe.
    std::string taken() const {
        std::array<char, 4096> bytes{};
        const int flags = fcntl(ends_[0], F_GETFL);
        fcntl(ends_[0], F_SETFL, flags | O_NONBLOCK);
        const ssize_t count = read(ends_[0], bytes.data(), bytes.size());
        return count > 0 ? std::string(bytes.data(), static_cast<std::size_t>(count)) : "";
    }

    std::array<int, 2> ends_{-1, -1};
    std::ostringstream error_;
};

TEST_F(StandardOutputTest, WhatIsPrintedIsWrittenAtTheEnd) {
    StandardOutput output(writer());
    output.stream() << "line " << 1 << '\n';
    EXPECT_EQ(taken(), "");
    EXPECT_TRUE(output.finish("program", error_));
    EXPECT_EQ(taken(), "line 1\n");
    EXPECT_EQ(error_.str(), "");
}

TEST_F(StandardOutputTest, AFlushWrites) {
    StandardOutput output(writer());
    output.stream() << "a" << std::flush;
    EXPECT_EQ(taken(), "a");
    EXPECT_TRUE(output.stream());
}

TEST_F(StandardOutputTest, AFullDeviceIsNamedWithTheReason) {
    const int full = open("/dev/full", O_WRONLY | O_CLOEXEC);
    StandardOutput output(full);
    output.stream() << "a";
    EXPECT_FALSE(output.finish("program", error_));
    EXPECT_EQ(error_.str(), "program: standard output cannot be written: No space left on device\n");
    EXPECT_FALSE(output.stream());
    close(full);
}

TEST_F(StandardOutputTest, TheFirstReasonIsKept) {
    const int full = open("/dev/full", O_WRONLY | O_CLOEXEC);
    StandardOutput output(full);
    output.stream() << std::string(100'000, 'x');
    EXPECT_FALSE(output.stream());
    close(full);
    output.stream().clear();
    output.stream() << "y";
    EXPECT_FALSE(output.finish("program", error_));
    EXPECT_EQ(error_.str(), "program: standard output cannot be written: No space left on device\n");
}

TEST_F(StandardOutputTest, ADescriptorThatIsOnlyReadIsAFailure) {
    const int nothing = open("/dev/null", O_RDONLY | O_CLOEXEC);
    StandardOutput output(nothing);
    output.stream() << "a";
    EXPECT_FALSE(output.finish("program", error_));
    EXPECT_EQ(error_.str(), "program: standard output cannot be written: Bad file descriptor\n");
    close(nothing);
}

TEST_F(StandardOutputTest, NothingPrintedIsNoFailure) {
    const int full = open("/dev/full", O_WRONLY | O_CLOEXEC);
    StandardOutput output(full);
    EXPECT_TRUE(output.finish("program", error_));
    EXPECT_EQ(error_.str(), "");
    close(full);
}

TEST_F(StandardOutputTest, AReaderThatHasGoneIsSeenAndFailsSilently) {
    StandardOutput output(writer());
    EXPECT_FALSE(output.isReaderGone());
    closeReader();
    EXPECT_TRUE(output.isReaderGone());
    output.stream() << "a";
    EXPECT_FALSE(output.finish("program", error_));
    EXPECT_EQ(error_.str(), "");
}

TEST_F(StandardOutputTest, AFileHasNoReaderToMiss) {
    const int nothing = open("/dev/null", O_WRONLY | O_CLOEXEC);
    EXPECT_FALSE(StandardOutput(nothing).isReaderGone());
    close(nothing);
}

TEST_F(StandardOutputTest, APipeThatDoesNotBlockIsWaitedFor) {
    constexpr std::size_t kBytes = 1'000'000;
    fcntl(writer(), F_SETFL, fcntl(writer(), F_GETFL) | O_NONBLOCK);
    std::size_t received = 0;
    std::thread reader([this, &received] {
        std::array<char, 4096> bytes{};
        while (received < kBytes) {
            const ssize_t count = read(ends_[0], bytes.data(), bytes.size());
            if (count <= 0) {
                return;
            }
            received += static_cast<std::size_t>(count);
        }
    });
    StandardOutput output(writer());
    output.stream() << std::string(kBytes, 'x');
    EXPECT_TRUE(output.finish("program", error_));
    reader.join();
    EXPECT_EQ(received, kBytes);
}

} // namespace
} // namespace vela::platform
