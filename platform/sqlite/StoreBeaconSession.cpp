#include "platform/sqlite/StoreBeaconSession.h"

#include <cerrno>
#include <utility>

namespace vela::platform {

namespace {

// The session information's and the user information's keys.
const Key kSessionID("session_id");
const Key kServiceName("service_name");

Failure refusal(DropReason reason) {
    switch (reason) {
    case DropReason::QueueFull:
        return {ENOBUFS, "the store's queue is full"};
    case DropReason::Limit:
        return {EMSGSIZE, "the message is larger than the store's queue"};
    default:
        return {ESHUTDOWN, "the store is closed"};
    }
}

} // namespace

BeaconSource::BeaconSource(const Dictionary& sessionInfo, const Dictionary& userInfo) {
    if (const ValueRef session = sessionInfo.find(kSessionID); session.isNumber()) {
        session_ = session.integerValue();
    }
    if (const ValueRef name = userInfo.find(kServiceName); name.isString()) {
        serviceName_ = name.string();
    }
}

StoreRecord BeaconSource::record(StoreOperation operation) const {
    StoreRecord record;
    record.backend = DeliveryBackend::Beacon;
    record.operation = operation;
    record.session = session_;
    record.name = serviceName_;
    return record;
}

Result<Done> sendBeaconRecord(DeliveryStore& store, StoreRecord record) {
    // Outside every scope nobody counted the message as received.
    const bool counted = LedgerScope::current() != nullptr;
    record.entry = store.account();
    if (!counted) {
        record.entry->received(DeliveryBackend::Beacon);
    }
    const std::optional<DropReason> refused = store.tryAdd(record);
    if (!refused) {
        return Done();
    }
    if (!counted) {
        record.entry->dropped(DeliveryBackend::Beacon, *refused);
    }
    store.noteLedgerChange();
    return refusal(*refused);
}

StoreBeaconSession::StoreBeaconSession(DeliveryStore& store, BeaconSource source, std::optional<Array> backends)
    : store_(store),
      source_(std::move(source)),
      backends_(std::move(backends)) {}

StoreBeaconSession::~StoreBeaconSession() { store_.add(source_.record(StoreOperation::EndSession)); }

void StoreBeaconSession::startBeaconBackendDiscovery(UniqueFunction<void(std::optional<Array> backends)> completion) {
    completion(backends_);
}

Result<Done> StoreBeaconSession::sendBeaconMessage(std::uint16_t category, std::uint16_t type,
                                                   const Dictionary& payload) {
    StoreRecord record = source_.record(StoreOperation::Send);
    record.category = category;
    record.type = type;
    record.payload = payload;
    return sendBeaconRecord(store_, std::move(record));
}

void StoreBeaconSession::flushBeaconMessages() {
    StoreRecord record = source_.record(StoreOperation::Flush);
    record.urgency = StoreUrgency::Soon;
    store_.add(std::move(record));
}

std::string StoreBeaconSession::description() const {
    const std::optional<std::int64_t> session = source_.session();
    return "<StoreBeaconSession " + (session ? std::to_string(*session) : "without a number") + ">";
}

} // namespace vela::platform
