// The C API over Client. No exception leaves it.
#include "client/include/vela/reporting.h"

#include "client/CallerStructs.h"
#include "client/Client.h"
#include "platform/dbus/Address.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cstdlib>
#include <memory>
#include <optional>
#include <string>
#include <system_error>

using vela::client::CallQueue;
using vela::client::Client;
using vela::client::ClientSettings;
using vela::client::ConfigurationArguments;
using vela::client::copyIn;
using vela::client::copyOut;
using vela::client::copyText;
using vela::client::MessageArguments;
using vela::client::Operation;
using vela::client::PlainCall;
using vela::client::Reply;
using vela::client::WaitingCalls;

struct VelaReportingClient {
    explicit VelaReportingClient(ClientSettings settings) : client(std::move(settings)) {}
    Client client;
};

namespace {

constexpr std::array<const char*, 10> kStatusTexts = {
    "done",
    "invalid argument",
    "the queue is full",
    "too large",
    "no reply in time",
    "the service ended before it replied",
    "no service",
    "the service answered with an error",
    "out of resources",
    "the reply is malformed",
};

VelaReportingStatus tell(const Reply& reply, VelaReportingError* error) {
    if (error != nullptr && reply.status != VelaReportingStatusOk) {
        VelaReportingError full{};
        copyText(reply.errorName, full.name);
        copyText(reply.errorText.empty() ? VelaReportingStatusText(reply.status) : reply.errorText, full.text);
        copyOut(full, error);
    }
    return reply.status;
}

/// Makes a call with `queue(ticket)` and waits for its reply.
template <class Queue>
Reply awaited(Client& client, std::int32_t milliseconds, const Queue& queue) noexcept try {
    WaitingCalls::Waiter waiter(client.waitingCalls());
    const VelaReportingStatus queued = queue(waiter.ticket());
    if (queued != VelaReportingStatusOk) {
        Reply reply;
        reply.status = queued;
        return reply;
    }
    return waiter.wait(milliseconds);
} catch (...) {
    Reply reply;
    reply.status = VelaReportingStatusNoResources;
    return reply;
}

Reply invalid() {
    Reply reply;
    reply.status = VelaReportingStatusInvalidArgument;
    return reply;
}

Reply awaitedCall(VelaReportingClient* client, const PlainCall& call, std::int32_t milliseconds) noexcept {
    if (client == nullptr) {
        return invalid();
    }
    return awaited(client->client, milliseconds,
                   [&](std::uint64_t ticket) { return client->client.call(call, ticket); });
}

VelaReportingStatus queued(VelaReportingClient* client, const PlainCall& call) noexcept {
    return client == nullptr ? VelaReportingStatusInvalidArgument : client->client.call(call);
}

std::optional<ConfigurationArguments> configurationOf(const VelaReportingField* fields, std::size_t count,
                                                      std::int64_t reporterID) {
    if (fields == nullptr && count != 0) {
        return std::nullopt;
    }
    return ConfigurationArguments{{fields, count}, reporterID};
}

std::optional<MessageArguments> messageOf(const VelaReportingField* fields, std::size_t fieldCount,
                                          std::uint32_t category, std::uint16_t type, const std::int64_t* reporterIDs,
                                          std::size_t reporterIDCount) {
    const bool toAll = reporterIDs == nullptr;
    if ((fields == nullptr && fieldCount != 0) || (toAll && reporterIDCount != 0)) {
        return std::nullopt;
    }
    return MessageArguments{{fields, fieldCount}, category, type, toAll, {reporterIDs, reporterIDCount}, {}};
}

/// An environment variable's value, or "". Programs with more rights than their users have none.
std::string_view variable(const char* name) {
    const char* const value = secure_getenv(name); // NOLINT(concurrency-mt-unsafe): as every library
    return value != nullptr ? value : std::string_view();
}

/// The settings behind `options`, or none when they are impossible.
std::optional<ClientSettings> settingsOf(const VelaReportingClientOptions* options) {
    VelaReportingClientOptions known{};
    if (options != nullptr) {
        if (!copyIn(options, known)) {
            return std::nullopt;
        }
    }
    ClientSettings settings;
    const std::string_view address = known.address != nullptr ? known.address : variable("VELA_REPORTING_ADDRESS");
    auto addresses = known.address != nullptr
                         ? vela::platform::dbus::parseAddress(address)
                         : vela::platform::dbus::serviceAddresses(address, variable("XDG_RUNTIME_DIR"));
    if (!addresses || known.queueBytes > CallQueue::kMostBytes) {
        return std::nullopt;
    }
    settings.addresses = *std::move(addresses);
    if (known.queueBytes != 0) {
        settings.queueBytes = std::bit_ceil(std::max(known.queueBytes, CallQueue::kLeastBytes));
    }
    if (known.flushMilliseconds != 0) {
        settings.patience = std::chrono::milliseconds(std::max(known.flushMilliseconds, 0));
    }
    return settings;
}

} // namespace

