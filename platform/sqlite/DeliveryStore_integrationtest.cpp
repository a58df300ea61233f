// The store under a process that dies at any moment, and under the stock tool.
#include "platform/linux/LinuxClock.h"
#include "platform/sqlite/StoreBeacon.h"
#include "platform/sqlite/StoreHarness_test.h"
#include "platform/sqlite/StoreTelem.h"
#include "testing/RunProgram.h"

#include <atomic>
#include <csignal>
#include <filesystem>
#include <new>
#include <random>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

namespace vela::platform {

namespace {

/// Numbers that two processes see.
class SharedNumber {
public:
    SharedNumber()
        : memory_(mmap(nullptr, sizeof(std::atomic<std::int64_t>), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS,
                       -1, 0)),
          number_(new (memory_) std::atomic<std::int64_t>(0)) {}
    ~SharedNumber() { munmap(memory_, sizeof(std::atomic<std::int64_t>)); }
    SharedNumber(const SharedNumber&) = delete;
    SharedNumber& operator=(const SharedNumber&) = delete;
    std::atomic<std::int64_t>& operator*() const { return *number_; }

private:
    void* memory_;
    std::atomic<std::int64_t>* number_;
};

class DeliveryStoreKillTest : public StoreHarness {
protected:
    /// Stores until it is killed; tells how many messages it knows to be committed since the start of the test.
    [[noreturn]] void storeForever(std::atomic<std::int64_t>& acknowledged) {
        DeliveryLedger ledger(getpid());
        const LinuxClock clock;
        Result<std::unique_ptr<DeliveryStore>> store = DeliveryStore::open(options_, ledger, clock);
        if (!store) {
            _exit(3);
        }
        StoreBeacon beacon(**store, {"store"});
        StoreTelem telem(**store);
        for (std::int64_t round = 1;; ++round) {
            const auto entry = ledger.open(getpid(), round);
            const LedgerScope scope(entry);
            const auto session = beacon.createBeaconSession({{"session_id", round}}, {});
            for (std::int64_t number = 0; number < 20; ++number) {
                entry->received(DeliveryBackend::Beacon);
                if (!session->sendBeaconMessage(1, 2, {{"number", number}, {"text", "of some length"}})) {
                    _exit(4);
                }
                telem.telemPostMetric(1, "bytes", {{"number", number}});
            }
            if (!(*store)->commitAll()) {
                _exit(5);
            }
            acknowledged += 40;
        }
    }

    void killOnce(std::chrono::microseconds life, std::atomic<std::int64_t>& acknowledged) {
        const std::int64_t before = acknowledged;
        const pid_t child = fork();
        ASSERT_GE(child, 0);
        if (child == 0) {
            storeForever(acknowledged);
        }
        // The process dies somewhere behind its first commit.
        int status = 0;
        while (acknowledged == before && waitpid(child, &status, WNOHANG) == 0) {
            usleep(200);
        }
        usleep(static_cast<useconds_t>(life.count()));
        kill(child, SIGKILL);
        ASSERT_EQ(waitpid(child, &status, 0), child);
        ASSERT_TRUE(WIFSIGNALED(status)) << "it ended by itself with " << WEXITSTATUS(status);
    }

    void expectNothingLost(std::int64_t acknowledged) {
        EXPECT_GE(std::stoll(only("SELECT sum(rows + evicted) FROM backend")), acknowledged);
        EXPECT_EQ(only("SELECT count(*) FROM ledger WHERE received < delivered + redundant + no_consumer + no_backends "
                       "+ not_reported + \"limit\" + failed + queue_full + store_failed + abandoned + restart"),
                  "0");
        expectAccountsToHold();
    }

    void killManyTimes(int rounds) {
        options_.commitMessages = 16;
        options_.commitDelay = std::chrono::milliseconds(5);
        options_.file.maxBytes = 1024 * 1024;
        const SharedNumber acknowledged;
        std::mt19937 random(std::random_device{}());
        std::uniform_int_distribution<int> life(0, 30'000);
        for (int round = 0; round < rounds && !HasFatalFailure(); ++round) {
            SCOPED_TRACE(round);
            killOnce(std::chrono::microseconds(life(random)), *acknowledged);
            expectNothingLost(*acknowledged);
        }
    }
};

TEST_F(DeliveryStoreKillTest, NothingAcknowledgedIsLostAndTheLedgerAgreesWithTheRows) { killManyTimes(20); }

// Run it after changes to the store's transactions.
TEST_F(DeliveryStoreKillTest, DISABLED_TwoHundredKillsLoseNothingAcknowledgedAndTheLedgerAgreesWithTheRows) {
    killManyTimes(200);
}

class DeliveryStoreToolTest : public StoreHarness {};

TEST_F(DeliveryStoreToolTest, TheStockToolReadsTheView) {
    if (!std::filesystem::exists("/usr/bin/sqlite3")) {
        GTEST_SKIP() << "there is no sqlite3";
    }
    const auto store = openStore();
    StoreBeacon beacon(*store, {"store"});
    const auto session = beacon.createBeaconSession({{"session_id", 42}}, {{"service_name", "alarms_session"}});
    EXPECT_TRUE(session->sendBeaconMessage(3, 5, {{"volume", 0.5}, {"route", "speaker"}}));
    ASSERT_TRUE(store->commitAll());
    const vela::testing::ProgramRun run = vela::testing::runProgram(
        {"/usr/bin/sqlite3", "-readonly", options_.file.path,
         "SELECT seq, time, backend, operation, name, session_id, category, type, payload, payload ->> '$.route' "
         "FROM deliveries WHERE operation = 'send'"},
        {});
    EXPECT_EQ(run.error, "");
    EXPECT_EQ(run.out,
              "2|1700000000.0|beacon|send|alarms_session|42|3|5|{\"volume\":0.5,\"route\":\"speaker\"}|speaker\n");
    EXPECT_EQ(run.status, 0);
}

} // namespace

} // namespace vela::platform
