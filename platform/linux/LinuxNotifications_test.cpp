#include "platform/linux/LinuxNotificationFiles.h"
#include "platform/linux/LinuxNotifications.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "platform/linux/WorkQueueTestTools.h"
#include "testing/NotificationsContract.h"
#include "testing/TemporaryFolder.h"

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <vector>

namespace vela::platform {

namespace {

namespace fs = std::filesystem;
using State = std::optional<std::uint64_t>;

struct LinuxHarness {
    Notifications& notifications() { return notifications_; }
    std::unique_ptr<SerialQueue> makeQueue() { return queues_.makeSerialQueue("notified", QualityOfService::Default); }
    void post(const std::string& name) { EXPECT_TRUE(postNotification(folder_.path(), name, std::nullopt)); }
    void post(const std::string& name, std::uint64_t state) {
        EXPECT_TRUE(postNotification(folder_.path(), name, state));
    }
    template <class Done>
    void settle(const Done& done) {
        EXPECT_TRUE(waitFor(done));
    }

    testing::TemporaryFolder folder_;
    LinuxWorkQueues queues_;
    LinuxNotifications notifications_{folder_.path()};
};

class LinuxNotificationsTest : public ::testing::Test {
protected:
    /// Ends the calls before what they use.
    void TearDown() override {
        for (std::int32_t token = 1; token <= 20 && notifications_ != nullptr; ++token) {
            notifications_->cancel(token);
        }
        std::atomic<bool> drained = false;
        queue_->post([&drained] { drained = true; });
        EXPECT_TRUE(waitFor([&drained] { return drained.load(); }));
    }

    std::string path(const std::string& name = "") const { return folder_ / ("notifications/" + name); }
    std::string runtime() const { return folder_.path(); }
    void post(const std::string& name, State state) { ASSERT_TRUE(postNotification(folder_.path(), name, state)); }
    /// Replaces the file as quickly as it goes, without making it last.
    void replace(const std::string& name, const std::string& content) {
        const std::string temporary = path(".new");
        std::ofstream(temporary) << content;
        fs::rename(temporary, path(name));
    }
    /// Posts `name` by exchanging its file with another one, again and again: nothing is made or deleted.
    void replaceOften(const std::string& name, int times) {
        replace(name, "1");
        std::ofstream(path(".other")) << "2";
        for (int number = 0; number < times; ++number) {
            ASSERT_EQ(renameat2(AT_FDCWD, path(".other").c_str(), AT_FDCWD, path(name).c_str(), RENAME_EXCHANGE), 0);
        }
    }
    NotificationRegistration registerFor(const std::string& name) {
        return notifications_->registerForNotification(name, *queue_, [this](std::int32_t token) {
            lastState_ = notifications_->state(token).value_or(~std::uint64_t{0});
            ++calls_;
        });
    }
    /// Waits for a call that sees `state`.
    bool isTold(std::uint64_t state) {
        return waitFor([&] { return lastState_ == state; });
    }

