// A program that runs beside its test: started, waited for, ended. What it prints goes to two files.
#pragma once

#include "testing/TemporaryFolder.h"

#include <cerrno>
#include <chrono>
#include <csignal>
#include <fcntl.h>
#include <fstream>
#include <sstream>
#include <string>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace vela::testing {

/// Asks `holds` again and again until it answers true (true) or half a minute has passed (false).
template <class Condition>
bool waitUntil(Condition holds) {
    constexpr std::chrono::seconds kPatience{30};
    constexpr std::chrono::milliseconds kBetween{2};
    const auto deadline = std::chrono::steady_clock::now() + kPatience;
    while (!holds()) {
        if (std::chrono::steady_clock::now() > deadline) {
            return false;
        }
        std::this_thread::sleep_for(kBetween);
    }
    return true;
}

class RunningProgram {
public:
    /// `arguments` begins with the program's file; `environment` holds "NAME=value" texts and nothing else is
    /// inherited.
    RunningProgram(const std::vector<std::string>& arguments, const std::vector<std::string>& environment) {
        const std::string out = folder_ / "out";
        const std::string error = folder_ / "error";
        std::vector<char*> argumentWords = wordsOf(arguments);
        std::vector<char*> environmentWords = wordsOf(environment);
        pid_ = fork(); // NOLINT(cppcoreguidelines-prefer-member-initializer): when everything is prepared
        if (pid_ == 0) {
            constexpr int kPermissions = 0644;
            const int outFile = open(out.c_str(), O_WRONLY | O_CREAT | O_APPEND, kPermissions);
            const int errorFile = open(error.c_str(), O_WRONLY | O_CREAT | O_APPEND, kPermissions);
            const int nothing = open("/dev/null", O_RDONLY);
            dup2(nothing, STDIN_FILENO);
            dup2(outFile, STDOUT_FILENO);
            dup2(errorFile, STDERR_FILENO);
            execve(argumentWords[0], argumentWords.data(), environmentWords.data());
            _exit(127);
        }
    }
    ~RunningProgram() {
        if (pid_ > 0) {
            kill(pid_, SIGKILL);
            waitForEnd();
        }
    }
    RunningProgram(const RunningProgram&) = delete;
    RunningProgram& operator=(const RunningProgram&) = delete;

    pid_t pid() const { return pid_; }
    void signal(int number) const { kill(pid_, number); }
    /// Exit status; 128 and the signal's number for a program that a signal ended.
    int waitForEnd() {
        int status = 0;
        while (waitpid(pid_, &status, 0) < 0 && errno == EINTR) {
        }
        pid_ = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    }
    bool runs() const {
        siginfo_t state{};
        return pid_ > 0 && waitid(P_PID, static_cast<id_t>(pid_), &state, WEXITED | WNOHANG | WNOWAIT) == 0 &&
               state.si_pid == 0;
    }

    std::string out() const { return contentOf(folder_ / "out"); }
    std::string error() const { return contentOf(folder_ / "error"); }

private:
    static std::vector<char*> wordsOf(const std::vector<std::string>& texts) {
        std::vector<char*> words;
        words.reserve(texts.size() + 1);
        for (const std::string& text : texts) {
            words.push_back(const_cast<char*>(text.c_str()));
        }
        words.push_back(nullptr);
        return words;
    }
    static std::string contentOf(const std::string& path) {
        std::ostringstream content;
        content << std::ifstream(path).rdbuf();
        return content.str();
    }

    const TemporaryFolder folder_;
    pid_t pid_ = -1;
};

} // namespace vela::testing
