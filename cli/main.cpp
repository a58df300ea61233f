// velactl: wiring only.
#include "cli/Subcommand.h"
#include "platform/host/HostFacts.h"

#include <cstdlib>
#include <iostream>
#include <vector>

namespace {

/// https://no-color.org: any text that is not empty asks for none.
bool wantsColour() {
    const char* refused = std::getenv("NO_COLOR");
    return refused == nullptr || *refused == '\0';
}

} // namespace

int main(int argumentCount, char** arguments) {
    constexpr int kStandardOutput = 1;
    const std::vector<std::string_view> given(arguments + (argumentCount > 0 ? 1 : 0), arguments + argumentCount);
    const bool terminal = vela::platform::isTerminal(kStandardOutput);
    vela::Console console{std::cin, std::cout, std::cerr, terminal, terminal && wantsColour()};
    const int status = vela::runVelactl(given, console);
    std::cout.flush();
    return std::cout || status != vela::kDone ? status : vela::kFailed;
}
