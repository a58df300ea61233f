#include "client/Client.h"

#include "platform/linux/ThreadAttributes.h"

#include <cerrno>
#include <cstring>
#include <pthread.h>
#include <system_error>
#include <utility>

namespace vela::client {

namespace {

/// The part of the queue that messages leave to other calls.
constexpr std::size_t kSpareShare = 16;

} // namespace

Client::Client(ClientSettings settings)
    : patience_(settings.patience),
      queue_(settings.queueBytes),
      link_(queue_, doorbell_, waitingCalls_, std::move(settings.addresses)) {
    if (!doorbell_.works()) {
        throw std::system_error(errno, std::generic_category());
    }
    // The process's signals are for its own threads.
    const platform::SignalsBlocked blocked;
    thread_ = std::thread([this] { link_.run(); });
    pthread_setname_np(thread_.native_handle(), "vela-reporting");
}

Client::~Client() { end(); }

VelaReportingStatus Client::end() {
    if (thread_.joinable()) {
        link_.stop(patience_);
        thread_.join();
    }
    return queue_.empty() ? VelaReportingStatusOk : VelaReportingStatusTimeout;
}

VelaReportingStatus Client::refuse(VelaReportingStatus status) {
    std::atomic<std::uint64_t>& count = status == VelaReportingStatusQueueFull  ? droppedQueueFull_
                                        : status == VelaReportingStatusTooLarge ? droppedTooLarge_
                                                                                : droppedInvalid_;
    count.fetch_add(1, std::memory_order_relaxed);
    return status;
}

template <class Write>
VelaReportingStatus Client::enqueue(const PlainCall& call, std::size_t bytes, std::uint64_t ticket,
                                    const Write& write) {
    const std::size_t spare = call.operation == Operation::SendMessage ? queue_.capacity() / kSpareShare : 0;
    CallRecord* const record = queue_.reserve(bytes, spare);
    if (record == nullptr) [[unlikely]] {
        return refuse(VelaReportingStatusQueueFull);
    }
    record->operation = static_cast<std::uint16_t>(call.operation);
    record->serviceType = call.serviceType;
    record->reporterID = call.reporterID;
    record->ticket = ticket;
    write(std::span(record->body(), bytes));
    CallQueue::commit(record);
    if (ticket != 0) {
        link_.prompt();
    }
    doorbell_.afterCommit(ticket != 0, [this] { return queue_.isHalfFull(); });
    return VelaReportingStatusOk;
}

VelaReportingStatus Client::call(const PlainCall& call, std::uint64_t ticket) {
    const std::string_view arguments = formOf(call.operation).arguments;
    const std::size_t idAt = arguments == "qx" ? sizeof(std::int64_t) : 0; // behind the q and its padding
    const std::size_t bytes = arguments.empty() ? 0 : idAt + sizeof(std::int64_t);
    return enqueue(call, bytes, ticket, [&](std::span<std::byte> body) {
        if (bytes == 0) {
            return;
        }
        std::memset(body.data(), 0, bytes);
        if (idAt != 0) {
            std::memcpy(body.data(), &call.serviceType, sizeof(call.serviceType));
        }
        std::memcpy(body.data() + idAt, &call.reporterID, sizeof(call.reporterID));
    });
}

VelaReportingStatus Client::setConfiguration(const ConfigurationArguments& arguments, std::uint64_t ticket) {
    const Measure measured = measure(arguments, queue_.mostBodyBytes());
    if (measured.status != VelaReportingStatusOk) {
        return refuse(measured.status);
    }
    return enqueue({Operation::SetConfiguration, arguments.reporterID}, measured.bytes, ticket,
                   [&](std::span<std::byte> body) { write(arguments, body); });
}

VelaReportingStatus Client::sendMessage(MessageArguments arguments, std::uint64_t ticket) {
    arguments.stamps = clock_.now();
    const Measure measured = measure(arguments, queue_.mostBodyBytes());
    if (measured.status != VelaReportingStatusOk) [[unlikely]] {
        return refuse(measured.status);
    }
    return enqueue({Operation::SendMessage}, measured.bytes, ticket,
                   [&](std::span<std::byte> body) { write(arguments, body); });
}

VelaReportingClientState Client::state() const {
    VelaReportingClientState state{};
    state.connected = link_.connected();
    state.connections = link_.connections();
    state.sent = link_.sent();
    state.droppedQueueFull = droppedQueueFull_.load(std::memory_order_relaxed);
    state.droppedTooLarge = droppedTooLarge_.load(std::memory_order_relaxed);
    state.droppedInvalid = droppedInvalid_.load(std::memory_order_relaxed);
    state.notRemembered = link_.notRemembered();
    state.queueBytes = queue_.capacity();
    state.queuedBytes = queue_.used();
    state.highestQueuedBytes = queue_.highestUsed();
    return state;
}

} // namespace vela::client
