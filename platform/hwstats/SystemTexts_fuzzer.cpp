// The readers of what the kernel writes into /proc and /sys. The first byte chooses one, the rest is the file.
#include "platform/hwstats/AlsaSource.h"
#include "platform/hwstats/ForceFeedbackSource.h"
#include "platform/hwstats/PowerSources.h"
#include "platform/hwstats/SystemReading.h"

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string_view>

namespace vela::platform::hwstats {

namespace {

void require(bool holds) {
    if (!holds) {
        std::abort();
    }
}

void readOne(char reader, std::string_view text) {
    switch (reader) {
    case 's':
        if (const auto status = readAlsaStatus(text)) {
            require(status->state < kAlsaStates.size());
        }
        break;
    case 'r':
        static_cast<void>(readAlsaRate(text));
        break;
    case 't': {
        // Every state stands in a line of its own.
        const auto states = readTransStat(text);
        require(states.size() <= text.size());
        break;
    }
    case 'b':
        require(countBits(text) <= 4 * text.size());
        break;
    default:
        require(trimmed(text).size() <= text.size());
        static_cast<void>(numberOf(text));
        break;
    }
}

} // namespace

} // namespace vela::platform::hwstats

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    if (size > 0) {
        const std::string_view input(reinterpret_cast<const char*>(data), size);
        vela::platform::hwstats::readOne(input.front(), input.substr(1));
    }
    return 0;
}
