// The metrics service: records are stored as they are, beside their fields. Thread-safe; the store outlives it.
#pragma once

#include "platform/Telem.h"
#include "platform/sqlite/DeliveryStore.h"

namespace vela::platform {

class StoreTelem final : public Telem {
public:
    explicit StoreTelem(DeliveryStore& store) : store_(store) {}

    void telemPostMetric(std::uint32_t metricIdentifier, std::string_view record, const Dictionary& fields) override;

private:
    DeliveryStore& store_;
};

} // namespace vela::platform
