#include "client/FakeService_integrationtest.h"

#include "common/values/Json.h"
#include "platform/dbus/MessageWriter.h"
#include "platform/dbus/Protocol.h"

#include <array>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>
#include <utility>

namespace vela::testing {

namespace {

namespace dbus = platform::dbus;

constexpr std::string_view kServerId = "0123456789abcdef0123456789abcdef";

std::string listText(const std::optional<std::vector<std::int64_t>>& ids) {
    if (!ids) {
        return "all";
    }
    std::string text = "[";
    for (const std::int64_t id : *ids) {
        text += (text.size() > 1 ? "," : "") + std::to_string(id);
    }
    return text + "]";
}

RecordedCall recorded(const dbus::MessageHeader& header) {
    RecordedCall call;
    call.replyExpected = header.replyExpected();
    call.text = header.member;
    dbus::BodyReader body(header);
    if (header.signature == "x") {
        call.text += " " + std::to_string(body.int64());
    } else if (header.signature == "qx") {
        call.text += " " + std::to_string(body.uint16());
        call.text += " " + std::to_string(body.int64());
    } else if (header.signature == "a{sv}x") {
        call.dictionary = body.dictionary();
        call.text += " " + jsonText(Value(call.dictionary)) + " " + std::to_string(body.int64());
    } else if (header.signature == "a{sv}uqaax") {
        call.dictionary = body.dictionary();
        const Dictionary plain = call.dictionary.removing(Key("velareporting_timestamp"))
                                     .removing(Key("systemuptime_sec"))
                                     .removing(Key("processuptime_ms"));
        call.text += " " + jsonText(Value(plain)) + " " + std::to_string(body.uint32());
        call.text += " " + std::to_string(body.uint16());
        call.text += " " + listText(body.optionalInt64s());
    }
    body.finish();
    if (body.error()) {
        call.text += " MALFORMED: " + body.error()->text;
    }
    return call;
}

/// Writes what the real service answers where no session is known, except that the sessions asked for exist.
void writeReply(std::string& output, const dbus::MessageHeader& header) {
    dbus::BodyReader arguments(header);
    dbus::MessageWriter writer(output);
    dbus::ReplyHeader reply{.serial = 1, .replySerial = header.serial, .sender = {}, .signature = "b"};
    if (header.member == dbus::kGetServiceNameForReporterID) {
        reply.signature = "q";
        writer.beginReturn(reply);
        writer.uint16(11);
    } else if (header.member == dbus::kReporterID) {
        reply.signature = "a{sv}";
        writer.beginReturn(reply);
        const auto entries = writer.openDictionary();
        writer.key(dbus::kReporterIDKey);
        writer.variantInt64(arguments.int64());
        writer.key(dbus::kServiceTypeKey);
        writer.variantUint16(11);
        writer.closeArray(entries);
    } else if (header.member == dbus::kGetAllReporters) {
        reply.signature = "ax";
        writer.beginReturn(reply);
        writer.int64s(std::array<std::int64_t, 3>{42, -7, 4711});
    } else if (header.member == dbus::kSendMessage) {
        reply.signature = {};
        writer.beginReturn(reply);
    } else {
        writer.beginReturn(reply);
        writer.boolean(true);
    }
    EXPECT_TRUE(writer.finish());
}

} // namespace

FakeService::FakeService(std::string path) : path_(std::move(path)), wakeup_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
    start();
}

FakeService::~FakeService() { stop(); }