extern "C" {

const char* VelaReportingStatusText(VelaReportingStatus status) noexcept {
    const auto index = static_cast<std::size_t>(status);
    return index < kStatusTexts.size() ? kStatusTexts[index] : "";
}

VelaReportingStatus VelaReportingClientCreate(const VelaReportingClientOptions* options,
                                              VelaReportingClient** client) noexcept try {
    if (client == nullptr) {
        return VelaReportingStatusInvalidArgument;
    }
    *client = nullptr;
    auto settings = settingsOf(options);
    if (!settings) {
        return VelaReportingStatusInvalidArgument;
    }
    *client = std::make_unique<VelaReportingClient>(std::move(*settings)).release();
    return VelaReportingStatusOk;
} catch (...) {
    return VelaReportingStatusNoResources;
}

VelaReportingStatus VelaReportingClientDestroy(VelaReportingClient* client) noexcept {
    if (client == nullptr) {
        return VelaReportingStatusOk;
    }
    const std::unique_ptr<VelaReportingClient> owner(client);
    return owner->client.end();
}

VelaReportingStatus VelaReportingClientGetState(const VelaReportingClient* client,
                                                VelaReportingClientState* state) noexcept {
    if (client == nullptr || state == nullptr || state->size <= sizeof(state->size)) {
        return VelaReportingStatusInvalidArgument;
    }
    copyOut(client->client.state(), state);
    return VelaReportingStatusOk;
}

// Calls that do not wait.

VelaReportingStatus VelaReportingCreateReportingSession(VelaReportingClient* client, int64_t reporterID) noexcept {
    return queued(client, {Operation::CreateReportingSession, reporterID});
}

VelaReportingStatus VelaReportingSetServiceType(VelaReportingClient* client, uint16_t serviceType,
                                                int64_t reporterID) noexcept {
    return queued(client, {Operation::SetServiceType, reporterID, serviceType});
}

VelaReportingStatus VelaReportingSetConfiguration(VelaReportingClient* client, const VelaReportingField* fields,
                                                  size_t count, int64_t reporterID) noexcept {
    const auto arguments = configurationOf(fields, count, reporterID);
    return client == nullptr || !arguments ? VelaReportingStatusInvalidArgument
                                           : client->client.setConfiguration(*arguments);
}

VelaReportingStatus VelaReportingStartReportingSessionForID(VelaReportingClient* client, int64_t reporterID) noexcept {
    return queued(client, {Operation::StartReportingSessionForID, reporterID});
}

VelaReportingStatus VelaReportingStopReportingSessionForID(VelaReportingClient* client, int64_t reporterID) noexcept {
    return queued(client, {Operation::StopReportingSessionForID, reporterID});
}

VelaReportingStatus VelaReportingDestroyReportingSession(VelaReportingClient* client, int64_t reporterID) noexcept {
    return queued(client, {Operation::DestroyReportingSession, reporterID});
}

VelaReportingStatus VelaReportingSendMessage(VelaReportingClient* client, const VelaReportingField* fields,
                                             size_t fieldCount, uint32_t category, uint16_t type,
                                             const int64_t* reporterIDs, size_t reporterIDCount) noexcept {
    const auto arguments = messageOf(fields, fieldCount, category, type, reporterIDs, reporterIDCount);
    return client == nullptr || !arguments ? VelaReportingStatusInvalidArgument
                                           : client->client.sendMessage(*arguments);
}

// Calls that wait.

VelaReportingStatus VelaReportingCreateReportingSessionAndWait(VelaReportingClient* client, int64_t reporterID,
                                                               int32_t timeoutMilliseconds,
                                                               VelaReportingError* error) noexcept {
    return tell(awaitedCall(client, {Operation::CreateReportingSession, reporterID}, timeoutMilliseconds), error);
}

VelaReportingStatus VelaReportingSetServiceTypeAndWait(VelaReportingClient* client, uint16_t serviceType,
                                                       int64_t reporterID, int32_t timeoutMilliseconds,
                                                       VelaReportingError* error) noexcept {
    return tell(awaitedCall(client, {Operation::SetServiceType, reporterID, serviceType}, timeoutMilliseconds), error);
}

VelaReportingStatus VelaReportingSetConfigurationAndWait(VelaReportingClient* client, const VelaReportingField* fields,
                                                         size_t count, int64_t reporterID, int32_t timeoutMilliseconds,
                                                         VelaReportingError* error) noexcept {
    const auto arguments = configurationOf(fields, count, reporterID);
    if (client == nullptr || !arguments) {
        return tell(invalid(), error);
    }
    return tell(awaited(client->client, timeoutMilliseconds,
                        [&](std::uint64_t ticket) { return client->client.setConfiguration(*arguments, ticket); }),
                error);
}

VelaReportingStatus VelaReportingStartReportingSessionForIDAndWait(VelaReportingClient* client, int64_t reporterID,
                                                                   int32_t timeoutMilliseconds,
                                                                   VelaReportingError* error) noexcept {
    return tell(awaitedCall(client, {Operation::StartReportingSessionForID, reporterID}, timeoutMilliseconds), error);
}

VelaReportingStatus VelaReportingStopReportingSessionForIDAndWait(VelaReportingClient* client, int64_t reporterID,
                                                                  int32_t timeoutMilliseconds,
                                                                  VelaReportingError* error) noexcept {
    return tell(awaitedCall(client, {Operation::StopReportingSessionForID, reporterID}, timeoutMilliseconds), error);
}

VelaReportingStatus VelaReportingDestroyReportingSessionAndWait(VelaReportingClient* client, int64_t reporterID,
                                                                int32_t timeoutMilliseconds,
                                                                VelaReportingError* error) noexcept {
    return tell(awaitedCall(client, {Operation::DestroyReportingSession, reporterID}, timeoutMilliseconds), error);
}

VelaReportingStatus VelaReportingSendMessageAndWait(VelaReportingClient* client, const VelaReportingField* fields,
                                                    size_t fieldCount, uint32_t category, uint16_t type,
                                                    const int64_t* reporterIDs, size_t reporterIDCount,
                                                    int32_t timeoutMilliseconds, VelaReportingError* error) noexcept {
    const auto arguments = messageOf(fields, fieldCount, category, type, reporterIDs, reporterIDCount);
    if (client == nullptr || !arguments) {
        return tell(invalid(), error);
    }
    return tell(awaited(client->client, timeoutMilliseconds,
                        [&](std::uint64_t ticket) { return client->client.sendMessage(*arguments, ticket); }),
                error);
}

VelaReportingStatus VelaReportingGetServiceNameForReporterID(VelaReportingClient* client, int64_t reporterID,
                                                             uint16_t* serviceType, int32_t timeoutMilliseconds,
                                                             VelaReportingError* error) noexcept {
    if (serviceType == nullptr) {
        return tell(invalid(), error);
    }
    const Reply reply = awaitedCall(client, {Operation::GetServiceNameForReporterID, reporterID}, timeoutMilliseconds);
    *serviceType = reply.serviceType;
    return tell(reply, error);
}

VelaReportingStatus VelaReportingReporterID(VelaReportingClient* client, int64_t reporterID,
                                            VelaReportingReporter* reporter, int32_t timeoutMilliseconds,
                                            VelaReportingError* error) noexcept {
    if (reporter == nullptr) {
        return tell(invalid(), error);
    }
    const Reply reply = awaitedCall(client, {Operation::ReporterID, reporterID}, timeoutMilliseconds);
    *reporter = reply.reporter;
    return tell(reply, error);
}

VelaReportingStatus VelaReportingGetAllReporters(VelaReportingClient* client, int64_t* reporterIDs, size_t capacity,
                                                 size_t* count, int32_t timeoutMilliseconds,
                                                 VelaReportingError* error) noexcept {
    if (count == nullptr || (reporterIDs == nullptr && capacity != 0)) {
        return tell(invalid(), error);
    }
    const Reply reply = awaitedCall(client, {Operation::GetAllReporters}, timeoutMilliseconds);
    *count = reply.reporterIDs.size();
    std::copy_n(reply.reporterIDs.begin(), std::min(capacity, *count), reporterIDs);
    return tell(reply, error);
}

VelaReportingStatus VelaReportingKillService(VelaReportingClient* client, int32_t timeoutMilliseconds,
                                             VelaReportingError* error) noexcept {
    return tell(awaitedCall(client, {Operation::KillService}, timeoutMilliseconds), error);
}

} // extern "C"
