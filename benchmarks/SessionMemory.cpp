// A long session: bytes for each stored message, and processor time of `stop` for sessions of growing length, with
// volume messages, summary and, as on an internal build, the file of all messages, which is written into a new folder.
// Prints one line for each length. An argument is the greatest length; a million otherwise.
#include "benchmarks/SessionBench.h"
#include "common/VelaReportingUtility.h"
#include "testing/TemporaryFolder.h"

#include <algorithm>
#include <charconv>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <sys/wait.h>
#include <unistd.h>

namespace {

double residentBytes() {
    long pages = 0;
    std::FILE* file = std::fopen("/proc/self/statm", "re");
    if (file == nullptr || std::fscanf(file, "%*s %ld", &pages) != 1) {
        std::perror("/proc/self/statm");
        std::exit(1);
    }
    std::fclose(file);
    return static_cast<double>(pages) * static_cast<double>(sysconf(_SC_PAGESIZE));
}

class InternalBuild final : public vela::platform::DeviceProperties {
public:
    std::optional<bool> booleanProperty(std::string_view) const override { return true; }
    bool featureEnabled(std::string_view, std::string_view) const override { return false; }
};

std::uintmax_t bytesBelow(const std::string& folder) {
    std::uintmax_t bytes = 0;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(folder)) {
        bytes += entry.is_regular_file() ? entry.file_size() : 0;
    }
    return bytes;
}

void run(std::int64_t length, const std::string& folder) {
    constexpr double kOwnStrings = 2 * 24;
    vela::SessionBench bench(folder);
    std::shared_ptr<vela::VelaReportingSession> session = bench.startedSession();
    const double before = residentBytes();
    for (std::int64_t number = 0; number < length; ++number) {
        session->sendMessage(vela::benchMessage(number), vela::AudioEventCategoryPlayback, vela::AudioEventTypeState,
                             {});
    }
    while (bench.beacon.sent < static_cast<std::uint64_t>(length)) {
        usleep(1'000); // what is still on its way to the back end would count as well
    }
    const double each = (residentBytes() - before) / static_cast<double>(length);
    const double begin = vela::threadSeconds();
    session->stop();
    const double seconds = vela::threadSeconds() - begin;
    std::printf(
        "%8lld messages: %4.0f bytes each, %4.0f beside its own strings; stop %.3f s, %5.0f ns each; file %ju MB\n",
        static_cast<long long>(length), each, each - kOwnStrings, seconds, seconds * 1e9 / static_cast<double>(length),
        bytesBelow(folder) / 1'000'000);
    std::fflush(stdout);
}

} // namespace

int main(int argc, char** argv) {
    std::int64_t longest = 1'000'000;
    if (argc > 1 && std::from_chars(argv[1], argv[1] + std::strlen(argv[1]), longest).ec != std::errc()) {
        std::fputs("usage: session_memory [LENGTH]\n", stderr);
        return 2;
    }
    const InternalBuild device;
    const vela::VelaReportingBuildType buildType(device);
    // Each in a process of its own: memory that an earlier run gave back would be used again and not be seen.
    for (std::int64_t length = std::min<std::int64_t>(longest, 10'000); length <= longest; length *= 10) {
        const pid_t child = fork();
        if (child == 0) {
            const vela::testing::TemporaryFolder folder;
            run(length, folder.path());
            return 0;
        }
        int status = 0;
        if (child < 0 || waitpid(child, &status, 0) != child || status != 0) {
            std::perror("session_memory");
            return 1;
        }
    }
    return 0;
}
