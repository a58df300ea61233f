// A stand-in for perf, a script of the shell whose parts a test chooses, and what tests of traces look at.
#pragma once

#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "platform/perf/PerfProbe.h"
#include "testing/RecordingProbeDelegate.h"
#include "testing/RunningProgram.h"
#include "testing/TemporaryFolder.h"

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstddef>
#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <memory>
#include <sstream>
#include <string>
#include <sys/stat.h>
#include <sys/wait.h>
#include <system_error>
#include <unistd.h>
#include <utility>
#include <vector>

namespace vela::platform::perf {

inline std::string contentOf(const std::string& path) {
    std::ostringstream text;
    text << std::ifstream(path).rdbuf();
    return text.str();
}

/// The names in a folder, in order.
inline std::vector<std::string> namesIn(const std::string& folder) {
    std::vector<std::string> names;
    std::error_code ignored;
    for (const auto& entry : std::filesystem::directory_iterator(folder, ignored)) {
        names.push_back(entry.path().filename().string());
    }
    std::sort(names.begin(), names.end());
    return names;
}

/// Whether a process has ended; one that nobody has asked after yet has, too.
inline bool isGone(const std::string& pid) {
    const std::string status = contentOf("/proc/" + pid + "/stat");
    const std::size_t nameEnd = status.rfind(')');
    return nameEnd == std::string::npos || status.compare(nameEnd, 3, ") Z") == 0;
}

/// What each command makes the script do. It has `$path`, the file to write, and `answer`.
struct FakePerfScript {
    std::string before = {};
    std::string enable = "answer";
    std::string disable = "answer";
    std::string stop = "printf profile >\"$path\"; answer; exit 0";
};

/// Writes the script at `program`. Whoever runs it leaves `<program>.pid` and, one a line, `<program>.arguments`.
inline void writeFakePerf(const std::string& program, const FakePerfScript& script, mode_t permissions = 0755) {
    std::ofstream(program) << "#!/bin/sh\n"
                              "answer() { printf 'ack\\n\\0' >&4; }\n"
                              "printf '%s\\n' \"$@\" >\"$0.arguments\"\n"
                              "echo $$ >\"$0.pid\"\n"
                              "for word; do [ \"$last\" = -o ] && path=$word; last=$word; done\n"
                           << script.before
                           << "\n"
                              "while read -r command <&3; do\n"
                              "  case $command in\n"
                              "  enable) "
                           << script.enable << " ;;\n  disable) " << script.disable << " ;;\n  stop) " << script.stop
                           << " ;;\n  esac\ndone\n";
    chmod(program.c_str(), permissions);
}

/// Of the script that runs or ran last; empty where none did.
inline std::string pidOf(const std::string& program) {
    const std::string text = contentOf(program + ".pid");
    return text.substr(0, text.find('\n'));
}

/// A service that traces until it is killed, in a process of its own. Made while the test has one thread.
class ServiceProcess {
public:
    explicit ServiceProcess(const PerfProbe::Options& options) : sign_(options.program + ".traces"), pid_(fork()) {
        if (pid_ == 0) {
            trace(options, sign_);
        }
    }
    ~ServiceProcess() { killAndWait(); }
    ServiceProcess(const ServiceProcess&) = delete;
    ServiceProcess& operator=(const ServiceProcess&) = delete;

    bool waitForTrace() const {
        return testing::waitUntil([this] { return std::filesystem::exists(sign_); });
    }
    void killAndWait() {
        if (pid_ > 0) {
            kill(pid_, SIGKILL);
            waitpid(pid_, nullptr, 0);
        }
        pid_ = -1;
    }

private:
    [[noreturn]] static void trace(const PerfProbe::Options& options, const std::string& sign) {
        const LinuxClock clock;
        LinuxWorkQueues queues;
        PerfProbe probe(options, clock, queues.background());
        const auto session = probe.createProbeTraceSession(*probe.makeProbeTraceConfig(1));
        const auto delegate = std::make_shared<testing::RecordingProbeDelegate>();
        session->setDelegate(delegate);
        session->startProbeTrace();
        testing::waitUntil([&] { return delegate->was("start"); });
        std::ofstream(sign).flush();
        while (true) {
            pause();
        }
    }

    const std::string sign_; ///< a file that is made when it traces
    pid_t pid_;
};

/// A probe with a stand-in for perf, and one session of it.
class FakePerfTest : public ::testing::Test {
protected:
    using Delegate = std::shared_ptr<testing::RecordingProbeDelegate>;

    std::string program() const { return folder_ / "perf"; }
    std::string results() const { return folder_ / "traces"; }
    std::string pid() const { return pidOf(program()); }

    void makeSession(const FakePerfScript& script) {
        writeFakePerf(program(), script);
        makeSession();
    }
    void makeSession() {
        PerfProbe probe(options_, clock_, queues_.background());
        session_ = probe.createProbeTraceSession(*probe.makeProbeTraceConfig(1));
        session_->setDelegate(delegate_);
    }
    bool waitForCall(const std::string& call) const {
        return testing::waitUntil([&] { return delegate_->was(call); });
    }
    bool waitForCompletions(std::ptrdiff_t count) const {
        return testing::waitUntil([&] { return delegate_->completions() >= count; });
    }
    /// Of each call that had an error.
    std::vector<std::string> errorTexts() const {
        std::vector<std::string> texts;
        for (const Failure& failure : delegate_->failures()) {
            texts.push_back(failure.description);
        }
        return texts;
    }
    /// A whole trace that is stopped when it began or did not.
    void trace(const FakePerfScript& script) {
        makeSession(script);
        trace();
    }
    void trace() {
        session_->startProbeTrace();
        session_->stopProbeTrace();
        ASSERT_TRUE(waitForCompletions(1));
    }

    const testing::TemporaryFolder folder_;
    LinuxClock clock_;
    LinuxWorkQueues queues_;
    PerfProbe::Options options_{.folder = results(),
                                .program = program(),
                                .startLimit = std::chrono::minutes(1),
                                .stopLimit = std::chrono::minutes(1),
                                .endLimit = std::chrono::minutes(1)};
    const Delegate delegate_ = std::make_shared<testing::RecordingProbeDelegate>();
    std::shared_ptr<ProbeTraceSession> session_;
};

} // namespace vela::platform::perf
