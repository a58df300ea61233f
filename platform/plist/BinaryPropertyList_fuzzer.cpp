// Binary property lists: see requireRoundTrip.
#include "platform/plist/PropertyListFuzzing.h"

#include <cstdint>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace vela::platform;
    plist::requireRoundTrip(std::string(data, data + size), PropertyListFormat::Binary);
    return 0;
}