    const testing::TemporaryFolder folder_;
    LinuxWorkQueues queues_;
    const std::unique_ptr<SerialQueue> queue_ = queues_.makeSerialQueue("notified", QualityOfService::Default);
    std::atomic<std::uint64_t> lastState_ = 1'000'000'000;
    std::atomic<int> calls_ = 0;
    std::unique_ptr<LinuxNotifications> notifications_ = std::make_unique<LinuxNotifications>(folder_.path());
};

TEST_F(LinuxNotificationsTest, NothingIsTouchedBeforeTheFirstRegistration) { EXPECT_TRUE(fs::is_empty(runtime())); }

TEST_F(LinuxNotificationsTest, ARegistrationMakesTheFolder) {
    EXPECT_EQ(registerFor("a").status, 0);
    EXPECT_TRUE(fs::is_directory(path()));
    post("a", 4);
    EXPECT_TRUE(isTold(4));
}

TEST_F(LinuxNotificationsTest, ARegistrationMakesTheFoldersAboveAsWell) {
    notifications_ = std::make_unique<LinuxNotifications>(folder_ / "run/vela");
    EXPECT_EQ(registerFor("a").status, 0);
    ASSERT_TRUE(postNotification(folder_ / "run/vela", "a", 4));
    EXPECT_TRUE(isTold(4));
}

TEST_F(LinuxNotificationsTest, AFolderThatCannotBeMadeFailsTheRegistration) {
    std::ofstream(folder_ / "notifications") << "in the way";
    const NotificationRegistration failed = registerFor("a");
    EXPECT_EQ(failed.status, ENOTDIR);
    EXPECT_EQ(failed.token, -1);
    fs::remove(folder_ / "notifications");
    EXPECT_EQ(registerFor("a").token, 1);
}

TEST_F(LinuxNotificationsTest, NamesThatCannotBeAFilesAreRefused) {
    for (const char* const name : {"", ".", "..", ".a", "a/b", "../a", "/a"}) {
        const NotificationRegistration refused = registerFor(name);
        EXPECT_EQ(refused.status, EINVAL) << name;
        EXPECT_EQ(refused.token, -1) << name;
    }
    EXPECT_TRUE(fs::is_empty(runtime()));
}

TEST_F(LinuxNotificationsTest, AMalformedFileHasNoState) {
    const std::int32_t token = registerFor("a").token;
    for (const char* const content : {"", "x", "18446744073709551616", "-1"}) {
        replace("a", content);
        EXPECT_EQ(notifications_->state(token), std::nullopt) << content;
    }
    fs::remove(path("a"));
    fs::create_directory(path("a"));
    EXPECT_EQ(notifications_->state(token), std::nullopt);
}

TEST_F(LinuxNotificationsTest, APostOfAMalformedStateIsStillAPost) {
    registerFor("a");
    replace("a", "x");
    EXPECT_TRUE(isTold(~std::uint64_t{0}));
}

TEST_F(LinuxNotificationsTest, ABurstIsAtMostOneWaitingCallAndTheLastStateIsTold) {
    registerFor("a");
    queue_->suspend();
    replaceOften("a", 10'000);
    replace("a", "77");
    // A post of another name behind the burst shows that all of it was seen.
    const auto other = queues_.makeSerialQueue("other", QualityOfService::Default);
    std::atomic<bool> seen = false;
    const auto mark = notifications_->registerForNotification("mark", *other, [&](std::int32_t) { seen = true; });
    replace("mark", "1");
    ASSERT_TRUE(waitFor([&] { return seen.load(); }));
    notifications_->cancel(mark.token);
    EXPECT_EQ(calls_, 0);
    std::atomic<bool> drained = false;
    queue_->post([&] { drained = true; });
    queue_->resume();
    ASSERT_TRUE(waitFor([&] { return drained.load(); }));
    EXPECT_EQ(calls_, 1);
    EXPECT_EQ(lastState_, 77U);
}

TEST_F(LinuxNotificationsTest, ABurstIntoARunningQueueEndsWithTheLastState) {
    registerFor("a");
    replaceOften("a", 10'000);
    replace("a", "77");
    EXPECT_TRUE(isTold(77));
}

TEST_F(LinuxNotificationsTest, APostDuringACallIsAnotherCall) {
    std::atomic<bool> began = false;
    std::atomic<bool> mayEnd = false;
    std::atomic<int> calls = 0;
    notifications_->registerForNotification("a", *queue_, [&](std::int32_t) {
        began = true;
        waitFor([&] { return mayEnd.load(); });
        ++calls;
    });
    const auto other = queues_.makeSerialQueue("other", QualityOfService::Default);
    std::atomic<int> marks = 0;
    notifications_->registerForNotification("mark", *other, [&](std::int32_t) { ++marks; });
    replace("a", "1");
    ASSERT_TRUE(waitFor([&] { return began.load(); }));
    replace("a", "2");
    replace("a", "3");
    replace("mark", "1");
    ASSERT_TRUE(waitFor([&] { return marks == 1; }));
    mayEnd = true;
    EXPECT_TRUE(waitFor([&] { return calls == 2; }));
    notifications_.reset(); // before what the handlers refer to
    EXPECT_EQ(calls, 2);
}

TEST_F(LinuxNotificationsTest, AFolderThatIsDeletedAndMadeAgainIsWatchedAgain) {
    registerFor("a");
    post("a", 1);
    ASSERT_TRUE(isTold(1));
    for (std::uint64_t round = 2; round < 12; ++round) {
        fs::remove_all(path());
        post("a", round);
        ASSERT_TRUE(isTold(round)) << round;
    }
}

TEST_F(LinuxNotificationsTest, TheRuntimeFolderMayBeDeletedAsWell) {
    notifications_ = std::make_unique<LinuxNotifications>(folder_ / "run/vela");
    registerFor("a");
    for (std::uint64_t round = 1; round < 6; ++round) {
        // The watcher makes the folders again at its own pace: removing a tree may find them new.
        ASSERT_TRUE(waitFor([&] {
            std::error_code error;
            fs::remove_all(folder_ / "run", error);
            return !error;
        }));
        ASSERT_TRUE(waitFor([&] { return static_cast<bool>(postNotification(folder_ / "run/vela", "a", round)); }));
        ASSERT_TRUE(isTold(round)) << round;
    }
}

TEST_F(LinuxNotificationsTest, AFolderThatIsMovedAwayIsNotWatchedAnyMore) {
    registerFor("a");
    post("a", 1);
    ASSERT_TRUE(isTold(1));
    fs::rename(path(), folder_ / "old");
    post("a", 2);
    ASSERT_TRUE(isTold(2));
    const int before = calls_;
    std::ofstream(folder_ / "new") << "3";
    fs::rename(folder_ / "new", folder_ / "old/a");
    registerFor("mark");
    post("mark", 4);
    ASSERT_TRUE(isTold(4));
    EXPECT_EQ(calls_, before + 1);
}

TEST_F(LinuxNotificationsTest, AFolderThatIsHeldOpenWhileItIsReplacedIsNoticed) {
    registerFor("a");
    const FileDescriptor held(open(path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    fs::remove_all(path());
    post("a", 5);
    EXPECT_TRUE(isTold(5));
}

TEST_F(LinuxNotificationsTest, AFolderThatCannotBeMadeForAWhileIsFoundWhenItIsThere) {
    notifications_ = std::make_unique<LinuxNotifications>(folder_ / "run/vela");
    registerFor("a");
    std::ofstream(folder_ / "in the way") << "a file";
    // The watcher makes the folders again until the file is there.
    ASSERT_TRUE(waitFor([&] {
        std::error_code error;
        fs::remove_all(folder_ / "run", error);
        fs::rename(folder_ / "in the way", folder_ / "run", error);
        return !error;
    }));
    const NotificationRegistration failed = registerFor("b");
    EXPECT_EQ(failed.status, ENOTDIR);
    fs::remove(folder_ / "run");
    ASSERT_TRUE(postNotification(folder_ / "run/vela", "a", 6));
    EXPECT_TRUE(isTold(6));
}

TEST_F(LinuxNotificationsTest, ItEndsWithRegistrationsAndWithPostsUnderWay) {
    for (int round = 0; round < 20; ++round) {
        for (int number = 0; number < 5; ++number) {
            const auto registration =
                notifications_->registerForNotification("a", *queue_, [this](std::int32_t) { ++calls_; });
            ASSERT_EQ(registration.status, 0);
        }
        replace("a", "1");
        notifications_ = std::make_unique<LinuxNotifications>(folder_.path());
    }
}

TEST_F(LinuxNotificationsTest, RegistrationsPostsAndCancelsMayComeFromAnyThread) {
    registerFor("a");
    std::vector<std::thread> threads;
    for (int thread = 0; thread < 4; ++thread) {
        threads.emplace_back([this, thread] {
            for (int number = 0; number < 200; ++number) {
                const std::string name(1, static_cast<char>('a' + number % 3));
                const NotificationRegistration registration =
                    notifications_->registerForNotification(name, *queue_, [](std::int32_t) {});
                EXPECT_EQ(registration.status, 0);
                std::ofstream(path(".new" + std::to_string(thread))) << number;
                fs::rename(path(".new" + std::to_string(thread)), path(name));
                notifications_->state(registration.token);
                notifications_->cancel(registration.token);
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    replace("a", "5000");
    EXPECT_TRUE(isTold(5000));
}

} // namespace

} // namespace vela::platform

namespace vela::testing {

INSTANTIATE_TYPED_TEST_SUITE_P(Linux, NotificationsContract, platform::LinuxHarness);

} // namespace vela::testing
