// The service on the real work queues, called from many threads at once: what the thread and address sanitizers are to
// look at. Beacon answers from threads of its own.
#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "service/Service_test.h"
#include "session/SessionTraceCode.h"

#include <atomic>
#include <chrono>
#include <functional>
#include <random>
#include <semaphore>
#include <thread>

namespace vela {

namespace {

using namespace std::chrono_literals;

/// Lines are made and thrown away; those that announce a single message are counted.
class DiscardingSink final : public platform::LogSink {
public:
    DiscardingSink() { setLogDestination(this, LogLevel::Debug); }
    ~DiscardingSink() override { setLogDestination(nullptr, LogLevel::Error); }
    DiscardingSink(const DiscardingSink&) = delete;
    DiscardingSink& operator=(const DiscardingSink&) = delete;

    void write(const platform::LogRecord& record) override {
        if (record.message.starts_with("sending single message after delta ")) {
            ++singleMessages_;
        }
    }
    std::uint64_t lost() const override { return 0; }

    std::size_t singleMessages() const { return singleMessages_; }

private:
    std::atomic<std::size_t> singleMessages_ = 0;
};

/// Calls `body` on `count` threads at once and waits for them.
void onThreads(unsigned count, const std::function<void(unsigned number)>& body) {
    std::vector<std::thread> threads;
    for (unsigned number = 0; number < count; ++number) {
        threads.emplace_back(body, number);
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
}

class VelaReportingServiceDelegateStressTest : public ::testing::Test {
protected:
    VelaReportingServiceDelegateStressTest() {
        fakes_.device.setBoolean("InternalBuild", true);
        fakes_.tally.setBuildsAtOnce(true);
        fakes_.spoor.setObserver([this](std::uint32_t code) {
            if (code == kTraceInit) {
                ++made_;
            } else if (code == kTraceDealloc) {
                released_.release();
            }
        });
        service_ = VelaReportingServiceDelegate::init({platform_});
    }
    /// Waits until every session is gone, then ends the service.
    void end() {
        awaitQueue();
        const auto limit = std::chrono::steady_clock::now() + 120s;
        for (int session = 0; session < made_; ++session) {
            ASSERT_TRUE(released_.try_acquire_until(limit)) << session << " of " << made_ << " were released";
        }
        // Single messages of sessions that were not started refer to the service until they are sent, a second on.
        while (fakes_.beacon.callsOf(BeaconOperation::SendOne).size() < sink_.singleMessages()) {
            ASSERT_LT(std::chrono::steady_clock::now(), limit);
            std::this_thread::yield();
        }
        service_.reset();
    }
    /// Until what was posted to the reporting queue so far has run.
    void awaitQueue() {
        std::binary_semaphore done(0);
        service_->reportingQueue().post([&done] { done.release(); });
        done.acquire();
    }
    std::shared_ptr<testing::FakeIpcConnection> connect(std::int32_t pid) {
        auto connection = std::make_shared<testing::FakeIpcConnection>(pid);
        EXPECT_TRUE(service_->shouldAcceptNewConnection(connection));
        return connection;
    }
    /// A reply that counts.
    template <class... Types>
    platform::IpcReply<Types...> counting() {
        ++asked_;
        return [this](const std::optional<platform::IpcError>&, Types...) { ++answered_; };
    }
    /// A step of a client.
    void call(platform::ReportingServiceProtocol& client, std::mt19937& random) {
        const auto reporterID = static_cast<std::int64_t>(1 + random() % 4);
        switch (random() % 10) {
        case 0:
            return client.setServiceType(static_cast<std::uint16_t>(random() % 14), reporterID, counting<bool>());
        case 1:
            return client.getServiceNameForReporterID(reporterID, counting<std::uint16_t>());
        case 2:
            return client.setConfiguration({{"HostApplicationDisplayID", static_cast<std::int64_t>(random() % 9)}},
                                           reporterID, counting<bool>());
        case 3:
            return client.startReportingSessionForID(reporterID, std::make_shared<int>(), {[](auto&&...) {}});
        case 4:
            return client.stopReportingSessionForID(reporterID, counting<bool>());
        case 5:
            return client.destroyReportingSession(reporterID, counting<bool>());
        case 6:
            return client.reporterID(reporterID, counting<Dictionary>());
        case 7:
            return client.getAllReporters(counting<std::vector<std::int64_t>>());
        case 8:
            client.createReportingSession(reporterID, counting<bool>());
            return client.startReportingSessionForID(reporterID, nullptr, {[](auto&&...) {}});
        default:
            return client.sendMessage({{"a b", static_cast<std::int64_t>(random() % 3)}}, 12,
                                      static_cast<std::uint16_t>(random() % 20), to({reporterID, 5}), counting<>());
        }
    }

    // Everything outlives the queues, whose threads end when they are destroyed.
    DiscardingSink sink_;
    FakeFacilities fakes_;
    VelaReportingBuildType buildType_{fakes_.device};
    platform::LinuxClock clock_;
    std::atomic<int> made_ = 0;
    std::counting_semaphore<> released_{0};
    std::atomic<int> asked_ = 0;
    std::atomic<int> answered_ = 0;
    platform::LinuxWorkQueues queues_{4};
    platform::Platform platform_ = fakes_.platformWith(clock_, queues_);
    std::shared_ptr<VelaReportingServiceDelegate> service_;
};

TEST_F(VelaReportingServiceDelegateStressTest, ClientsComeCallAndGoOnManyThreads) {
    constexpr int kConnections = 60;
    constexpr int kCalls = 40;
    std::atomic<bool> working = true;
    // Reporter 5 is of a client that stays, started throughout: messages for it come from everywhere.
    const auto lasting = connect(8);
    lasting->client()->createReportingSession(5, counting<bool>());
    lasting->client()->startReportingSessionForID(5, nullptr, {[](auto&&...) {}});
    awaitQueue();
    std::thread inspector([&] {
        while (working) {
            for (const ValueRef session : service_->sessions()) {
                EXPECT_TRUE(session.dictionary().contains("messages"));
            }
            EXPECT_NE(service_->findReportingSessionForID(5), nullptr);
            fakes_.notifications.setState("com.orvex.lobby.ringerstate", 1);
            fakes_.notifications.post("com.orvex.lobby.ringerstate");
            std::this_thread::yield();
        }
    });
    onThreads(3, [&](unsigned number) {
        std::mt19937 random(number);
        for (int connected = 0; connected < kConnections; ++connected) {
            const auto connection = connect(static_cast<std::int32_t>(7 + random() % 3));
            const auto client = connection->client();
            for (int step = 0; step < kCalls; ++step) {
                call(*client, random);
            }
            if (random() % 2 == 0) {
                connection->breakStream();
            } else {
                connection->end();
            }
        }
    });
    working = false;
    inspector.join();
    lasting->end();
    end();
    EXPECT_EQ(answered_, asked_);
}

TEST_F(VelaReportingServiceDelegateStressTest, TheInspectionAnswersWhileTheReportingQueueIsBlocked) {
    const auto connection = connect(7);
    connection->client()->createReportingSession(42, counting<bool>());
    awaitQueue();
    std::binary_semaphore entered(0);
    std::binary_semaphore leave(0);
    service_->reportingQueue().post([&] {
        entered.release();
        leave.acquire();
    });
    entered.acquire();
    EXPECT_EQ(service_->sessions().size(), 1U);
    const auto second = connect(8); // is taken as well
    EXPECT_TRUE(second->resumed());
    second->end(); // and its end is told
    leave.release();
    connection->end();
    end();
}

TEST_F(VelaReportingServiceDelegateStressTest, TheServiceMayEndWhileClientsCall) {
    for (int round = 0; round < 20; ++round) {
        const auto connection = connect(7);
        std::thread caller([client = connection->client()] {
            for (int call = 0; call < 50; ++call) {
                client->getServiceNameForReporterID(42, {[](auto&&...) {}});
                client->getAllReporters({[](auto&&...) {}});
            }
        });
        service_.reset();
        caller.join();
        connection->breakStream();
        service_ = VelaReportingServiceDelegate::init({platform_});
    }
    end();
}

} // namespace

} // namespace vela
