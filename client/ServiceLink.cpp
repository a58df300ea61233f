#include "client/ServiceLink.h"

#include "platform/dbus/MessageReader.h"
#include "platform/dbus/MessageWriter.h"
#include "platform/dbus/Protocol.h"

#include <algorithm>
#include <cassert>
#include <cstring>
#include <poll.h>
#include <utility>

namespace vela::client {

namespace {

namespace dbus = platform::dbus;

using std::chrono::milliseconds;

/// What is gathered before it is written.
constexpr std::size_t kOutputBytes = std::size_t{64} * 1024;

// While calls come in, the thread looks at the queue by itself, so that the callers need not wake it. So many
// milliseconds after the last call it falls asleep.
constexpr milliseconds kNap{4};
constexpr milliseconds kDrowsy{20};

// Places in the fixed part of a message's header.
constexpr std::size_t kFlagsAt = 2;
constexpr std::size_t kBodyLengthAt = 4;
constexpr std::size_t kSerialAt = 8;

std::string headerOf(Operation operation) {
    std::string header;
    dbus::MessageWriter writer(header);
    writer.beginCall({.serial = 1,
                      .path = dbus::kObjectPath,
                      .interface = dbus::kReportingInterface,
                      .member = formOf(operation).member,
                      .destination = {},
                      .signature = formOf(operation).arguments,
                      .replyExpected = true});
    [[maybe_unused]] const bool fits = writer.finish();
    assert(fits);
    return header;
}

void put32(std::string& bytes, std::size_t at, std::uint32_t number) {
    std::memcpy(bytes.data() + at, &number, sizeof(number));
}

} // namespace

ServiceLink::ServiceLink(CallQueue& queue, Doorbell& doorbell, WaitingCalls& waitingCalls,
                         std::vector<dbus::SocketAddress> addresses)
    : queue_(queue),
      doorbell_(doorbell),
      waitingCalls_(waitingCalls),
      addresses_(std::move(addresses)) {
    for (std::size_t index = 0; index < kOperations; ++index) {
        headers_[index] = headerOf(static_cast<Operation>(index));
    }
    output_.reserve(kOutputBytes + queue_.mostBodyBytes());
}

void ServiceLink::stop(milliseconds patience) {
    patienceMilliseconds_.store(patience.count(), std::memory_order_relaxed);
    stopping_.store(true, std::memory_order_seq_cst);
    doorbell_.ringAlways();
}

void ServiceLink::run() {
    do {
        now_ = std::chrono::steady_clock::now();
        keepConnection();
        if (connection_.state() == Connection::State::Ready) {
            passOn();
        }
        if (finished()) {
            break;
        }
        rest();
    } while (true);
    connection_.close();
    connected_.store(false, std::memory_order_relaxed);
    waitingCalls_.answerAll(waitingCalls_.nextTicket(), VelaReportingStatusDisconnected, "the client was destroyed");
}

// ---- Connecting ----

void ServiceLink::keepConnection() {
    if (connection_.state() != Connection::State::Closed) {
        return;
    }
    const bool last = stopping() && !std::exchange(attemptedWhileStopping_, stopping()) && !queue_.empty();
    const bool due = !attempted_ || (wantsConnection() && now_ >= backoff_.next());
    if (prompted_.exchange(false, std::memory_order_seq_cst) || last || due) {
        attempted_ = true;
        ticketsOfAttempt_ = waitingCalls_.nextTicket();
        attempt(0);
    }
}

void ServiceLink::attempt(std::size_t firstAddress) {
    for (address_ = firstAddress; address_ < addresses_.size(); ++address_) {
        if (connection_.open(addresses_[address_])) {
            knownState_ = Connection::State::Authenticating;
            return;
        }
    }
    knownState_ = Connection::State::Closed;
    backoff_.attemptFailed(now_);
    waitingCalls_.answerAll(ticketsOfAttempt_, VelaReportingStatusNoService, connection_.failure());
}

void ServiceLink::connectionReady() {
    knownState_ = Connection::State::Ready;
    backoff_.connected(now_);
    prompted_.store(false, std::memory_order_seq_cst);
    // The sessions as the last service knew them; the queue goes on from there.
    std::uint32_t serial = 1;
    sessions_.replay(output_, serial);
    lastSerial_ = serial;
    connections_.fetch_add(1, std::memory_order_relaxed);
    connected_.store(true, std::memory_order_relaxed);
}

void ServiceLink::connectionEnded() {
    const bool wasReady = std::exchange(knownState_, Connection::State::Closed) == Connection::State::Ready;
    connected_.store(false, std::memory_order_relaxed);
    dropOutput();
    if (!wasReady) {
        return attempt(address_ + 1);
    }
    backoff_.connectionLost(now_);
    for (const auto& [serial, call] : unanswered_) {
        Reply reply;
        // The end of the service is what this call was for.
        reply.status =
            call.operation == Operation::KillService ? VelaReportingStatusOk : VelaReportingStatusDisconnected;
        reply.errorText = connection_.failure();
        waitingCalls_.answer(call.ticket, std::move(reply));
    }
    unanswered_.clear();
}

void ServiceLink::dropOutput() {
    output_.clear();
    outputSent_ = 0;
    written_.clear();
    queue_.rewind();
}

// ---- Calls out ----

void ServiceLink::passOn() {
    while (connection_.state() == Connection::State::Ready) {
        if (!outputPending()) {
            gather();
            settleWritten(); // those that were left out
            if (output_.empty()) {
                return;
            }
            busyAt_ = now_;
        }
        outputSent_ += connection_.send(std::string_view(output_).substr(outputSent_));
        settleWritten();
        if (outputPending()) {
            break;
        }
    }
    if (connection_.state() == Connection::State::Closed) {
        handleArrived();
    }
}

void ServiceLink::gather() {
    if (outputSent_ != 0) {
        assert(written_.empty());
        output_.clear();
        outputSent_ = 0;
    }
    while (output_.size() < kOutputBytes) {
        const CallQueue::Read read = queue_.next();
        if (read.record == nullptr) {
            return;
        }
        append(read);
    }
}

void ServiceLink::append(const CallQueue::Read& read) {
    const CallRecord& record = *read.record;
    const auto operation = static_cast<Operation>(record.operation);
    const bool replyWanted = record.ticket != 0 && waitingCalls_.isWaiting(record.ticket);
    Written written{output_.size(), read.end, &record, 0, replyWanted};
    if (replyWanted || !needsWaiter(operation)) {
        written.serial = takeSerial();
        const std::size_t start = output_.size();
        output_ += headers_[record.operation];
        output_[start + kFlagsAt] = static_cast<char>(replyWanted ? 0 : dbus::kNoReplyExpectedFlag);
        put32(output_, start + kBodyLengthAt, record.bodyBytes);
        put32(output_, start + kSerialAt, written.serial);
        output_.append(reinterpret_cast<const char*>(record.body()), record.bodyBytes);
        written.outputEnd = output_.size();
    }
    written_.push_back(written);
}

void ServiceLink::settleWritten() {
    while (!written_.empty() && written_.front().outputEnd <= outputSent_) {
        const Written& written = written_.front();
        if (written.serial != 0) {
            sent_.fetch_add(1, std::memory_order_relaxed);
            if (!sessions_.apply(*written.record)) {
                notRemembered_.fetch_add(1, std::memory_order_relaxed);
            }
            if (written.replyWanted) {
                expectReply(written);
            }
        }
        queue_.release(written.queueEnd);
        written_.pop_front();
    }
}

std::uint32_t ServiceLink::takeSerial() {
    if (++lastSerial_ == 0) {
        ++lastSerial_;
    }
    return lastSerial_;
}

// ---- Replies in ----

void ServiceLink::expectReply(const Written& written) {
    unanswered_[written.serial] = {written.record->ticket, static_cast<Operation>(written.record->operation)};
    if (unanswered_.size() < unansweredLimit_) {
        return;
    }
    std::erase_if(unanswered_, [this](const auto& entry) { return !waitingCalls_.isWaiting(entry.second.ticket); });
    unansweredLimit_ = std::max<std::size_t>(1024, unanswered_.size() * 2);
}

void ServiceLink::handleArrived() {
    if (knownState_ == Connection::State::Authenticating && connection_.state() == Connection::State::Ready) {
        connectionReady();
    }
    // Also what arrived before the end.
    std::string_view message;
    while (knownState_ == Connection::State::Ready && connection_.nextMessage(message)) {
        handle(message);
    }
    if (connection_.state() == Connection::State::Closed) {
        connectionEnded();
    }
}

void ServiceLink::handle(std::string_view message) {
    dbus::MessageHeader header;
    const bool readable = !header.read(message);
    if (header.type != dbus::MessageType::MethodReturn && header.type != dbus::MessageType::Error) {
        return;
    }
    const auto found = unanswered_.find(header.replySerial);
    if (!readable || found == unanswered_.end()) {
        return;
    }
    waitingCalls_.answer(found->second.ticket, replyOf(found->second.operation, header));
    unanswered_.erase(found);
}

// ---- Resting ----

Rest ServiceLink::restKind() const {
    switch (connection_.state()) {
    case Connection::State::Closed:
        return wantsConnection() ? Rest::Waiting : Rest::Asleep;
    case Connection::State::Authenticating:
        return Rest::Awake;
    case Connection::State::Ready:
        break;
    }
    if (outputPending()) {
        return Rest::Awake;
    }
    return now_ - busyAt_ < kDrowsy ? Rest::Napping : Rest::Asleep;
}

int ServiceLink::timeoutOf(Rest rest) const {
    Moment until = Moment::max();
    if (rest == Rest::Waiting) {
        until = backoff_.next();
    } else if (rest == Rest::Napping) {
        until = now_ + kNap;
    }
    if (deadlineKnown_) {
        until = std::min(until, deadline_);
    }
    if (until == Moment::max()) {
        return -1;
    }
    // Rounded up, or the last millisecond would be spent in turns without a pause.
    const auto left = std::chrono::ceil<milliseconds>(until - now_).count();
    return static_cast<int>(std::clamp<std::int64_t>(left, 0, 60'000));
}

bool ServiceLink::somethingCameUp(Rest rest) const {
    if (rest == Rest::Awake) {
        return false;
    }
    const bool closed = connection_.state() == Connection::State::Closed;
    const bool called = rest != Rest::Waiting && queue_.hasCommitted();
    return called || (closed && prompted_.load(std::memory_order_seq_cst));
}

void ServiceLink::rest() {
    const Rest kind = restKind();
    std::array<pollfd, 2> watched{};
    watched[0] = {doorbell_.descriptor(), POLLIN, 0};
    const bool open = connection_.state() != Connection::State::Closed;
    watched[1] = {open ? connection_.descriptor() : -1, static_cast<short>(outputPending() ? POLLIN | POLLOUT : POLLIN),
                  0};
    doorbell_.announce(kind);
    if (!somethingCameUp(kind)) {
        poll(watched.data(), watched.size(), timeoutOf(kind));
    }
    doorbell_.announce(Rest::Awake);
    if ((watched[0].revents & POLLIN) != 0) {
        doorbell_.silence();
    }
    if ((watched[1].revents & (POLLIN | POLLHUP | POLLERR)) != 0) {
        now_ = std::chrono::steady_clock::now();
        connection_.receive();
        handleArrived();
    }
}

bool ServiceLink::finished() {
    if (!stopping()) {
        return false;
    }
    if (!deadlineKnown_) {
        deadlineKnown_ = true;
        deadline_ = now_ + milliseconds(patienceMilliseconds_.load(std::memory_order_relaxed));
    }
    const bool unreachable = connection_.state() == Connection::State::Closed && attemptedWhileStopping_;
    const bool passedOn = queue_.empty() && !outputPending();
    return passedOn || unreachable || now_ >= deadline_;
}

} // namespace vela::client
