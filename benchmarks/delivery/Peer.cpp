#include "benchmarks/delivery/Peer.h"

#include "benchmarks/ipc/Measurement.h"
#include "platform/sqlite/SqliteDatabase.h"

#include <ctime>
#include <filesystem>
#include <sys/socket.h>
#include <sys/stat.h>
#include <thread>

namespace vela::deliverybench {

namespace {

double threadSeconds() {
    timespec time{};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
}

struct Rest {
    double processorSeconds;
    Clock::time_point since;
};

/// At rest is who uses less than a millisecond in `kRest`: some look at a timer now and then.
Rest waitForRest(pid_t process) {
    constexpr double kNothing = 0.001;
    constexpr std::chrono::milliseconds kRest{300};
    constexpr std::chrono::milliseconds kBetween{5};
    Rest rest{ipcbench::processorSeconds(process), Clock::now()};
    while (Clock::now() - rest.since < kRest) {
        std::this_thread::sleep_for(kBetween);
        const double now = ipcbench::processorSeconds(process);
        if (now - rest.processorSeconds > kNothing) {
            rest = {now, Clock::now()};
        }
    }
    return rest;
}

} // namespace

Watch::Watch(pid_t server)
    : server_(server),
      serverBefore_(waitForRest(server).processorSeconds),
      clientBefore_(threadSeconds()),
      begin_(Clock::now()) {}

Cost Watch::costOf(std::size_t messages) const {
    const auto count = static_cast<double>(messages);
    const double client = threadSeconds() - clientBefore_;
    const Rest rest = waitForRest(server_);
    const Clock::time_point end = kept_ == Clock::time_point() ? rest.since : kept_;
    return {.server = (rest.processorSeconds - serverBefore_) / count,
            .client = client / count,
            .rate = count / std::chrono::duration<double>(end - begin_).count()};
}

std::uintmax_t bytesBelow(const std::string& folder) {
    constexpr std::uintmax_t kBlock = 512;
    std::error_code ignored;
    std::uintmax_t sum = 0;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(folder, ignored)) {
        struct stat status {};
        if (lstat(entry.path().c_str(), &status) == 0 && S_ISREG(status.st_mode)) {
            sum += static_cast<std::uintmax_t>(status.st_blocks) * kBlock;
        }
    }
    return sum;
}

std::uintmax_t sizeOfDatabase(const std::string& file) {
    using platform::SqliteDatabase;
    constexpr int kPatience = 10'000;
    auto opened = SqliteDatabase::open(file, SqliteDatabase::Access::ReadWrite);
    require(static_cast<bool>(opened), "the store cannot be opened");
    SqliteDatabase database = *std::move(opened);
    database.setPatience(kPatience);
    // A connection knows of the log only when it has read something.
    require(database.integer("PRAGMA schema_version").has_value(), "the store cannot be read");
    require(database.checkpoint(SqliteDatabase::Checkpoint::Everything), "the store's log cannot be moved");
    return std::filesystem::file_size(file);
}

void sendWhole(int socket, std::string_view bytes) {
    while (!bytes.empty()) {
        const ssize_t sent = send(socket, bytes.data(), bytes.size(), MSG_NOSIGNAL);
        require(sent > 0, "send");
        bytes.remove_prefix(static_cast<std::size_t>(sent));
    }
}

} // namespace vela::deliverybench
