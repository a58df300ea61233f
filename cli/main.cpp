// velactl: wiring only.
#include "cli/Subcommand.h"
#include "platform/host/HostFacts.h"
#include "platform/host/StandardOutput.h"
#include "platform/linux/StandardDescriptors.h"

#include <iostream>
#include <vector>

int main(int argumentCount, char** arguments) {
    vela::platform::holdStandardDescriptors();
    const std::vector<std::string_view> given(arguments + (argumentCount > 0 ? 1 : 0), arguments + argumentCount);
    vela::platform::StandardOutput output;
    // https://no-color.org: any text that is not empty asks for none.
    const bool colour = output.isTerminal() && vela::platform::environmentText("NO_COLOR").empty();
    vela::Console console{
        std::cin, output.stream(), std::cerr, output.isTerminal(), colour, [&output] { return output.isReaderGone(); }};
    const int status = vela::runVelactl(given, console);
    return output.finish("velactl", std::cerr) || status != vela::kDone ? status : vela::kFailed;
}
