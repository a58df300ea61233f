#include "reporters/pipewire/ReporterCommandLine.h"

#include "common/CommandOptions.h"
#include "common/SettingValues.h"

#include <array>
#include <utility>

namespace vela::reporter {

namespace {

using Action = ReporterCommandLine::Action;

constexpr std::array<CommandOption, 6> kOptions{
    {{"--settings", true}, {"--set", true}, {"--check"}, {"--example"}, {"--version"}, {"--help"}}};

constexpr std::array<std::pair<std::string_view, Action>, 4> kActions{{{"--help", Action::Help},
                                                                       {"--version", Action::Version},
                                                                       {"--example", Action::Example},
                                                                       {"--check", Action::Check}}};

} // namespace

platform::Result<ReporterCommandLine> readReporterCommandLine(std::span<const std::string_view> arguments) {
    const platform::Result<CommandArguments> read = readArguments(arguments, kOptions);
    if (!read) {
        return read.failure();
    }
    ReporterCommandLine line;
    for (const auto& [option, action] : kActions) {
        if (read->has(option)) {
            line.action = action;
            break;
        }
    }
    if (line.action == Action::Help || line.action == Action::Version) {
        return line;
    }
    if (!read->operands.empty()) {
        return platform::Failure{0, "there is nothing to do with " + quotedText(read->operands.front())};
    }
    if (const std::vector<std::string> files = read->valuesOf("--settings"); !files.empty()) {
        line.settingsFile = files.back();
    }
    line.settings = read->valuesOf("--set");
    return line;
}

std::string_view reporterHelpText() {
    return "usage: vela-pipewire-reporter [--settings FILE] [--set SECTION.KEY=VALUE]...\n"
           "       vela-pipewire-reporter --check [--settings FILE] [--set SECTION.KEY=VALUE]...\n"
           "       vela-pipewire-reporter --example\n"
           "\n"
           "Watches the audio graph of a PipeWire server and reports every stream to the Vela reporting service as a\n"
           "reporting session, until it is told to end. Neither of the two need be there: it waits for them.\n"
           "\n"
           "  --check                  reads the settings and names every mistake\n"
           "  --example                prints a settings file in which every default stands as a comment\n"
           "  --settings FILE          settings file in place of /etc/vela/pipewire-reporter.toml\n"
           "  --set SECTION.KEY=VALUE  a single setting, over the file's; may be repeated\n"
           "  --version                prints the version\n"
           "  --help                   prints this text\n"
           "\n"
           "Exit status: 0 ended by a signal or checked, 1 it could not watch, 64 wrong usage, 78 wrong settings.\n";
}

} // namespace vela::reporter
