// A stream of a Redis server that syncs its file before it answers: XADD, 64 calls under way.
#include "benchmarks/delivery/Peer.h"
#include "benchmarks/ipc/BenchMessage.h"
#include "testing/RunningProgram.h"
#include "testing/TemporaryFolder.h"

#include <algorithm>
#include <charconv>
#include <filesystem>
#include <iterator>
#include <sys/socket.h>
#include <unistd.h>

namespace vela::deliverybench {

namespace {

const char* const kProgram = "/usr/bin/redis-server";
constexpr std::size_t kPipeline = 64;

/// A text with its length in front.
void appendText(std::string& bytes, std::string_view text) {
    char digits[24];
    bytes += '$';
    bytes.append(digits, std::to_chars(digits, std::end(digits), text.size()).ptr).append("\r\n");
    bytes.append(text).append("\r\n");
}
void appendValue(std::string& bytes, bool value) { appendText(bytes, value ? "true" : "false"); }
void appendValue(std::string& bytes, std::string_view value) { appendText(bytes, value); }
template <class Number>
void appendValue(std::string& bytes, Number value) {
    char digits[32];
    appendText(bytes, std::string_view(digits, std::to_chars(digits, std::end(digits), value).ptr));
}

void appendCall(std::string& bytes, std::int64_t number) {
    static_assert(ipcbench::kEntries == 12, "the number of texts below");
    bytes += "*27\r\n";
    for (const std::string_view text : {"XADD", "messages", "*"}) {
        appendText(bytes, text);
    }
    ipcbench::forEachEntry(number, [&bytes](std::string_view key, auto value) {
        appendText(bytes, key);
        appendValue(bytes, value);
    });
}

/// Each answer is two lines: the length of the entry's name, and the name.
void takeAnswers(int socket, std::size_t answers) {
    std::size_t lines = 0;
    char bytes[8192];
    while (lines < 2 * answers) {
        const ssize_t got = recv(socket, bytes, sizeof(bytes), 0);
        require(got > 0, "redis: receive");
        const std::string_view text(bytes, static_cast<std::size_t>(got));
        // A name is two numbers with a "-" between them; only an error begins a line with it.
        require(text.front() != '-' && text.find("\n-") == std::string_view::npos, "redis: an error");
        lines += static_cast<std::size_t>(std::count(text.begin(), text.end(), '\n'));
    }
}

Cost measure(std::size_t messages) {
    const testing::TemporaryFolder folder;
    const std::string path = folder / "socket";
    const testing::RunningProgram server({kProgram, "--port", "0", "--unixsocket", path, "--dir", folder.path(),
                                          "--appendonly", "yes", "--appendfsync", "always", "--save", "",
                                          "--auto-aof-rewrite-percentage", "0", "--loglevel", "warning"},
                                         {"PATH=/usr/bin:/bin"});
    require(testing::waitUntil([&path] { return std::filesystem::exists(path); }), "redis does not start");
    const int socket = ipcbench::connectedSocket(path, SOCK_STREAM);
    const std::uintmax_t before = bytesBelow(folder.path());
    Watch watch(server.pid());
    std::string bytes;
    for (std::size_t sent = 0; sent < messages;) {
        bytes.clear();
        const std::size_t group = std::min(kPipeline, messages - sent);
        for (const std::size_t end = sent + group; sent < end; ++sent) {
            appendCall(bytes, static_cast<std::int64_t>(sent));
        }
        sendWhole(socket, bytes);
        takeAnswers(socket, group);
    }
    watch.kept();
    Cost cost = watch.costOf(messages);
    cost.bytes = static_cast<double>(bytesBelow(folder.path()) - before) / static_cast<double>(messages);
    close(socket);
    return cost;
}

} // namespace

Peer redisPeer() {
    return {"redis, XADD", "answered, appendfsync always",
            access(kProgram, X_OK) == 0 ? "" : "there is no " + std::string(kProgram), measure};
}

} // namespace vela::deliverybench
