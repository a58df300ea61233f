#include "platform/dbus/ServiceEndpoint.h"

#include <algorithm>
#include <array>
#include <cassert>
#include <cerrno>
#include <csignal>
#include <pthread.h>
#include <sys/random.h>
#include <sys/signalfd.h>
#include <sys/timerfd.h>
#include <utility>

namespace vela::platform {

namespace {

using namespace std::chrono_literals;

constexpr std::size_t kScratchBytes = 64 * 1024;
constexpr std::size_t kEventsPerTurn = 64;

sigset_t endSignals() {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    return signals;
}

/// 32 hex digits that tell this service from others.
Result<std::string> newServerId() {
    std::array<unsigned char, 16> bytes{};
    if (getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) {
        return Failure{errno, "cannot get random bytes"};
    }
    std::string text;
    for (const unsigned char byte : bytes) {
        text += "0123456789abcdef"[byte >> 4U];
        text += "0123456789abcdef"[byte & 0xFU];
    }
    return text;
}

Result<FileDescriptor> newTimer(std::chrono::milliseconds interval) {
    FileDescriptor timer(timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC | TFD_NONBLOCK));
    itimerspec times{};
    times.it_interval.tv_sec = interval.count() / 1000;
    times.it_interval.tv_nsec = interval.count() % 1000 * 1000 * 1000;
    times.it_value = times.it_interval;
    if (!timer || timerfd_settime(timer.get(), 0, &times, nullptr) != 0) {
        return Failure{errno, "cannot create the periodic timer"};
    }
    return timer;
}

} // namespace

Result<std::unique_ptr<DbusServiceEndpoint>> DbusServiceEndpoint::open(DbusServiceOptions options) {
    auto socket = options.listeningDescriptor >= 0
                      ? dbus::ListeningSocket::adopt(options.listeningDescriptor)
                      : dbus::ListeningSocket::create(options.socketPath, options.socketMode);
    if (!socket) {
        return socket.failure();
    }
    auto loop = dbus::EventLoop::create();
    if (!loop) {
        return loop.failure();
    }
    auto serverId = newServerId();
    if (!serverId) {
        return serverId.failure();
    }
    return std::unique_ptr<DbusServiceEndpoint>(
        new DbusServiceEndpoint(std::move(options), *std::move(socket), *std::move(loop), *std::move(serverId)));
}

DbusServiceEndpoint::DbusServiceEndpoint(DbusServiceOptions options, dbus::ListeningSocket socket,
                                         std::shared_ptr<dbus::EventLoop> loop, std::string serverId)
    : options_(std::move(options)),
      loop_(std::move(loop)),
      serverId_(std::move(serverId)),
      socket_(std::move(socket)),
      scratch_(kScratchBytes) {
    facts_.version = options_.version;
    facts_.valueDepth = options_.valueDepth;
    facts_.sessionsPerClient = options_.sessionsPerClient;
}

DbusServiceEndpoint::~DbusServiceEndpoint() { endAll(); }

