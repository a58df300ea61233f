// Takes any bytes for a page of the kernel's trace buffer, in several layouts, and any text for the description of one.
// Reading stays within them and gives no more events than there is room for.
#include "platform/spoor/FtracePage.h"

#include <cstdint>
#include <cstdlib>
#include <string_view>
#include <vector>

namespace {

using namespace vela::platform::spoor;

void parse(std::span<const char> page, const FtraceLayout& layout) {
    std::vector<TraceRecord> records;
    static_cast<void>(parseFtracePage(page, layout, 1, records));
    if (records.size() > page.size() / sizeof(MarkerEvent)) {
        std::abort();
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::span<const char> bytes(reinterpret_cast<const char*>(data), size);
    parse(bytes, {8, 8, 16, 19, 4, 8, 12});
    parse(bytes, {8, 4, 12, 19, 4, 8, 12});
    const std::string_view text(bytes.data(), bytes.size());
    const std::size_t middle = text.find("name:");
    if (middle != std::string_view::npos) {
        if (const auto layout = parseFtraceLayout(text.substr(0, middle), text.substr(middle))) {
            parse(bytes, *layout);
        }
    }
    return 0;
}