void FakeService::start() {
    unlink(path_.c_str());
    listener_ = platform::FileDescriptor(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path_.c_str(), sizeof(address.sun_path) - 1);
    if (bind(listener_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0 ||
        listen(listener_.get(), 16) != 0) {
        std::abort();
    }
    stopping_ = false;
    thread_ = std::thread([this] { run(); });
}

void FakeService::stop() {
    if (!thread_.joinable()) {
        return;
    }
    stopping_ = true;
    wake();
    thread_.join();
    peers_.clear();
    listener_ = {};
}

void FakeService::cutConnections() {
    cutting_ = true;
    wake();
}

void FakeService::setReading(bool reading) {
    reading_ = reading;
    wake();
}

void FakeService::wake() const {
    const std::uint64_t one = 1;
    [[maybe_unused]] const ssize_t written = write(wakeup_.get(), &one, sizeof(one));
}

void FakeService::run() {
    while (!stopping_) {
        std::vector<pollfd> watched = {{wakeup_.get(), POLLIN, 0}, {listener_.get(), POLLIN, 0}};
        for (const Peer& peer : peers_) {
            const bool reads = reading_ || !peer.authenticated;
            watched.push_back({reads ? peer.socket.get() : -1, POLLIN, 0});
        }
        poll(watched.data(), watched.size(), -1);
        if ((watched[0].revents & POLLIN) != 0) {
            std::uint64_t count = 0;
            [[maybe_unused]] const ssize_t taken = read(wakeup_.get(), &count, sizeof(count));
            if (cutting_.exchange(false)) {
                peers_.clear();
            }
            continue; // what is watched may have changed
        }
        for (std::size_t index = peers_.size(); index-- > 0;) {
            if (watched[index + 2].revents != 0 && !serve(peers_[index])) {
                peers_.erase(peers_.begin() + static_cast<std::ptrdiff_t>(index));
            }
        }
        if ((watched[1].revents & POLLIN) != 0) {
            acceptPeer();
        }
    }
}

void FakeService::acceptPeer() {
    Peer peer;
    peer.socket = platform::FileDescriptor(accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
    if (!peer.socket) {
        return;
    }
    peer.authentication = std::make_unique<dbus::ServerAuthentication>(
        getuid(), kServerId, refusing_ ? std::string("access-denied") : std::string());
    peers_.push_back(std::move(peer));
}

bool FakeService::serve(Peer& peer) {
    std::string block(readBytes_, '\0');
    const ssize_t got = recv(peer.socket.get(), block.data(), block.size(), MSG_DONTWAIT);
    if (got <= 0) {
        return false;
    }
    peer.input.append(block, 0, static_cast<std::size_t>(got));
    if (!peer.authenticated && !authenticate(peer)) {
        return false;
    }
    while (peer.authenticated && reading_) {
        const dbus::Frame frame = dbus::frameOf(peer.input);
        if (frame.state == dbus::Frame::State::Invalid) {
            ADD_FAILURE() << "bytes that are no message";
            return false;
        }
        if (frame.state == dbus::Frame::State::Incomplete || frame.bytes > peer.input.size()) {
            break;
        }
        handle(peer, std::string_view(peer.input).substr(0, frame.bytes));
        peer.input.erase(0, frame.bytes);
    }
    return true;
}

bool FakeService::authenticate(Peer& peer) {
    std::string_view rest = peer.input;
    std::string output;
    const auto state = peer.authentication->feed(rest, output);
    peer.input.erase(0, peer.input.size() - rest.size());
    [[maybe_unused]] const ssize_t sent = send(peer.socket.get(), output.data(), output.size(), MSG_NOSIGNAL);
    if (state == dbus::AuthenticationState::Done) {
        peer.authenticated = true;
        const std::scoped_lock lock(mutex_);
        peer.number = ++connections_;
        changed_.notify_all();
    }
    return state != dbus::AuthenticationState::Refused;
}

void FakeService::handle(Peer& peer, std::string_view message) {
    dbus::MessageHeader header;
    const auto error = header.read(message);
    if (error) {
        ADD_FAILURE() << error->text;
        return;
    }
    EXPECT_EQ(header.path, dbus::kObjectPath);
    EXPECT_EQ(header.interface, dbus::kReportingInterface);
    {
        const std::scoped_lock lock(mutex_);
        calls_.push_back(recorded(header));
        calls_.back().connection = peer.number;
    }
    changed_.notify_all();
    if (header.replyExpected() && answering_) {
        answer(peer, header);
    }
}

void FakeService::answer(Peer& peer, const dbus::MessageHeader& header) {
    std::string output;
    if (disabled_) {
        dbus::MessageWriter(output).error(dbus::kReportingDisabledError, "reporting is disabled",
                                          {.serial = 1, .replySerial = header.serial, .sender = {}, .signature = {}});
    } else if (wrongReply_) {
        dbus::MessageWriter writer(output);
        writer.beginReturn({.serial = 1, .replySerial = header.serial, .sender = {}, .signature = "u"});
        writer.uint32(1);
        EXPECT_TRUE(writer.finish());
    } else if (header.member == dbus::kKillService) {
        shutdown(peer.socket.get(), SHUT_RDWR);
        return;
    } else {
        writeReply(output, header);
    }
    [[maybe_unused]] const ssize_t sent = send(peer.socket.get(), output.data(), output.size(), MSG_NOSIGNAL);
}

std::vector<RecordedCall> FakeService::calls() const {
    const std::scoped_lock lock(mutex_);
    return calls_;
}

std::vector<std::string> FakeService::texts() const {
    std::vector<std::string> texts;
    for (const RecordedCall& call : calls()) {
        texts.push_back(call.text);
    }
    return texts;
}

template <class Condition>
void FakeService::waitFor(const char* what, const Condition& condition) const {
    std::unique_lock lock(mutex_);
    if (!changed_.wait_for(lock, std::chrono::seconds(30), condition)) {
        ADD_FAILURE() << "there were never enough " << what;
    }
}

void FakeService::waitForCalls(std::size_t count) const {
    waitFor("calls", [&] { return calls_.size() >= count; });
}

void FakeService::waitForConnections(int count) const {
    waitFor("connections", [&] { return connections_ >= count; });
}

} // namespace vela::testing
