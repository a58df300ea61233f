// Sessions on the real work queues, used from many threads at once: what the thread and address sanitizers are to look
// at. Beacon answers from threads of its own.
#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxJsonWriting.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "session/Session_test.h"

#include <array>
#include <atomic>
#include <chrono>
#include <functional>
#include <map>
#include <random>
#include <semaphore>
#include <thread>

namespace vela {

namespace {

using namespace std::chrono_literals;
using platform::LinuxWorkQueues;

/// Lines are made and thrown away.
class DiscardingSink final : public platform::LogSink {
public:
    DiscardingSink() { setLogDestination(this, LogLevel::Debug); }
    ~DiscardingSink() override { setLogDestination(nullptr, LogLevel::Error); }
    DiscardingSink(const DiscardingSink&) = delete;
    DiscardingSink& operator=(const DiscardingSink&) = delete;

    void write(const platform::LogRecord& record) override { bytes_ += record.text.size(); }
    std::uint64_t lost() const override { return 0; }

private:
    std::atomic<std::size_t> bytes_ = 0;
};

/// Reads the configuration of the session that hands over an event, as the bridge does.
class ReadingAnalytics final : public VelaReportingSessionEventHandler {
public:
    std::atomic<std::size_t> entries = 0;

    void handleEvent(const Dictionary& message, std::uint32_t, std::uint32_t,
                     const std::shared_ptr<VelaReportingSession>& session) override {
        entries += message.merging(session->configuration()).size();
    }
};

/// Answers the discoveries of a beacon on threads of its own, one in three with none, until it is destroyed.
class Answerers {
public:
    Answerers(testing::FakeBeacon& beacon, unsigned threads) : beacon_(beacon) {
        for (unsigned seed = 0; seed < threads; ++seed) {
            threads_.emplace_back([this, seed] { run(seed); });
        }
    }
    ~Answerers() {
        stopping_ = true;
        for (std::thread& thread : threads_) {
            thread.join();
        }
    }
    Answerers(const Answerers&) = delete;
    Answerers& operator=(const Answerers&) = delete;

private:
    void run(unsigned seed) {
        std::mt19937 random(seed);
        while (!stopping_) {
            if (testing::FakeBeacon::Completion completion = beacon_.takeDiscovery()) {
                completion(random() % 3 != 0 ? std::optional(Array{"store"}) : std::nullopt);
            } else {
                std::this_thread::yield();
            }
        }
    }

    testing::FakeBeacon& beacon_;
    std::atomic<bool> stopping_ = false;
    std::vector<std::thread> threads_;
};

/// A place for a session that others replace while it is used. Whoever uses the old one last releases it.
class Slot {
public:
    std::shared_ptr<VelaReportingSession> get() const {
        const MutexLock lock(mutex_);
        return session_;
    }
    void put(std::shared_ptr<VelaReportingSession> session) {
        const MutexLock lock(mutex_);
        std::swap(session_, session);
    }

private:
    mutable Mutex mutex_;
    std::shared_ptr<VelaReportingSession> session_ VELA_GUARDED_BY(mutex_);
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

class VelaReportingSessionStressTest : public ::testing::Test {
protected:
    VelaReportingSessionStressTest() {
        device_.setBoolean("InternalBuild", true);
        spoor_.setObserver([this](std::uint32_t code) {
            if (code == 0x21044834) {
                released_.release();
            }
        });
    }

    std::shared_ptr<VelaReportingSession> makeSession(std::int64_t reporterID) {
        auto session = VelaReportingSession::initWithID(reporterID, {7}, platform_);
        session->setBeaconReportingEnabled(true);
        ++made_;
        return session;
    }
    void awaitReleases() {
        const auto limit = std::chrono::steady_clock::now() + 120s;
        for (int session = 0; session < made_; ++session) {
            ASSERT_TRUE(released_.try_acquire_until(limit)) << session << " of " << made_ << " were released";
        }
    }

