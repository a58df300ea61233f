// What a call costs the audio thread that makes it: sendMessage with 12 entries, call by call, against a peer that
// reads everything, against one that is stopped and reads nothing, and now and then, when every call finds the client's
// thread asleep. Beside them stands the plainest thing that does the same: marshalling into a text and one send to a
// socket. Each line is a distribution over single calls in nanoseconds, the clock's own cost included.
//
// usage: client_benchmark [CALLS]

#include "common/values/Dictionary.h"
#include "platform/dbus/Authentication.h"
#include "platform/dbus/MessageWriter.h"
#include "platform/dbus/Protocol.h"
#include "platform/linux/FileDescriptor.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <thread>
#include <time.h>
#include <unistd.h>
#include <vector>
#include <vela/reporting.hpp>

namespace vela::client {

namespace {

using platform::FileDescriptor;
namespace dbus = platform::dbus;

std::int64_t nanoseconds() {
    timespec time{};
    clock_gettime(CLOCK_MONOTONIC, &time);
    return time.tv_sec * 1'000'000'000 + time.tv_nsec;
}

FileDescriptor listenAt(const std::string& path) {
    unlink(path.c_str());
    FileDescriptor listener(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path.c_str(), sizeof(address.sun_path) - 1);
    if (bind(listener.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0 ||
        listen(listener.get(), 8) != 0) {
        std::perror("listen");
        std::exit(1);
    }
    return listener;
}

/// A process that lets one client in and then reads and forgets.
[[noreturn]] void readEverything(const FileDescriptor& listener) {
    const FileDescriptor peer(accept(listener.get(), nullptr, nullptr));
    dbus::ServerAuthentication authentication(getuid(), "0123456789abcdef0123456789abcdef");
    std::vector<char> block(65536);
    auto state = dbus::AuthenticationState::Waiting;
    while (true) {
        const ssize_t got = read(peer.get(), block.data(), block.size());
        if (got <= 0) {
            std::_Exit(0);
        }
        if (state == dbus::AuthenticationState::Waiting) {
            std::string_view bytes(block.data(), static_cast<std::size_t>(got));
            std::string answer;
            state = authentication.feed(bytes, answer);
            if (write(peer.get(), answer.data(), answer.size()) < 0) {
                std::_Exit(1);
            }
        }
    }
}

class PeerProcess {
public:
    explicit PeerProcess(const std::string& path) {
        const FileDescriptor listener = listenAt(path);
        process_ = fork();
        if (process_ == 0) {
            readEverything(listener);
        }
    }
    ~PeerProcess() {
        kill(process_, SIGCONT);
        kill(process_, SIGKILL);
        waitpid(process_, nullptr, 0);
    }
    PeerProcess(const PeerProcess&) = delete;
    PeerProcess& operator=(const PeerProcess&) = delete;
    void stop() const {
        kill(process_, SIGSTOP);
        int status = 0;
        waitpid(process_, &status, WUNTRACED);
    }

private:
    pid_t process_;
};

void print(const char* what, std::vector<std::int64_t>& times) {
    if (times.empty()) {
        std::printf("%-58s none\n", what);
        return;
    }
    std::sort(times.begin(), times.end());
    const auto at = [&](double share) {
        return static_cast<long long>(times[static_cast<std::size_t>(static_cast<double>(times.size() - 1) * share)]);
    };
    std::printf("%-58s %8zu calls  p50 %6lld  p99 %6lld  p99.9 %7lld  max %9lld\n", what, times.size(), at(0.5),
                at(0.99), at(0.999), at(1));
}

reporting::Status sendTwelve(const reporting::Client& client, std::int64_t number) {
    return client.sendMessage({{"sample_rate", 48000.0},
                               {"frames", 512},
                               {"number", number},
                               {"overload", false},
                               {"device", "Built-in Output"},
                               {"route", "Speaker"},
                               {"volume", 0.5},
                               {"channels", 2},
                               {"latency", 0.0106},
                               {"underruns", 0},
                               {"format", "lpcm, 32-bit float"},
                               {"session_output_running", true}},
                              1, 3, {42});
}

struct Times {
    std::vector<std::int64_t> queued;
    std::vector<std::int64_t> refused;
};

/// Calls with a pause of about `pause` nanoseconds between them; from 100 microseconds on the thread sleeps.
Times measureCalls(const reporting::Client& client, int calls, std::int64_t pause) {
    Times times;
    times.queued.reserve(static_cast<std::size_t>(calls));
    times.refused.reserve(static_cast<std::size_t>(calls));
    for (int number = 0; number < calls; ++number) {
        const std::int64_t begin = nanoseconds();
        const reporting::Status status = sendTwelve(client, number);
        const std::int64_t end = nanoseconds();
        (status == VelaReportingStatusOk ? times.queued : times.refused).push_back(end - begin);
        if (pause >= 100'000) {
            std::this_thread::sleep_for(std::chrono::nanoseconds(pause));
        } else {
            while (nanoseconds() < end + pause) {
            }
        }
    }
    return times;
}

void waitForConnection(const reporting::Client& client) {
    while (!client.state().connected) {
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
}

reporting::Client makeClient(const std::string& address) {
    return reporting::Client({.address = address.c_str(), .queueBytes = 0, .patience = std::chrono::milliseconds(0)});
}

void measureReading(const std::string& path, int calls, std::int64_t pause, const char* what) {
    const PeerProcess peer(path);
    const reporting::Client client = makeClient("unix:path=" + path);
    waitForConnection(client);
    measureCalls(client, 100, 1000);
    Times times = measureCalls(client, calls, pause);
    print(what, times.queued);
    if (!times.refused.empty()) {
        print("    of these, the queue was full", times.refused);
    }
}

void measureStopped(const std::string& path, int calls) {
    const PeerProcess peer(path);
    const reporting::Client client = makeClient("unix:path=" + path);
    waitForConnection(client);
    measureCalls(client, 100, 1000);
    peer.stop();
    Times times = measureCalls(client, calls, 5000);
    print("peer stopped by SIGSTOP, while the queue fills", times.queued);
    print("peer stopped by SIGSTOP, queue full", times.refused);
    std::printf("    counted as dropped: %llu, highest use of the queue: %zu bytes\n",
                static_cast<unsigned long long>(client.state().droppedQueueFull), client.state().highestQueuedBytes);
}

/// The same message as a dictionary of values, marshalled into a text and sent from the calling thread.
void measurePlain(int calls) {
    std::array<int, 2> ends{};
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()) != 0) {
        return;
    }
    const FileDescriptor mine(ends[0]);
    std::thread reader([other = FileDescriptor(ends[1])] {
        std::vector<char> block(65536);
        while (read(other.get(), block.data(), block.size()) > 0) {
        }
    });
    std::vector<std::int64_t> times;
    std::string output;
    for (int number = 0; number < calls; ++number) {
        const std::int64_t begin = nanoseconds();
        const Dictionary message = {{"sample_rate", 48000.0},
                                    {"frames", 512},
                                    {"number", number},
                                    {"overload", false},
                                    {"device", "Built-in Output"},
                                    {"route", "Speaker"},
                                    {"volume", 0.5},
                                    {"channels", 2},
                                    {"latency", 0.0106},
                                    {"underruns", 0},
                                    {"format", "lpcm, 32-bit float"},
                                    {"session_output_running", true}};
        output.clear();
        dbus::MessageWriter writer(output);
        writer.beginCall({.serial = 1,
                          .path = dbus::kObjectPath,
                          .interface = dbus::kReportingInterface,
                          .member = dbus::kSendMessage,
                          .destination = {},
                          .signature = "a{sv}uqaax",
                          .replyExpected = false});
        writer.dictionary(message);
        writer.uint32(1);
        writer.uint16(3);
        writer.optionalInt64s(std::vector<std::int64_t>{42});
        if (!writer.finish() || send(mine.get(), output.data(), output.size(), MSG_NOSIGNAL) < 0) {
            break;
        }
        const std::int64_t end = nanoseconds();
        times.push_back(end - begin);
        while (nanoseconds() < end + 5000) {
        }
    }
    shutdown(mine.get(), SHUT_RDWR);
    print("plain: marshalled and sent by the caller, 5 us between", times);
    reader.join();
}

} // namespace

} // namespace vela::client

int main(int argc, char** argv) {
    using namespace vela::client;
    const int calls = argc > 1 ? std::atoi(argv[1]) : 200'000; // NOLINT(cert-err34-c): a count for a person
    const std::string path = "/tmp/vela-client-benchmark-" + std::to_string(getpid());
    measureReading(path, calls, 5000, "peer reads all, 5 us between calls");
    measureReading(path, calls, 0, "peer reads all, no pause");
    measureReading(path, calls / 20, 500'000, "peer reads all, 500 us between calls");
    measureReading(path, calls / 400, 10'000'000, "peer reads all, 10 ms between calls");
    measureReading(path, calls / 1000, 40'000'000, "peer reads all, 40 ms between calls (thread asleep)");
    measureStopped(path, calls);
    measurePlain(calls / 10);
    unlink(path.c_str());
    return 0;
}
