#include "cli/Subcommand.h"

#include "cli/TraceCommand.h"
#include "common/SettingValues.h"

#include <algorithm>
#include <array>
#include <ostream>
#include <string>

namespace vela {

namespace {

constexpr std::array<Subcommand, 11> kSubcommands{{
    {"status", "[--ledger] [--json]", "what the service is doing, and what became of all deliveries", runStatus},
    {"sessions", "[--json]", "the reporting sessions of every client", runSessions},
    {"call", "[OPERATION [JSON]...] [--json]",
     "calls one operation and prints the reply; alone it lists the operations", runCall},
    {"run", "FILE", "calls what a file of JSON Lines says, over one connection", runRun},
    {"deliveries",
     "[--backend BACKEND] [--session ID] [--since TIME] [--follow] [--json] [--settings FILE] "
     "[--set SECTION.KEY=VALUE]...",
     "what was delivered to the back ends", runDeliveries},
    {"defaults",
     "(read DOMAIN [KEY] [--json] | write DOMAIN KEY VALUE | delete DOMAIN [KEY]) [--settings FILE] "
     "[--set SECTION.KEY=VALUE]...",
     "reads and changes the preferences that the service reads", runDefaults},
    {"notify", "NAME [STATE] [--settings FILE] [--set SECTION.KEY=VALUE]...", "posts a notification", runNotify},
    {"drivers", "[--settings FILE] [--set SECTION.KEY=VALUE]... [--watch [--count N]] [--json]",
     "the channels of driver statistics and their values", runDrivers},
    {"trace", kTraceArguments, "emits a kernel-trace event; reports what a trace run measured", runTrace},
    {"settings", "[--settings FILE] [--set SECTION.KEY=VALUE]... [--json | --example]",
     "the settings in force and where each comes from", runSettings},
    {"plist", "FILE [--to json|xml|binary|text]", "prints a property list in another form", runPlist},
}};

constexpr std::size_t kNameColumns = 12;

const Subcommand* findSubcommand(std::string_view name) {
    const auto* found = std::ranges::find(kSubcommands, name, &Subcommand::name);
    return found == kSubcommands.end() ? nullptr : found;
}

std::string usageOf(const Subcommand& subcommand) {
    return "velactl " + std::string(subcommand.name) + " " + std::string(subcommand.arguments);
}

void printHelp(std::ostream& out) {
    out << "usage: velactl SUBCOMMAND [ARGUMENT]...\n\nClient and inspector of the Vela reporting service.\n\n";
    for (const Subcommand& subcommand : kSubcommands) {
        std::string name(subcommand.name);
        name.resize(kNameColumns, ' ');
        out << "  " << name << subcommand.summary << "\n  " << std::string(kNameColumns, ' ') << usageOf(subcommand)
            << "\n";
    }
    out << "\n  --version   prints the version\n  --help, -h  prints this text; behind a subcommand, how to use "
           "that\n\n"
           "Exit status: 0 done, 1 failed, 2 wrong usage, 3 no service.\n";
}

bool isHelp(std::string_view argument) { return argument == "--help" || argument == "-h"; }

/// What is asked for without a subcommand; nothing may follow it.
int runAlone(std::span<const std::string_view> arguments, Console& console) {
    if (arguments.size() > 1) {
        return refuseUsage("", "there is nothing to do with " + quotedText(arguments[1]), console);
    }
    if (isHelp(arguments.front())) {
        printHelp(console.out);
    } else {
        console.out << "velactl " VELA_VERSION "\n";
    }
    return kDone;
}

} // namespace

std::span<const Subcommand> subcommands() { return kSubcommands; }

int refuseUsage(std::string_view subcommand, std::string_view reason, Console& console) {
    const Subcommand* known = findSubcommand(subcommand);
    console.error << "velactl: " << reason << "; "
                  << (known == nullptr ? std::string("see velactl --help") : "usage: " + usageOf(*known)) << '\n';
    return kWrongUsage;
}

int runVelactl(std::span<const std::string_view> arguments, Console& console) {
    if (arguments.empty()) {
        return refuseUsage("", "a subcommand is missing", console);
    }
    const std::string_view name = arguments.front();
    if (isHelp(name) || name == "--version") {
        return runAlone(arguments, console);
    }
    const Subcommand* subcommand = findSubcommand(name);
    if (subcommand == nullptr) {
        return refuseUsage("", "there is no subcommand " + escapedText(name), console);
    }
    const auto rest = arguments.subspan(1);
    if (std::any_of(rest.begin(), std::ranges::find(rest, "--"), isHelp)) {
        console.out << "usage: " << usageOf(*subcommand) << "\n\n" << subcommand->summary << '\n';
        return kDone;
    }
    return subcommand->run(rest, console);
}

} // namespace vela
