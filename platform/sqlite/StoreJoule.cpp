#include "platform/sqlite/StoreJoule.h"

#include <utility>

namespace vela::platform {

void StoreJoule::jouleLogRegisteredEvent(std::uint32_t clientIdentifier, std::string_view eventName,
                                         const Dictionary& payload, const Dictionary&) {
    StoreRecord record = store_.newDelivery(DeliveryBackend::Joule, StoreOperation::Send);
    record.name = String(eventName);
    record.number = clientIdentifier;
    record.payload = payload;
    store_.add(std::move(record));
}

} // namespace vela::platform
