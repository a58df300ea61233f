// What a reader says of an input that passes its limits: the limit by name and value. Pure functions.
#pragma once

#include <cstddef>
#include <string>

namespace vela::platform::plist {

inline std::string tooManyBytes(std::size_t bytes, std::size_t limit) {
    return "the input has " + std::to_string(bytes) + " bytes, the limit \"bytes\" is " + std::to_string(limit);
}

inline std::string tooDeep(std::size_t limit) {
    return "the containers stand too deep, the limit \"depth\" is " + std::to_string(limit);
}

inline std::string tooManyValues(std::size_t limit) {
    return "there are too many values, the limit \"values\" is " + std::to_string(limit);
}

} // namespace vela::platform::plist
