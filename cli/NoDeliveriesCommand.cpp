// velactl deliveries, in a build without the embedded store.
#include "cli/Subcommand.h"

#include <ostream>

namespace vela {

int runDeliveries(std::span<const std::string_view>, Console& console) {
    console.error << "velactl: this build has no store of deliveries\n";
    return kFailed;
}

} // namespace vela
