// JSON text to property-list values, for what a person types. Pure.
#pragma once

#include "common/values/Value.h"
#include "platform/Result.h"

#include <cstddef>
#include <string_view>

namespace vela {

/// Reads one JSON value. Whole numbers become integers (above the signed 64 bits unsigned), others reals; keys keep
/// their order. {"$data": "base64"} and {"$date": seconds since 1970} are data and a date. Null, numbers beyond 64
/// bits, text behind the value and more than `depth` containers inside each other are refused; the failure tells the
/// value or the place.
platform::Result<Value> readJson(std::string_view text, std::size_t depth = 128);

} // namespace vela
