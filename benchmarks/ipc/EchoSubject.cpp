// The plainest thing that can be called interprocess communication: packets with an encoding made by hand, decoded into
// a map, and answered with their number.
//
//     serial u32 | reply wanted u8 | entries u8 | per entry: key length u8, key, kind u8, value (text: length u8, text)
#include "benchmarks/ipc/BenchMessage.h"
#include "benchmarks/ipc/Subject.h"
#include "platform/linux/FileDescriptor.h"

#include <array>
#include <cstring>
#include <sys/epoll.h>
#include <sys/socket.h>

namespace vela::ipcbench {

namespace {

using platform::FileDescriptor;

enum Kind : std::uint8_t { Boolean, Integer, Real, Text };

class Encoder {
public:
    explicit Encoder(char* to) : at_(to) {}

    template <class Number>
    void number(Number value) {
        std::memcpy(at_, &value, sizeof(value));
        at_ += sizeof(value);
    }
    void text(std::string_view text) {
        number(static_cast<std::uint8_t>(text.size()));
        std::memcpy(at_, text.data(), text.size());
        at_ += text.size();
    }
    void value(bool value) { number(Boolean), number(static_cast<std::uint8_t>(value)); }
    void value(std::int64_t value) { number(Integer), number(value); }
    void value(double value) { number(Real), number(value); }
    void value(std::string_view value) { number(Text), text(value); }
    char* end() const { return at_; }

private:
    char* at_;
};

class Decoder {
public:
    explicit Decoder(const char* from) : at_(from) {}

    template <class Number>
    Number number() {
        Number value;
        std::memcpy(&value, at_, sizeof(value));
        at_ += sizeof(value);
        return value;
    }
    std::string text() {
        const auto size = number<std::uint8_t>();
        std::string text(at_, size);
        at_ += size;
        return text;
    }
    PlainValue value() {
        switch (number<Kind>()) {
        case Boolean:
            return number<std::uint8_t>() != 0;
        case Integer:
            return number<std::int64_t>();
        case Real:
            return number<double>();
        case Text:
            return text();
        }
        require(false, "a value of no kind");
        return {};
    }

private:
    const char* at_;
};

using Packet = std::array<char, 2048>;

/// Answers false when nothing more comes.
bool echoOne(int socket, Packet& packet) {
    if (recv(socket, packet.data(), packet.size(), 0) <= 0) {
        return false;
    }
    Decoder decoder(packet.data());
    const auto serial = decoder.number<std::uint32_t>();
    const bool reply = decoder.number<std::uint8_t>() != 0;
    PlainMap message;
    for (auto left = decoder.number<std::uint8_t>(); left > 0; --left) {
        std::string key = decoder.text();
        message.emplace(std::move(key), decoder.value());
    }
    require(isWhole(message), "a message is not what was sent");
    return !reply || send(socket, &serial, sizeof(serial), MSG_NOSIGNAL) == sizeof(serial);
}

void serve(int listener, unsigned clients) {
    Packet packet;
    const FileDescriptor epoll(epoll_create1(EPOLL_CLOEXEC));
    int only = -1;
    for (unsigned client = 0; client < clients; ++client) {
        only = accept(listener, nullptr, nullptr);
        epoll_event event{};
        event.events = EPOLLIN;
        event.data.fd = only;
        epoll_ctl(epoll.get(), EPOLL_CTL_ADD, only, &event);
    }
    if (clients == 1) {
        while (echoOne(only, packet)) {
        }
        return;
    }
    std::array<epoll_event, 64> events;
    for (;;) {
        const int count = epoll_wait(epoll.get(), events.data(), static_cast<int>(events.size()), -1);
        for (int index = 0; index < count; ++index) {
            const int socket = events[static_cast<std::size_t>(index)].data.fd;
            if (!echoOne(socket, packet)) {
                epoll_ctl(epoll.get(), EPOLL_CTL_DEL, socket, nullptr);
            }
        }
    }
}

class EchoChannel final : public Channel {
public:
    explicit EchoChannel(const std::string& path) : socket_(connectedSocket(path, SOCK_SEQPACKET)) {}

    void post(std::int64_t number, bool reply) override {
        Packet packet;
        Encoder encoder(packet.data());
        encoder.number(static_cast<std::uint32_t>(number));
        encoder.number(static_cast<std::uint8_t>(reply));
        encoder.number(static_cast<std::uint8_t>(kEntries));
        forEachEntry(number, [&encoder](std::string_view key, auto value) {
            encoder.text(key);
            encoder.value(value);
        });
        const auto bytes = static_cast<std::size_t>(encoder.end() - packet.data());
        require(send(socket_.get(), packet.data(), bytes, MSG_NOSIGNAL) == static_cast<ssize_t>(bytes), "echo: send");
    }
    void takeReply() override {
        std::uint32_t serial = 0;
        require(recv(socket_.get(), &serial, sizeof(serial), 0) == sizeof(serial), "echo: receive");
    }

private:
    FileDescriptor socket_;
};

} // namespace

Subject echoSubject() {
    return {"(a) bare echo", [](unsigned clients) {
                const std::string path = socketPath("echo");
                auto running = std::make_unique<ForkedServer>(path, SOCK_SEQPACKET, clients, serve);
                running->connect(clients, [&path] { return std::make_unique<EchoChannel>(path); });
                return running;
            }};
}

} // namespace vela::ipcbench