void DbusServiceEndpoint::blockEndSignals() {
    const sigset_t signals = endSignals();
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

void DbusServiceEndpoint::stop() {
    stopping_ = true;
    loop_->ring(kStopToken);
}

Result<Done> DbusServiceEndpoint::watchSources() {
    if (options_.endsOnSignals) {
        blockEndSignals();
        const sigset_t signals = endSignals();
        signals_ = FileDescriptor(signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
        if (!signals_ || !loop_->add(signals_.get(), EPOLLIN, kSignalToken)) {
            return Failure{errno, "cannot watch for signals"};
        }
    }
    if (options_.periodic && options_.interval > 0ms) {
        auto timer = newTimer(options_.interval);
        if (!timer) {
            return timer.failure();
        }
        timer_ = *std::move(timer);
        if (!loop_->add(timer_.get(), EPOLLIN, kTimerToken)) {
            return Failure{errno, "cannot watch the periodic timer"};
        }
    }
    if (!loop_->add(socket_.descriptor(), EPOLLIN, kListenerToken)) {
        return Failure{errno, "cannot watch for clients"};
    }
    return Done();
}

Result<Done> DbusServiceEndpoint::resume() {
    assert(delegate_ != nullptr);
    if (auto watched = watchSources(); !watched) {
        return watched;
    }
    while (!stopping_) {
        loopTurn();
    }
    socket_.close();
    endAll();
    return Done();
}

void DbusServiceEndpoint::loopTurn() {
    std::array<epoll_event, kEventsPerTurn> events; // filled by the kernel
    const std::size_t count = loop_->wait(events, timeout());
    for (std::size_t index = 0; index < count; ++index) {
        handle(events[index].data.u64, events[index].events);
    }
    queueThoseDue();
    runQueued();
    endLateAuthentications();
    if (acceptingAgainAt_ && std::chrono::steady_clock::now() >= *acceptingAgainAt_) {
        continueAccepting();
    }
    if (options_.onLoopTurn) {
        options_.onLoopTurn();
    }
}

std::optional<Nanoseconds> DbusServiceEndpoint::timeout() {
    if (!queued_.empty()) {
        return Nanoseconds::zero();
    }
    // Those that are through need no deadline any more.
    while (!deadlines_.empty()) {
        const auto place = connections_.find(deadlines_.front().connection);
        if (place != connections_.end() && place->second->isAuthenticating()) {
            break;
        }
        deadlines_.pop_front();
    }
    std::optional<Time> next = acceptingAgainAt_;
    if (!deadlines_.empty()) {
        next = next ? std::min(*next, deadlines_.front().time) : deadlines_.front().time;
    }
    if (!soon_.empty()) {
        next = next ? std::min(*next, soonAt_) : soonAt_;
    }
    if (!next) {
        return std::nullopt;
    }
    return std::max(Nanoseconds::zero(), Nanoseconds(*next - std::chrono::steady_clock::now()));
}

void DbusServiceEndpoint::handle(std::uint64_t token, std::uint32_t events) {
    switch (token) {
    case dbus::EventLoop::kRungToken:
        return runRung();
    case kListenerToken:
        return acceptConnections();
    case kSignalToken: {
        signalfd_siginfo information{};
        [[maybe_unused]] const ssize_t got = read(signals_.get(), &information, sizeof(information));
        stopping_ = true;
        return;
    }
    case kTimerToken: {
        std::uint64_t expirations = 0;
        [[maybe_unused]] const ssize_t got = read(timer_.get(), &expirations, sizeof(expirations));
        return options_.periodic();
    }
    default:
        return handleConnection(token, events);
    }
}

void DbusServiceEndpoint::handleConnection(std::uint64_t token, std::uint32_t events) {
    const auto place = connections_.find(token);
    if (place == connections_.end()) {
        return; // ended since
    }
    dbus::ServiceConnection& connection = *place->second;
    if ((events & (EPOLLHUP | EPOLLERR)) != 0) {
        connection.hangUp();
    } else if ((events & EPOLLOUT) != 0) {
        connection.writable();
    }
    if ((events & ~static_cast<std::uint32_t>(EPOLLOUT)) != 0) {
        queue(place->second);
    }
}

void DbusServiceEndpoint::queue(const std::shared_ptr<dbus::ServiceConnection>& connection) {
    if (!std::exchange(connection->queued, true)) {
        queued_.push_back(connection);
    }
}

void DbusServiceEndpoint::queueSoon(const std::shared_ptr<dbus::ServiceConnection>& connection) {
    if (soon_.empty()) {
        soonAt_ = std::chrono::steady_clock::now() +
                  (isBehind() ? dbus::ServiceConnection::kBehindTime : dbus::ServiceConnection::kGatheringTime);
    }
    if (!std::exchange(connection->soon, true)) {
        soon_.push_back(connection);
    }
}

void DbusServiceEndpoint::queueThoseDue() {
    if (soon_.empty() || std::chrono::steady_clock::now() < soonAt_) {
        return;
    }
    for (const auto& connection : soon_) {
        connection->soon = false;
        connection->due = true;
        queue(connection);
    }
    soon_.clear();
}

void DbusServiceEndpoint::runRung() {
    for (const std::uint64_t token : loop_->takeRung()) {
        if (const auto place = connections_.find(token); place != connections_.end()) {
            queue(place->second);
        }
    }
}

void DbusServiceEndpoint::runQueued() {
    for (const auto& connection : std::exchange(queued_, {})) {
        connection->queued = false;
        if (!std::exchange(connection->due, false) && connection->beginsLook() && isBehind()) {
            queueSoon(connection);
            continue;
        }
        switch (connection->turn(scratch_, *delegate_)) {
        case dbus::ServiceConnection::Turn::Waiting:
            break;
        case dbus::ServiceConnection::Turn::More:
            queue(connection);
            break;
        case dbus::ServiceConnection::Turn::Soon:
            queueSoon(connection);
            break;
        case dbus::ServiceConnection::Turn::Ended:
            end(connection);
            break;
        }
    }
}

void DbusServiceEndpoint::endLateAuthentications() {
    const Time now = std::chrono::steady_clock::now();
    while (!deadlines_.empty() && deadlines_.front().time <= now) {
        const auto place = connections_.find(deadlines_.front().connection);
        deadlines_.pop_front();
        if (place != connections_.end() && place->second->isAuthenticating()) {
            end(std::shared_ptr(place->second));
        }
    }
}

void DbusServiceEndpoint::end(const std::shared_ptr<dbus::ServiceConnection>& connection) {
    if (connections_.erase(connection->number()) == 0) {
        return;
    }
    if (connection->isRefused()) {
        --lingering_;
    } else if (const auto place = connectionsOfUser_.find(connection->user());
               place != connectionsOfUser_.end() && --place->second == 0) {
        connectionsOfUser_.erase(place);
    }
    connection->end();
    if (acceptingAgainAt_) {
        continueAccepting();
    }
}

void DbusServiceEndpoint::endAll() {
    for (const auto& [number, connection] : std::exchange(connections_, {})) {
        connection->hangUp();
        // Each turn reads the scratch buffer full at most, or dispatches some of what was read before.
        constexpr std::size_t kTurns = kDrainedBytes / kScratchBytes + kDrainedBytes / dbus::kFixedHeaderBytes /
                                                                           dbus::ServiceConnection::kMessagesPerTurn;
        for (std::size_t turn = 0; turn < kTurns && delegate_ != nullptr; ++turn) {
            if (connection->turn(scratch_, *delegate_) != dbus::ServiceConnection::Turn::More) {
                break;
            }
        }
        connection->abandon();
    }
    connectionsOfUser_.clear();
    queued_.clear();
    soon_.clear();
}

} // namespace vela::platform
