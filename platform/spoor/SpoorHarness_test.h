// A LinuxSpoor for tests: with a runtime folder and, where the kernel's trace buffer is used, instances of this
// process's own, so that tests that run beside each other do not meet.
#pragma once

#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "platform/spoor/LinuxSpoor.h"
#include "testing/RunningProgram.h"
#include "testing/TemporaryFolder.h"

#include <cstdlib>
#include <fstream>
#include <functional>
#include <gtest/gtest.h>
#include <memory>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

namespace vela::platform {

enum class SpoorWay : std::uint8_t { Rings, Ftrace };

inline const char* const kTraceFolder = "/sys/kernel/tracing";

/// Why the kernel's trace buffer cannot be tested here; empty where it can.
inline std::string reasonAgainstFtrace() {
    const std::string probe = std::string(kTraceFolder) + "/instances/vela-probe-" + std::to_string(getpid());
    if (mkdir(probe.c_str(), 0750) != 0) {
        return std::string("no trace instance can be made in ") + kTraceFolder;
    }
    rmdir(probe.c_str());
    return {};
}

inline std::string testInstanceName() { return "vela-test-" + std::to_string(getpid()); }

inline LinuxSpoorOptions spoorOptions(const std::string& runtimeFolder, SpoorWay way) {
    LinuxSpoorOptions options;
    options.runtimeFolder = runtimeFolder;
    options.instanceName = testInstanceName();
    if (way == SpoorWay::Rings) {
        options.traceFolders.clear();
    } else {
        options.traceFolders = {kTraceFolder};
    }
    return options;
}

/// Skips its test where `Way` cannot be tested.
template <SpoorWay Way>
class SpoorHarness {
public:
    SpoorHarness() : spoor_(std::make_unique<LinuxSpoor>(spoorOptions(folder_.path(), Way), clock_)) { skip(); }

    LinuxSpoor& spoor() { return *spoor_; }
    SerialQueue& queue() { return *queue_; }
    const std::string& runtimeFolder() const { return folder_.path(); }
    const Clock& clock() const { return clock_; }

    static bool waitFor(const std::function<bool()>& condition) { return testing::waitUntil(condition); }
    void settle() {
        // The reader has gone through its work once more when this session has completed, and the queue with it.
        const auto probe = spoor_->createSession();
        std::atomic<bool> done = false;
        probe->setCompletionHandler([&] { done = true; });
        probe->start(*queue_);
        probe->end();
        EXPECT_TRUE(waitFor([&] { return done.load(); }));
        std::atomic<bool> flushed = false;
        queue_->post([&] { flushed = true; });
        EXPECT_TRUE(waitFor([&] { return flushed.load(); }));
    }
    bool makeStartsFail() {
        std::ofstream(folder_ / "file") << "x";
        spoor_ = std::make_unique<LinuxSpoor>(spoorOptions(folder_ / "file", Way), clock_);
        return true;
    }

private:
    static void skip() {
        if (Way == SpoorWay::Ftrace && !reasonAgainstFtrace().empty()) {
            GTEST_SKIP() << reasonAgainstFtrace();
        }
    }

    const testing::TemporaryFolder folder_;
    const LinuxClock clock_;
    LinuxWorkQueues queues_;
    const std::unique_ptr<SerialQueue> queue_ = queues_.makeSerialQueue("spoor.test", QualityOfService::Default);
    std::unique_ptr<LinuxSpoor> spoor_;
};

using RingHarness = SpoorHarness<SpoorWay::Rings>;
using FtraceHarness = SpoorHarness<SpoorWay::Ftrace>;
using BothWays = ::testing::Types<RingHarness, FtraceHarness>;

/// A code for tests.
inline constexpr std::uint32_t kTestCode = 0x21040100;

} // namespace vela::platform
