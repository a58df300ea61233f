// The built service. Its analytics have no consumer, so that each message becomes exactly one stored row.
#include "benchmarks/delivery/Peer.h"
#include "benchmarks/ipc/ServiceProcess.h"
#include "platform/sqlite/SqliteDatabase.h"
#include "platform/sqlite/StoreReader.h"

#include <optional>
#include <thread>

namespace vela::deliverybench {

namespace {

namespace dbus = platform::dbus;

constexpr std::int64_t kReporter = 42;

/// The totals of real-time reporting in the service's ledger.
struct Account {
    std::int64_t received = 0;
    std::int64_t delivered = 0;
    std::int64_t queued = 0;
};

Account accountOf(dbus::BlockingConnection& connection) {
    const Dictionary totals = ipcbench::ledgerTotals(connection);
    const ValueRef beacon = totals.find("beacon");
    if (!beacon.isDictionary()) {
        return {};
    }
    const Dictionary counts = beacon.dictionary();
    return {counts.find("received").integerValue(), counts.find("delivered").integerValue(),
            counts.find("queued").integerValue()};
}

/// Reads a session's deliveries from the first to the last, a hundred at a time, again and again, until it ends.
class StoreWatcher {
public:
    StoreWatcher(std::string file, std::vector<double>& latencies)
        : thread_([file = std::move(file), &latencies](const std::stop_token& stop) { read(stop, file, latencies); }) {}

private:
    static void read(const std::stop_token& stop, const std::string& file, std::vector<double>& latencies) {
        constexpr std::size_t kRows = 100;
        constexpr std::chrono::milliseconds kBetween{1};
        auto opened = platform::StoreReader::open(file);
        require(static_cast<bool>(opened), "the store cannot be read");
        platform::StoreReader reader = *std::move(opened);
        platform::StoreFilter filter;
        filter.session = kReporter;
        while (!stop.stop_requested()) {
            const Clock::time_point begin = Clock::now();
            const auto rows = reader.read(filter, kRows);
            const std::chrono::duration<double> taken = Clock::now() - begin;
            require(static_cast<bool>(rows), "the store cannot be read");
            if (rows->size() == kRows) {
                latencies.push_back(taken.count());
            }
            filter.after = rows->size() == kRows ? rows->back().seq : 0;
            std::this_thread::sleep_for(kBetween);
        }
    }

    std::jthread thread_;
};

/// Sends without replies. What is under way stays below the length of the store's queue, which refuses what is more.
void sendAll(dbus::BlockingConnection& connection, std::size_t messages) {
    constexpr std::size_t kBurst = 4'096;
    constexpr std::size_t kUnderWay = 2 * kBurst;
    constexpr std::chrono::milliseconds kBetween{1};
    std::string bytes;
    for (std::size_t sent = 0; sent < messages;) {
        for (const std::size_t end = std::min(messages, sent + kBurst); sent < end; ++sent) {
            bytes.clear();
            ipcbench::appendMessage(bytes, connection.nextSerial(), static_cast<std::int64_t>(sent), kReporter, false);
            require(static_cast<bool>(connection.send(bytes)), "service: send");
        }
        while (sent < messages && sent - static_cast<std::size_t>(accountOf(connection).delivered) > kUnderWay) {
            std::this_thread::sleep_for(kBetween);
        }
    }
}

void waitUntilKept(dbus::BlockingConnection& connection, std::size_t messages) {
    constexpr std::chrono::milliseconds kBetween{2};
    const auto all = static_cast<std::int64_t>(messages);
    Account account = accountOf(connection);
    for (; account.received < all || account.queued > 0; account = accountOf(connection)) {
        std::this_thread::sleep_for(kBetween);
    }
    require(account.received == all && account.delivered == all, "service: not every message was delivered");
}

void requireRows(const std::string& file, std::size_t messages) {
    auto opened = platform::SqliteDatabase::open(file, platform::SqliteDatabase::Access::ReadOnly);
    require(static_cast<bool>(opened), "the store cannot be opened");
    platform::SqliteDatabase database = *std::move(opened);
    require(database.integer("SELECT count(*) FROM deliveries WHERE operation = 'send'") ==
                    static_cast<std::int64_t>(messages) &&
                database.integer("SELECT count(*) FROM deliveries WHERE backend <> 'beacon'") == 0,
            "service: not one row for each message");
}

Cost measure(std::size_t messages, std::vector<double>* latencies) {
    const ipcbench::ServiceProcess service(false, {"tally.used=[]"});
    auto connection = service.connection();
    require(connection.has_value(), "service: connect");
    ipcbench::startSession(*connection, kReporter);
    Watch watch(service.process());
    {
        std::optional<StoreWatcher> watcher;
        if (latencies != nullptr) {
            watcher.emplace(service.storeFile(), *latencies);
        }
        sendAll(*connection, messages);
        waitUntilKept(*connection, messages);
        watch.kept();
    }
    Cost cost = watch.costOf(messages);
    cost.bytes = static_cast<double>(sizeOfDatabase(service.storeFile())) / static_cast<double>(messages);
    requireRows(service.storeFile(), messages);
    return cost;
}

} // namespace

Peer servicePeer(std::vector<double>* latencies) {
    return {latencies == nullptr ? "service" : "service, read", "committed, synchronous=FULL", "",
            [latencies](std::size_t messages) { return measure(messages, latencies); }};
}

} // namespace vela::deliverybench
