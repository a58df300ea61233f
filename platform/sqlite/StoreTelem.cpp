#include "platform/sqlite/StoreTelem.h"

#include <utility>

namespace vela::platform {

void StoreTelem::telemPostMetric(std::uint32_t metricIdentifier, std::string_view record, const Dictionary& fields) {
    StoreRecord delivery = store_.newDelivery(DeliveryBackend::Telem, StoreOperation::Post);
    delivery.number = metricIdentifier;
    delivery.bytes = Data(record);
    delivery.payload = fields;
    store_.add(std::move(delivery));
}

} // namespace vela::platform