    void send(VelaReportingSession& session, std::mt19937& random) {
        session.sendMessage({{"session_output_running", random() % 2 == 0},
                             {"NexoSessionVolume", static_cast<double>(random() % 4) / 4},
                             {"a b", static_cast<std::int64_t>(random() % 3)},
                             {"velareporting_timestamp", static_cast<double>(++time_)}},
                            static_cast<std::uint32_t>(random() % 16), static_cast<std::uint16_t>(random() % 20),
                            random() % 2 == 0, [this](const std::optional<platform::Failure>&) { ++replies_; });
        ++sent_;
    }
    /// A step of the one thread that starts, stops and replaces sessions.
    void control(Slot& slot, std::mt19937& random) {
        const std::shared_ptr<VelaReportingSession> session = slot.get();
        switch (random() % 8) {
        case 0:
            slot.put(makeSession(static_cast<std::int64_t>(random())));
            break;
        case 1:
        case 2:
            session->start();
            session->setTransactionCompleteBlock([this, calls = 0](std::optional<platform::IpcError>, bool) mutable {
                if (++calls > 1) {
                    ++calledTwice_;
                }
            });
            break;
        case 3:
            session->stop();
            break;
        case 4:
            session->setServiceType(static_cast<std::uint16_t>(random() % 2 == 0 ? 11 : 3));
            break;
        case 5:
            session->setConfiguration(
                Dictionary{{"HostApplicationDisplayID", static_cast<std::int64_t>(random() % 9)}});
            break;
        case 6:
            session->setBeaconReportingEnabled(random() % 4 != 0);
            break;
        default:
            session->completeTransaction();
            break;
        }
    }
    static void read(VelaReportingSession& session) {
        EXPECT_FALSE(session.description().empty());
        session.createSummaryEventForSession();
        if (session.getBeaconReportingStartedState()) {
            session.writeSummaryJson();
        }
    }

