// The machine's own journal, spoken to as any program does: one datagram a message, each entry a field.
#include "benchmarks/delivery/Peer.h"
#include "benchmarks/ipc/BenchMessage.h"

#include <algorithm>
#include <charconv>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <optional>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace vela::deliverybench {

namespace {

const char* const kSocket = "/run/systemd/journal/socket";

std::optional<pid_t> journalProcess() {
    std::error_code ignored;
    for (const auto& entry : std::filesystem::directory_iterator("/proc", ignored)) {
        std::string name;
        std::getline(std::ifstream(entry.path() / "comm"), name);
        // The system cuts names after 15 bytes.
        if (name == "systemd-journal") {
            return static_cast<pid_t>(std::stol(entry.path().filename()));
        }
    }
    return std::nullopt;
}

/// A socket that the journal takes datagrams from, or -1.
int journalSocket() {
    const int descriptor = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::string_view(kSocket).copy(address.sun_path, sizeof(address.sun_path) - 1);
    if (connect(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0) {
        return descriptor;
    }
    close(descriptor);
    return -1;
}

void appendValue(std::string& fields, bool value) { fields += value ? "true" : "false"; }
void appendValue(std::string& fields, std::string_view value) { fields += value; }
template <class Number>
void appendValue(std::string& fields, Number value) {
    char digits[32];
    fields.append(digits, std::to_chars(digits, std::end(digits), value).ptr);
}

void appendFields(std::string& fields, std::int64_t number) {
    ipcbench::forEachEntry(number, [&fields](std::string_view key, auto value) {
        // Names of fields are capital letters; no value here has a line end.
        std::transform(key.begin(), key.end(), std::back_inserter(fields), [](char letter) {
            return letter >= 'a' && letter <= 'z' ? static_cast<char>(letter - 'a' + 'A') : letter;
        });
        fields += '=';
        appendValue(fields, value);
        fields += '\n';
    });
}

std::uintmax_t bytesOfJournals() { return bytesBelow("/run/log/journal") + bytesBelow("/var/log/journal"); }

Cost measure(pid_t journal, std::size_t messages) {
    const int socket = journalSocket();
    require(socket >= 0, "journal: connect");
    const std::uintmax_t before = bytesOfJournals();
    const Watch watch(journal);
    std::string fields;
    for (std::size_t number = 0; number < messages; ++number) {
        fields.clear();
        appendFields(fields, static_cast<std::int64_t>(number));
        require(send(socket, fields.data(), fields.size(), MSG_NOSIGNAL) > 0, "journal: send");
    }
    Cost cost = watch.costOf(messages);
    close(socket);
    cost.bytes = (static_cast<double>(bytesOfJournals()) - static_cast<double>(before)) / static_cast<double>(messages);
    return cost;
}

} // namespace

Peer journalPeer() {
    const std::optional<pid_t> journal = journalProcess();
    const int socket = journalSocket();
    const bool there = socket >= 0 && journal;
    if (socket >= 0) {
        close(socket);
    }
    return {"journald", "in the journal's pages: NOT on the disk, which it syncs minutes later",
            there ? "" : "nobody takes datagrams at " + std::string(kSocket),
            [journal](std::size_t messages) { return measure(*journal, messages); }};
}

} // namespace vela::deliverybench
