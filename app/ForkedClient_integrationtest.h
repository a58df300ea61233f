// A client process of the running service, forked from the test, which must have one thread only. It is killed with the
// object, wherever it stands then.
#pragma once

#include <csignal>
#include <cstdlib>
#include <functional>
#include <gtest/gtest.h>
#include <string>
#include <string_view>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>
#include <utility>

namespace vela {

class ForkedClient {
public:
    /// Tells the test a line from within the process.
    using Report = std::function<void(std::string_view)>;

    /// Runs `work` in the process, which stays when that returns; a `work` whose connections shall stay does not
    /// return.
    explicit ForkedClient(const std::function<void(const Report& report)>& work) {
        int ends[2] = {-1, -1};
        EXPECT_EQ(pipe(ends), 0);
        pid_ = fork();
        if (pid_ == 0) {
            prctl(PR_SET_PDEATHSIG, SIGKILL);
            static_cast<void>(std::signal(SIGPIPE, SIG_IGN));
            work([end = ends[1]](std::string_view text) {
                const std::string line = std::string(text) + '\n';
                if (write(end, line.data(), line.size()) < 0) {
                    std::_Exit(EXIT_FAILURE);
                }
            });
            stay();
        }
        EXPECT_GT(pid_, 0);
        close(ends[1]);
        reports_ = ends[0];
    }
    ForkedClient(ForkedClient&& other) noexcept
        : pid_(std::exchange(other.pid_, -1)),
          reports_(std::exchange(other.reports_, -1)) {}
    ForkedClient& operator=(ForkedClient&&) = delete;
    ForkedClient(const ForkedClient&) = delete;
    ForkedClient& operator=(const ForkedClient&) = delete;
    ~ForkedClient() { kill(); }

    /// For `work`: waits to be killed.
    [[noreturn]] static void stay() {
        for (;;) {
            pause();
        }
    }

    /// Waits for the next line; empty when the process ended without one.
    std::string report() const {
        std::string line;
        char letter = 0;
        while (read(reports_, &letter, 1) == 1 && letter != '\n') {
            line += letter;
        }
        return line;
    }

    /// As kill -9 does. The process is gone when this returns, and so are its sockets.
    void kill() {
        if (pid_ > 0) {
            ::kill(pid_, SIGKILL);
            waitpid(std::exchange(pid_, -1), nullptr, 0);
            close(reports_);
        }
    }

private:
    pid_t pid_ = -1;
    int reports_ = -1;
};

} // namespace vela
