// One real-time reporting session that ends in the store. Thread-safe; the store outlives it.
#pragma once

#include "platform/Beacon.h"
#include "platform/sqlite/DeliveryStore.h"

#include <cstdint>
#include <optional>
#include <string>

namespace vela::platform {

/// Whose messages they are, as the session and user information say it. Immutable.
class BeaconSource {
public:
    BeaconSource(const Dictionary& sessionInfo, const Dictionary& userInfo);

    std::optional<std::int64_t> session() const { return session_; }
    StoreRecord record(StoreOperation operation) const;

private:
    std::optional<std::int64_t> session_; ///< "session_id"
    String serviceName_;                  ///< "service_name"
};

/// Hands a message over. When it is taken, the outcome is counted for the calling thread's account; when it is refused,
/// by the caller, who counted it as received.
Result<Done> sendBeaconRecord(DeliveryStore& store, StoreRecord record);

class StoreBeaconSession final : public BeaconSession {
public:
    StoreBeaconSession(DeliveryStore& store, BeaconSource source, std::optional<Array> backends);
    ~StoreBeaconSession() override;
    StoreBeaconSession(const StoreBeaconSession&) = delete;
    StoreBeaconSession& operator=(const StoreBeaconSession&) = delete;

    /// Answers inside the call.
    void startBeaconBackendDiscovery(UniqueFunction<void(std::optional<Array> backends)> completion) override;
    Result<Done> sendBeaconMessage(std::uint16_t category, std::uint16_t type, const Dictionary& payload) override;
    void flushBeaconMessages() override;
    std::string description() const override;

private:
    DeliveryStore& store_;
    const BeaconSource source_;
    const std::optional<Array> backends_;
};

} // namespace vela::platform
