// Real-time reporting into the store: each session's messages, and marks where it begins, is flushed and ends.
//
// The back ends that discovery finds are those that the settings name; it answers inside the call. Thread-safe; the
// store outlives it and its sessions.
#pragma once

#include "platform/Beacon.h"
#include "platform/sqlite/DeliveryStore.h"

#include <string>
#include <vector>

namespace vela::platform {

class StoreBeacon final : public Beacon {
public:
    /// `backends`: names that discovery answers; none when it is empty.
    StoreBeacon(DeliveryStore& store, const std::vector<std::string>& backends);

    /// A text: 32 random hexadecimal digits behind the parent's text and a full stop.
    Value newBeaconHierarchyToken(ValueRef parent) override;
    std::shared_ptr<BeaconSession> createBeaconSession(const Dictionary& sessionInfo,
                                                       const Dictionary& userInfo) override;
    Result<Done> sendOneBeaconMessage(const Dictionary& sessionInfo, const Dictionary& userInfo, std::uint16_t category,
                                      std::uint16_t type, const Dictionary& payload) override;

private:
    DeliveryStore& store_;
    const std::optional<Array> backends_;
};

} // namespace vela::platform
