// A service's side of the kernel trace facility, for tests of emission through the library. It has rings only, and a
// runtime folder that the library finds in the environment: one for the process, as the library's emitter is.
#pragma once

#include "platform/Mutex.h"
#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "platform/spoor/LinuxSpoor.h"
#include "testing/RunningProgram.h"
#include "testing/TemporaryFolder.h"

#include <atomic>
#include <cstdlib>
#include <gtest/gtest.h>
#include <memory>
#include <string>
#include <vector>

namespace vela::client {

class TraceTest : public ::testing::Test {
public:
    TraceTest() { setenv("VELA_RUNTIME", runtimeFolder().c_str(), 1); } // NOLINT(concurrency-mt-unsafe): no thread yet
    ~TraceTest() override { unsetenv("VELA_RUNTIME"); }                 // NOLINT(concurrency-mt-unsafe)
    TraceTest(const TraceTest&) = delete;
    TraceTest& operator=(const TraceTest&) = delete;

protected:
    static const std::string& runtimeFolder() {
        static const testing::TemporaryFolder folder;
        return folder.path();
    }

    void start(std::uint32_t first = 0x21040000, std::uint32_t last = 0x2104408A) {
        session_ = spoor_.createSession();
        session_->setCompletionHandler([this] { completed_ = true; });
        ASSERT_EQ(session_->eventsRange(first, last, [this](const auto& event) { events_.push_back(event); }), 0);
        ASSERT_EQ(session_->start(*queue_), 0);
    }
    /// The events since the start.
    const std::vector<platform::SpoorEvent>& finish() {
        EXPECT_EQ(session_->end(), 0);
        EXPECT_TRUE(testing::waitUntil([this] { return completed_.load(); }));
        EXPECT_EQ(session_->lostEvents(), 0U);
        return events_;
    }

    const platform::LinuxClock clock_;
    platform::LinuxWorkQueues queues_;
    const std::unique_ptr<platform::SerialQueue> queue_ =
        queues_.makeSerialQueue("trace.test", platform::QualityOfService::Default);
    std::vector<platform::SpoorEvent> events_; ///< the queue's until the completion
    std::atomic<bool> completed_ = false;
    platform::LinuxSpoor spoor_{{.runtimeFolder = runtimeFolder(),
                                 .traceFolders = {},
                                 .instanceName = {},
                                 .bufferKilobytes = 0,
                                 .emitterGroup = {}},
                                clock_};
    std::unique_ptr<platform::SpoorSession> session_;
};

} // namespace vela::client
