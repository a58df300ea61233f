#include "benchmarks/ipc/ServiceAtRest.h"

#include "benchmarks/ipc/Measurement.h"
#include "benchmarks/ipc/ServiceProcess.h"

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>

namespace vela::ipcbench {

namespace {

/// The number behind `name` in a status file of procfs; 0 where there is none.
std::uint64_t statusNumber(const std::filesystem::path& file, const std::string& name) {
    std::ifstream lines(file);
    for (std::string line; std::getline(lines, line);) {
        if (line.starts_with(name + ":")) {
            return std::stoull(line.substr(name.size() + 1));
        }
    }
    return 0;
}

std::uint64_t overThreads(pid_t process, const std::string& name) {
    std::uint64_t sum = 0;
    for (const auto& thread : std::filesystem::directory_iterator("/proc/" + std::to_string(process) + "/task")) {
        sum += statusNumber(thread.path() / "status", name);
    }
    return sum;
}

} // namespace

std::vector<double> firstReplies(unsigned times) {
    std::vector<double> seconds;
    if (!std::filesystem::exists("/usr/bin/systemd-socket-activate")) {
        return seconds;
    }
    for (unsigned time = 0; time < times; ++time) {
        const ServiceProcess service(true);
        const auto begin = std::chrono::steady_clock::now();
        auto connection = service.connection();
        require(connection.has_value(), "service: connect on demand");
        callWithID(*connection, platform::dbus::kCreateReportingSession, 1);
        seconds.push_back(std::chrono::duration<double>(std::chrono::steady_clock::now() - begin).count());
    }
    std::sort(seconds.begin(), seconds.end());
    return seconds;
}

namespace {

/// Until nothing has run for two seconds: the store writes its ledger a second after the last delivery.
void waitUntilStill(pid_t process) {
    constexpr std::chrono::seconds kStill{2};
    std::uint64_t before = 0;
    std::uint64_t now = overThreads(process, "voluntary_ctxt_switches");
    for (int attempt = 0; attempt < 10 && now != before; ++attempt) {
        before = now;
        std::this_thread::sleep_for(kStill);
        now = overThreads(process, "voluntary_ctxt_switches");
    }
}

} // namespace

AtRest serviceAtRest(bool withSession, unsigned seconds) {
    constexpr int kMessages = 100;
    const ServiceProcess service;
    auto connection = service.connection();
    if (withSession) {
        startSession(*connection, 1);
        std::string bytes;
        for (int number = 0; number < kMessages; ++number) {
            appendMessage(bytes, connection->nextSerial(), number, 1, false);
        }
        require(static_cast<bool>(connection->send(bytes)), "service: send");
    } else {
        connection.reset();
    }
    waitUntilStill(service.process());
    const std::uint64_t wakeUps = overThreads(service.process(), "voluntary_ctxt_switches");
    const std::uint64_t preempted = overThreads(service.process(), "nonvoluntary_ctxt_switches");
    std::this_thread::sleep_for(std::chrono::seconds(seconds));
    constexpr double kKiB = 1024;
    const std::string status = "/proc/" + std::to_string(service.process()) + "/status";
    return {.residentBytes = static_cast<double>(statusNumber(status, "VmRSS")) * kKiB,
            .wakeUps = overThreads(service.process(), "voluntary_ctxt_switches") - wakeUps,
            .preempted = overThreads(service.process(), "nonvoluntary_ctxt_switches") - preempted};
}

} // namespace vela::ipcbench
