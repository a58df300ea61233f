// A stop that waits for its trace, on the real work queues: what everybody else can do meanwhile.
#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "service/Service_test.h"
#include "session/SessionTraceCode.h"

#include <chrono>
#include <cstdlib>
#include <future>
#include <memory>
#include <semaphore>

namespace vela {

namespace {

using namespace std::chrono_literals;

class VelaReportingTraceWaitDeathTest : public ::testing::Test {
protected:
    VelaReportingTraceWaitDeathTest() {
        fakes_.device.setFeature("AudioAnalytics", "Tracing", true);
        fakes_.probe.setObserver([this](const std::string& call) {
            if (call == "stopProbeTrace") {
                waiting_.release();
            }
        });
        fakes_.probe.completeWhenStopped(std::nullopt);
        fakes_.spoor.setObserver([this](std::uint32_t code) {
            if (code == kTraceDealloc) {
                released_.release();
            }
        });
        service_ = VelaReportingServiceDelegate::init({platform_});
    }

    std::shared_ptr<testing::FakeIpcConnection> connect(std::int32_t pid) {
        auto connection = std::make_shared<testing::FakeIpcConnection>(pid);
        EXPECT_TRUE(service_->shouldAcceptNewConnection(connection));
        return connection;
    }
    /// A promise that a call's reply keeps.
    static platform::IpcReply<bool> keeping(std::shared_ptr<std::promise<bool>> promise) {
        return [promise = std::move(promise)](const std::optional<platform::IpcError>&, bool answer) {
            promise->set_value(answer);
        };
    }
    /// A client whose stop waits for its trace, and what that is going to be answered.
    std::future<bool> stopAndWait(platform::ReportingServiceProtocol& client) {
        const auto ignored = [](const auto&...) {};
        client.createReportingSession(42, ignored);
        client.setServiceType(11, 42, ignored);
        client.startReportingSessionForID(42, nullptr, ignored);
        auto answer = std::make_shared<std::promise<bool>>();
        client.stopReportingSessionForID(42, keeping(answer));
        waiting_.acquire();
        return answer->get_future();
    }

    // Everything outlives the queues, whose threads end when they are destroyed.
    testing::CapturingLog log_{LogLevel::Error};
    FakeFacilities fakes_;
    VelaReportingBuildType buildType_{fakes_.device};
    platform::LinuxClock clock_;
    std::counting_semaphore<> waiting_{0};
    std::counting_semaphore<> released_{0};
    platform::LinuxWorkQueues queues_{2};
    platform::Platform platform_ = fakes_.platformWith(clock_, queues_);
    std::shared_ptr<VelaReportingServiceDelegate> service_;
};

TEST_F(VelaReportingTraceWaitDeathTest, OthersConnectCallAndInspectWhileAStopWaits) {
    const auto waiting = connect(7);
    std::future<bool> stopped = stopAndWait(*waiting->client());
    const auto other = connect(8);
    EXPECT_TRUE(other->resumed());
    auto created = std::make_shared<std::promise<bool>>();
    std::future<bool> answer = created->get_future();
    other->client()->createReportingSession(43, keeping(created)); // returns, and waits for its turn
    EXPECT_EQ(service_->sessions().size(), 1U);
    // The pool has room for other queues' work.
    std::binary_semaphore ran(0);
    queues_.background().post([&ran] { ran.release(); });
    ran.acquire();
    EXPECT_EQ(stopped.wait_for(0s), std::future_status::timeout);
    EXPECT_EQ(answer.wait_for(0s), std::future_status::timeout);
    fakes_.probe.delegate()->performanceTraceDidComplete("file:///a", "", std::nullopt);
    EXPECT_TRUE(stopped.get());
    EXPECT_TRUE(answer.get());
    waiting->end();
    other->end();
    released_.acquire();
    released_.acquire();
    service_.reset();
}

TEST_F(VelaReportingTraceWaitDeathTest, AnotherClientMayEndTheServiceWhileAStopWaits) {
    ::testing::FLAGS_gtest_death_test_style = "threadsafe";
    EXPECT_EXIT(
        {
            const auto waiting = connect(7);
            const std::future<bool> stopped = stopAndWait(*waiting->client());
            const auto other = connect(8);
            other->client()->killService({[](auto&&...) {}});
        },
        ::testing::ExitedWithCode(2), "");
}

} // namespace

} // namespace vela
