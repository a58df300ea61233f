// velactl: wiring only.
#include "cli/Subcommand.h"
#include "platform/host/HostFacts.h"

#include <iostream>
#include <vector>

int main(int argumentCount, char** arguments) {
    constexpr int kStandardOutput = 1;
    const std::vector<std::string_view> given(arguments + (argumentCount > 0 ? 1 : 0), arguments + argumentCount);
    const bool terminal = vela::platform::isTerminal(kStandardOutput);
    // https://no-color.org: any text that is not empty asks for none.
    const bool colour = terminal && vela::platform::environmentText("NO_COLOR").empty();
    vela::Console console{std::cin, std::cout, std::cerr, terminal, colour};
    const int status = vela::runVelactl(given, console);
    std::cout.flush();
    return std::cout || status != vela::kDone ? status : vela::kFailed;
}
