// Emitters and services that end in the midst of a collection, and emitters of other users: with processes of their
// own.
#include "platform/spoor/SpoorHarness_test.h"
#include "platform/spoor/TraceEmitter.h"
#include "testing/SpoorContract.h"

#include <array>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <functional>
#include <gmock/gmock.h>
#include <grp.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

namespace vela::testing {

// What it collects with is used here, the suite is not.
GTEST_ALLOW_UNINSTANTIATED_PARAMETERIZED_TEST(SpoorContract);

} // namespace vela::testing

namespace vela::platform {
namespace {

using spoor::Emission;
using spoor::TraceEmitter;

/// A process that runs `work` and then waits to be ended. Without threads of its parent's.
class Child {
public:
    explicit Child(const std::function<bool()>& work) {
        std::array<int, 2> ready{};
        EXPECT_EQ(pipe(ready.data()), 0);
        pid_ = fork();
        if (pid_ == 0) {
            close(ready[0]);
            const char answer = work() ? 'y' : 'n';
            static_cast<void>(!write(ready[1], &answer, 1));
            for (;;) {
                pause();
            }
        }
        close(ready[1]);
        char answer = '-';
        EXPECT_EQ(read(ready[0], &answer, 1), 1);
        EXPECT_EQ(answer, 'y');
        close(ready[0]);
    }
    ~Child() { kill(); }
    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;

    void kill() {
        if (pid_ > 0) {
            ::kill(pid_, SIGKILL);
            waitpid(pid_, nullptr, 0);
            pid_ = -1;
        }
    }

private:
    pid_t pid_ = -1;
};

bool emitMany(const std::string& runtimeFolder, std::uint64_t count) {
    // Left to the process's end, as that of a program that is killed.
    auto* const emitter = new TraceEmitter({{runtimeFolder, true}});
    for (std::uint64_t i = 0; i < count; ++i) {
        if (emitter->emitNow(kTestCode, {i, 0, 0, 0}) != Emission::Emitted) {
            return false;
        }
    }
    return true;
}

std::size_t filesIn(const std::string& folder) {
    const std::filesystem::directory_iterator entries(folder);
    return static_cast<std::size_t>(std::distance(begin(entries), end(entries)));
}

std::string contentOf(const std::string& path) {
    std::string content;
    std::ifstream(path) >> content;
    return content;
}

template <class Harness>
class EmitterEndsTest : public ::testing::Test {
protected:
    void start() {
        session_ = harness_.spoor().createSession();
        session_->setCompletionHandler([this] { collected_.complete(); });
        EXPECT_EQ(session_->eventsRange(kTestCode, kTestCode, [this](const auto& event) { collected_.add(event); }), 0);
        ASSERT_EQ(session_->start(harness_.queue()), 0);
    }
    void finish() {
        EXPECT_EQ(session_->end(), 0);
        EXPECT_TRUE(harness_.waitFor([&] { return collected_.completions() == 1; }));
        EXPECT_EQ(session_->lostEvents(), 0U);
    }
    /// Events numbered from 0 on.
    void expectEvents(std::uint64_t count) {
        const auto events = collected_.events();
        ASSERT_EQ(events.size(), count);
        for (std::uint64_t i = 0; i < count; ++i) {
            ASSERT_EQ(events[i].arguments[0], i);
        }
    }
    std::string rings() const { return spoor::ringFolder(harness_.runtimeFolder()); }

