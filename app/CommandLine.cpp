#include "app/CommandLine.h"

#include "common/CommandOptions.h"
#include "common/SettingValues.h"

#include <array>

namespace vela {

namespace {

constexpr std::array<CommandOption, 6> kOptions{
    {{"--settings", true}, {"--set", true}, {"--check"}, {"--json"}, {"--version"}, {"--help"}}};

} // namespace

platform::Result<CommandLine> readCommandLine(std::span<const std::string_view> arguments) {
    const platform::Result<CommandArguments> read = readArguments(arguments, kOptions);
    if (!read) {
        return read.failure();
    }
    CommandLine line;
    if (read->has("--help") || read->has("--version")) {
        line.action = read->has("--help") ? CommandLine::Action::Help : CommandLine::Action::Version;
        return line;
    }
    if (!read->operands.empty()) {
        return platform::Failure{0, "there is nothing to do with " + quotedText(read->operands.front())};
    }
    line.action = read->has("--check") ? CommandLine::Action::Check : CommandLine::Action::Serve;
    line.json = read->has("--json");
    if (line.json && line.action != CommandLine::Action::Check) {
        return platform::Failure{0, "--json goes with --check"};
    }
    if (const std::vector<std::string> files = read->valuesOf("--settings"); !files.empty()) {
        line.settingsFile = files.back();
    }
    line.settings = read->valuesOf("--set");
    return line;
}

std::string_view helpText() {
    return "usage: vela-reportingd [--settings FILE] [--set SECTION.KEY=VALUE]...\n"
           "       vela-reportingd --check [--json] [--settings FILE] [--set SECTION.KEY=VALUE]...\n"
           "\n"
           "Reporting service of the Vela audio framework. It serves at the socket that the service manager hands\n"
           "over, else at one of its own in paths.runtime, until it is told to end.\n"
           "\n"
           "  --check                  reads the settings, builds what the service stands on, and says line by line\n"
           "                           what this device offers; exits with 1 when something essential is missing\n"
           "  --json                   the same as JSON Lines\n"
           "  --settings FILE          settings file in place of /etc/vela/vela-reporting.toml\n"
           "  --set SECTION.KEY=VALUE  a single setting, over the file's; may be repeated\n"
           "  --version                prints the version\n"
           "  --help                   prints this text\n"
           "\n"
           "Exit status: 0 ended by a signal or checked, 1 it could not serve or something essential is missing,\n"
           "2 ended by a client, 64 wrong usage, 78 wrong settings.\n";
}

} // namespace vela