    // Everything outlives the queues, whose threads end when they are destroyed.
    DiscardingSink sink_;
    testing::FakeDeviceProperties device_;
    VelaReportingBuildType buildType_{device_};
    platform::LinuxClock clock_;
    platform::LinuxJsonWriting json_;
    testing::FakeFileSystem fileSystem_;
    testing::FakeSpoor spoor_;
    testing::FakeBeacon beacon_;
    ReadingAnalytics analytics_;
    std::counting_semaphore<> released_{0};
    std::atomic<int> made_ = 0;
    std::atomic<int> sent_ = 0;
    std::atomic<int> replies_ = 0;
    std::atomic<int> calledTwice_ = 0;
    std::atomic<std::int64_t> time_ = 1'000;
    LinuxWorkQueues queues_{4};
    VelaReportingSessionPlatform platform_{beacon_, clock_, fileSystem_, json_, spoor_, queues_, analytics_, ""};
};

TEST_F(VelaReportingSessionStressTest, EverythingAtOnce) {
    constexpr int kSteps = 5'000;
    std::array<Slot, 3> slots;
    for (Slot& slot : slots) {
        slot.put(makeSession(1));
    }
    {
        const Answerers answerers(beacon_, 2);
        onThreads(5, [&](unsigned number) {
            std::mt19937 random(number);
            for (int step = 0; step < kSteps; ++step) {
                Slot& slot = slots[random() % slots.size()];
                if (number == 0) {
                    control(slot, random);
                } else if (number == 1) {
                    read(*slot.get());
                } else {
                    send(*slot.get(), random);
                }
            }
        });
        for (Slot& slot : slots) {
            slot.get()->stop();
            slot.put(nullptr);
        }
        awaitReleases();
    }
    EXPECT_EQ(replies_, sent_);
    EXPECT_EQ(calledTwice_, 0);
}

TEST_F(VelaReportingSessionStressTest, TheLastReferenceMayGoOnAnyThread) {
    const auto other = queues_.makeSerialQueue("com.orvex.vela.test", platform::QualityOfService::Default);
    {
        const Answerers answerers(beacon_, 2);
        std::mt19937 random(1);
        for (int round = 0; round < 1'000; ++round) {
            std::shared_ptr<VelaReportingSession> session = makeSession(round);
            session->start();
            send(*session, random);
            if (round % 2 == 0) {
                session->stop();
            }
            switch (round % 3) {
            case 0:
                queues_.background().post([held = std::move(session)]() mutable { held.reset(); });
                break;
            case 1:
                other->post([held = std::move(session)]() mutable { held.reset(); });
                break;
            default:
                session.reset(); // what it has queued holds it
                break;
            }
        }
        awaitReleases();
    }
    EXPECT_EQ(beacon_.callsOf(BeaconOperation::EndSession).size(),
              beacon_.callsOf(BeaconOperation::CreateSession).size());
}

TEST_F(VelaReportingSessionStressTest, MessagesOfEachSenderArriveInItsOrder) {
    constexpr unsigned kSenders = 4;
    constexpr int kMessages = 1'000;
    beacon_.setDiscovery(BeaconDiscovery::FindsBackends);
    std::shared_ptr<VelaReportingSession> session = makeSession(1);
    session->start();
    onThreads(kSenders, [&](unsigned sender) {
        for (int number = 0; number < kMessages; ++number) {
            session->sendMessage({{"sender", sender}, {"number", number}}, 1, 1, {});
        }
    });
    EXPECT_EQ(countOf(*session, "Generic_Start"), kSenders * kMessages);
    session.reset();
    awaitReleases();
    std::map<std::int64_t, std::int64_t> next;
    for (const auto& call : beacon_.callsOf(BeaconOperation::Send)) {
        ASSERT_EQ(call.payload.find("number").integer(), next[call.payload.find("sender").integer()]++);
    }
    ASSERT_EQ(next.size(), kSenders);
    for (const auto& [sender, count] : next) {
        EXPECT_EQ(count, kMessages) << sender;
    }
}

TEST_F(VelaReportingSessionStressTest, TheQueueIsMadeOnceHoweverManyNeedItFirst) {
    for (int round = 0; round < 100; ++round) {
        const std::shared_ptr<VelaReportingSession> session = makeSession(round);
        session->setServiceType(11);
        session->start();
        onThreads(3, [&](unsigned) { session->sendMessage({{"a", 1}}, 1, 1, {}); });
    }
    awaitReleases();
}

TEST_F(VelaReportingSessionStressTest, MessagesAtTheTimeOfTheStopAreSummarisedWholeOrNotAtAll) {
    beacon_.setDiscovery(BeaconDiscovery::FindsBackends);
    for (int round = 0; round < 100; ++round) {
        const std::shared_ptr<VelaReportingSession> session = makeSession(round);
        session->start();
        onThreads(3, [&](unsigned number) {
            if (number == 0) {
                session->stop();
                return;
            }
            for (int message = 0; message < 20; ++message) {
                session->sendMessage({{"x", message}, {"y", message}}, number, 1, {});
            }
        });
        EXPECT_FALSE(session->started());
    }
    awaitReleases();
    for (const auto& call : beacon_.callsOf(BeaconOperation::Send)) {
        EXPECT_EQ(call.payload.find("x"), call.payload.find("y"));
    }
}

// The same as with a clock that is moved, but it takes nine seconds.
TEST_F(VelaReportingSessionStressTest, DISABLED_AThousandSessionsWaitNineSecondsWithoutAThreadOfTheirOwn) {
    constexpr int kSessions = 1'000;
    beacon_.setDiscovery(BeaconDiscovery::Lost);
    std::counting_semaphore<> answered(0);
    const std::size_t threadsBefore = queues_.threadCount();
    const auto begin = std::chrono::steady_clock::now();
    for (int id = 0; id < kSessions; ++id) {
        const std::shared_ptr<VelaReportingSession> session = makeSession(id);
        session->start();
        session->setTransactionCompleteBlock([&](std::optional<platform::IpcError>, bool) { answered.release(); });
    }
    std::size_t mostThreads = 0;
    for (int id = 0; id < kSessions; ++id) {
        mostThreads = std::max(mostThreads, queues_.threadCount());
        ASSERT_TRUE(answered.try_acquire_for(60s));
    }
    EXPECT_GE(std::chrono::steady_clock::now() - begin, 9s);
    EXPECT_LE(mostThreads, std::max<std::size_t>(threadsBefore, 4));
    awaitReleases();
}

} // namespace

} // namespace vela