    Harness harness_;
    testing::CollectedEvents collected_;
    std::unique_ptr<SpoorSession> session_;
};
TYPED_TEST_SUITE(EmitterEndsTest, BothWays);

TYPED_TEST(EmitterEndsTest, WhatAKilledEmitterEmittedIsDeliveredAndNothingOfItStays) {
    this->start();
    Child emitter([&] { return emitMany(this->harness_.runtimeFolder(), 1'000); });
    emitter.kill();
    this->finish();
    this->expectEvents(1'000);
    EXPECT_EQ(filesIn(this->rings()), 0U);
}

TYPED_TEST(EmitterEndsTest, AnEmitterThatLivesOnIsDelivered) {
    this->start();
    const Child emitter([&] { return emitMany(this->harness_.runtimeFolder(), 1'000); });
    this->finish();
    this->expectEvents(1'000);
}

TYPED_TEST(EmitterEndsTest, AnOrdinaryUsersEventsAreDelivered) {
    if (geteuid() != 0) {
        GTEST_SKIP() << "only root may become another user";
    }
    constexpr uid_t kNobody = 65534;
    std::filesystem::permissions(this->harness_.runtimeFolder(), std::filesystem::perms(0755));
    ASSERT_EQ(chmod(this->rings().c_str(), 01777), 0);
    this->start();
    const Child emitter([&] {
        return setgroups(0, nullptr) == 0 && setgid(kNobody) == 0 && setuid(kNobody) == 0 &&
               emitMany(this->harness_.runtimeFolder(), 1'000);
    });
    EXPECT_EQ(filesIn(this->rings()), 1U) << "it may not open the kernel's marker";
    this->harness_.spoor().emit(kTestCode, {1'000, 0, 0, 0});
    this->finish();
    this->expectEvents(1'001);
}

TYPED_TEST(EmitterEndsTest, AnEmittersChildIsDeliveredBesideIt) {
    this->start();
    const Child emitter([&] {
        auto* const own = new TraceEmitter({{this->harness_.runtimeFolder(), true}});
        if (own->emitNow(kTestCode, {0, 0, 0, 0}) != Emission::Emitted) {
            return false;
        }
        const pid_t child = fork();
        if (child == 0) {
            _exit(own->emitNow(kTestCode, {1, 0, 0, 0}) == Emission::Emitted ? 0 : 1);
        }
        int status = 1;
        return waitpid(child, &status, 0) == child && status == 0 &&
               own->emitNow(kTestCode, {2, 0, 0, 0}) == Emission::Emitted;
    });
    this->finish();
    this->expectEvents(3);
    const auto events = this->collected_.events();
    EXPECT_EQ(events[0].threadID, events[2].threadID);
    EXPECT_NE(events[0].threadID, events[1].threadID);
}

/// A service in a process of its own, which collects until it is killed.
template <SpoorWay Way>
bool serve(const std::string& runtimeFolder, const std::string& instanceName) {
    static const LinuxClock kClock;
    LinuxSpoorOptions options = spoorOptions(runtimeFolder, Way);
    options.instanceName = instanceName;
    auto* const queues = new LinuxWorkQueues();
    auto* const spoor = new LinuxSpoor(options, kClock);
    auto* const queue = queues->makeSerialQueue("spoor.test", QualityOfService::Default).release();
    auto* const session = spoor->createSession().release();
    return session->eventsRange(kTestCode, kTestCode, [](const auto&) {}) == 0 && session->start(*queue) == 0 &&
           spoor->usesFtrace() == (Way == SpoorWay::Ftrace);
}

TEST(ServiceEndsTest, RingsOfAKilledServiceAreTakenOverByTheNext) {
    const testing::TemporaryFolder folder;
    TraceEmitter emitter({{folder.path(), true}});
    Child service([&] { return serve<SpoorWay::Rings>(folder.path(), "none"); });
    EXPECT_EQ(emitter.emitNow(kTestCode, {}), Emission::Emitted);
    service.kill();
    EXPECT_NE(*emitter.activeWord(), 0U) << "nobody was left to clear it";
    EXPECT_FALSE(emitter.hasLivingService());
    const LinuxClock clock;
    LinuxWorkQueues queues;
    const auto queue = queues.makeSerialQueue("spoor.test", QualityOfService::Default);
    LinuxSpoor next(spoorOptions(folder.path(), SpoorWay::Rings), clock);
    EXPECT_EQ(*emitter.activeWord(), 0U);
    EXPECT_EQ(emitter.emitNow(kTestCode, {}), Emission::NobodyCollects);
    testing::CollectedEvents collected;
    const auto session = next.createSession();
    session->setCompletionHandler([&] { collected.complete(); });
    EXPECT_EQ(session->eventsRange(kTestCode, kTestCode, [&](const auto& event) { collected.add(event); }), 0);
    EXPECT_EQ(session->start(*queue), 0);
    EXPECT_EQ(emitter.emitNow(kTestCode, {7, 0, 0, 0}), Emission::Emitted);
    EXPECT_EQ(session->end(), 0);
    EXPECT_TRUE(testing::waitUntil([&] { return collected.completions() == 1; }));
    ASSERT_EQ(collected.size(), 1U);
    EXPECT_EQ(collected.events()[0].arguments[0], 7U);
}

TEST(ServiceEndsTest, TheKernelStopsForAKilledServiceAndItsInstanceIsTakenOver) {
    if (const std::string reason = reasonAgainstFtrace(); !reason.empty()) {
        GTEST_SKIP() << reason;
    }
    const testing::TemporaryFolder folder;
    const std::string name = testInstanceName();
    const std::string instance = std::string(kTraceFolder) + "/instances/" + name + "-s0";
    {
        TraceEmitter emitter({{folder.path(), true}});
        Child service([&] { return serve<SpoorWay::Ftrace>(folder.path(), name); });
        EXPECT_EQ(contentOf(instance + "/tracing_on"), "1");
        EXPECT_GE(std::stoul(contentOf(instance + "/buffer_size_kb")), 8192U);
        EXPECT_EQ(emitter.emitNow(kTestCode, {}), Emission::Emitted);
        service.kill();
        EXPECT_TRUE(testing::waitUntil([&] { return contentOf(instance + "/tracing_on") == "0"; }));
        EXPECT_LT(std::stoul(contentOf(instance + "/buffer_size_kb")), 100U);
        EXPECT_EQ(emitter.emitNow(kTestCode, {}), Emission::NobodyCollects);
        EXPECT_EQ(emitter.emitNow(kTestCode, {}), Emission::NobodyCollects);
        EXPECT_EQ(filesIn(spoor::ringFolder(folder.path())), 0U) << "no ring is made for a dead service";
        EXPECT_NE(rmdir(instance.c_str()), 0) << "the emitter holds it";

        Child next([&] { return serve<SpoorWay::Ftrace>(folder.path(), name); });
        EXPECT_EQ(contentOf(instance + "/tracing_on"), "1") << "the same instance is used again";
        EXPECT_EQ(emitter.emitNow(kTestCode, {}), Emission::Emitted);
        EXPECT_EQ(filesIn(spoor::ringFolder(folder.path())), 0U);
    }
    EXPECT_TRUE(testing::waitUntil([&] { return rmdir(instance.c_str()) == 0; }));
}

} // namespace
} // namespace vela::platform
