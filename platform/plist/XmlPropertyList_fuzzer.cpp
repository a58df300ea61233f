// XML property lists: see requireRoundTrip. An input without the frame gets it.
#include "platform/plist/PropertyListFuzzing.h"

#include <cstdint>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace vela::platform;
    std::string bytes(data, data + size);
    // Mutations that lose the frame would never get past it.
    if (!bytes.starts_with("<?") && !bytes.starts_with("<!") && !bytes.starts_with("<plist")) {
        bytes = "<plist>" + bytes + "</plist>";
    }
    plist::requireRoundTrip(bytes, PropertyListFormat::Xml);
    return 0;
}
