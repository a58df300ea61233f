// The metrics service, which takes records in the protobuf wire format.
#pragma once

#include "common/values/Dictionary.h"

#include <cstdint>
#include <string_view>

namespace vela::platform {

/// Thread-safe.
class Telem {
public:
    virtual ~Telem() = default;

    /// Posts a record: its wire-format bytes, and its fields by name for people to read.
    virtual void telemPostMetric(std::uint32_t metricIdentifier, std::string_view record, const Dictionary& fields) = 0;
};

} // namespace vela::platform
