// The energy log: events are stored with the number of the client that they belong to. Thread-safe; the store outlives
// it.
#pragma once

#include "platform/Joule.h"
#include "platform/sqlite/DeliveryStore.h"

namespace vela::platform {

class StoreJoule final : public Joule {
public:
    explicit StoreJoule(DeliveryStore& store) : store_(store) {}

    void jouleLogRegisteredEvent(std::uint32_t clientIdentifier, std::string_view eventName, const Dictionary& payload,
                                 const Dictionary& options) override;

private:
    DeliveryStore& store_;
};

} // namespace vela::platform
