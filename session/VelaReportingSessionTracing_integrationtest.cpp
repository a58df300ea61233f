// Sessions with traces on the real work queues, told of their traces' ends by other threads: what the thread and
// address sanitizers are to look at.
#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "session/SessionTraceCode.h"
#include "session/SessionTracing_test.h"

#include <atomic>
#include <semaphore>
#include <thread>

namespace vela {

namespace {

class VelaReportingSessionTracingStressTest : public ::testing::Test {
protected:
    VelaReportingSessionTracingStressTest() {
        device_.setFeature("AudioAnalytics", "Tracing", true);
        fileSystem_.addFile("/traces.plist", "{ Children = ({ Name = T; Children = ({ Name = open; Type = Interval;"
                                             " SpoorCodeBegin = 21040010; SpoorCodeEnd = 21040014; }); }); }");
        spoor_.setObserver([this](std::uint32_t code) {
            if (code == kTraceDealloc) {
                released_.release();
            }
        });
    }
    std::shared_ptr<VelaReportingSession> makeSession(const Dictionary& configuration) {
        auto session = VelaReportingSession::initWithID(42, {7}, platform_, platform::Identity{1000, 1000, {}});
        session->setServiceType(11);
        session->setConfiguration(configuration);
        return session;
    }

    testing::CapturingLog log_{LogLevel::Error};
    testing::FakeBeacon beacon_;
    testing::FakeSpoor spoor_;
    testing::FakeFileSystem fileSystem_;
    testing::FakeJsonWriting json_;
    testing::FakeDeviceProperties device_;
    testing::FakeProbe probe_;
    testing::FakeMetricsheet metricsheet_;
    testing::FakeProcessControl processControl_;
    testing::FakePropertyListReading propertyLists_;
    RecordingAnalytics analytics_;
    VelaReportingBuildType buildType_{device_};
    platform::LinuxClock clock_;
    std::counting_semaphore<> released_{0};
    platform::LinuxWorkQueues queues_{2};
    VelaReportingTracePlatform tracePlatform_{
        device_, probe_, propertyLists_, {fileSystem_, metricsheet_, processControl_, spoor_, queues_, ""}};
    VelaReportingSessionPlatform platform_{beacon_,    clock_, fileSystem_, json_,   spoor_,         queues_,
                                           analytics_, "",     nullptr,     nullptr, &tracePlatform_};
};

TEST_F(VelaReportingSessionTracingStressTest, PlatformTracesEndOnOtherThreads) {
    constexpr int kRounds = 200;
    std::counting_semaphore<> due(0);
    std::atomic<int> round = 0;
    // Half of the traces end by themselves, the others when they are stopped.
    probe_.setObserver([&](const std::string& call) {
        if (call == (round % 2 == 0 ? "startProbeTrace" : "stopProbeTrace")) {
            due.release();
        }
    });
    std::thread teller([&] {
        for (int told = 0; told < kRounds; ++told) {
            due.acquire();
            const auto delegate = probe_.delegate();
            ASSERT_NE(delegate, nullptr);
            delegate->performanceTraceDidStart(std::nullopt);
            delegate->performanceTraceDidStop(std::nullopt);
            delegate->performanceTraceDidComplete("file:///traces/a.data", "token", std::nullopt);
        }
    });
    for (; round < kRounds; ++round) {
        const auto session = makeSession({});
        session->start();
        static_cast<void>(session->getProbeTraceFileURL());
        session->stop();
        EXPECT_FALSE(session->tracing()->startedTracing());
    }
    teller.join();
    for (int released = 0; released < kRounds; ++released) {
        released_.acquire();
    }
}

TEST_F(VelaReportingSessionTracingStressTest, KernelTracesRunWhileOthersEmit) {
    constexpr int kRounds = 50;
    std::atomic<bool> emitting = true;
    std::thread emitter([&] {
        while (emitting) {
            spoor_.emit(0x21040010);
            spoor_.emit(0x21040014);
            std::this_thread::yield();
        }
    });
    for (int round = 0; round < kRounds; ++round) {
        const auto session = makeSession({{"VelaReportingKilnPlistFilePath", "/traces.plist"}});
        session->start();
        if (round % 5 != 4) {
            session->stop(); // every fifth is released while it runs
        }
    }
    emitting = false;
    emitter.join();
    EXPECT_EQ(metricsheet_.files().size(), 40U);
    for (const auto& file : metricsheet_.files()) {
        EXPECT_TRUE(file.closed);
    }
}

} // namespace

} // namespace vela
