// vela-reportingd: wiring only.
#include "app/CommandLine.h"
#include "app/ServiceCheck.h"
#include "app/ServiceHost.h"
#include "app/ServicePlatform.h"
#include "platform/dbus/ServiceEndpoint.h"
#include "platform/host/HostFacts.h"
#include "platform/host/StandardOutput.h"
#include "platform/linux/DescriptorLimit.h"
#include "platform/linux/LinuxFileSystem.h"
#include "platform/linux/ServiceManager.h"
#include "platform/linux/StandardDescriptors.h"
#include "platform/toml/SettingsLoading.h"

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <iostream>

namespace {

using namespace vela;

constexpr int kWrongUsage = 64;
constexpr int kWrongSettings = 78;

/// Nothing that the check posts takes longer on a working device, however loaded.
constexpr std::chrono::seconds kPatience{30};

int refuseUsage(std::string_view reason) {
    std::cerr << "vela-reportingd: " << reason << '\n';
    return kWrongUsage;
}

int print(std::string_view text, int status) {
    platform::StandardOutput output;
    output.stream() << text;
    return output.finish("vela-reportingd", std::cerr) ? status : EXIT_FAILURE;
}

int check(const CommandLine& line, const platform::LoadedSettings& loaded) {
    const Settings& settings = *loaded.reading.settings;
    ServicePlatform platform(settings);
    CheckedFacts facts = platform.facts(settings);
    facts.settingsFile = loaded.file;
    facts.singleSettings = line.settings.size();
    const std::vector<CheckFinding> findings = checkService(settings, platform.parts(), facts, kPatience);
    return print(line.json ? findingsAsJson(findings) : findingsAsText(findings),
                 isSomethingMissing(findings) ? EXIT_FAILURE : EXIT_SUCCESS);
}

/// Does not come back: what sessions left queued must not find the service half taken down.
[[noreturn]] void serve(const Settings& settings, platform::ServiceManager& manager) {
    platform::DbusServiceEndpoint::blockEndSignals(); // before there are other threads
    platform::raiseDescriptorLimit();
    ServicePlatform servicePlatform(settings);
    ServiceHost host(settings, servicePlatform, manager);
    const platform::Result<platform::Done> served = host.serve();
    if (!served) {
        std::cerr << "vela-reportingd: " << served.failure().description << '\n';
    }
    std::_Exit(served ? EXIT_SUCCESS : EXIT_FAILURE);
}

int runWithSettings(const CommandLine& line, platform::ServiceManager& manager) {
    const platform::LinuxFileSystem files;
    const platform::LoadedSettings loaded =
        platform::loadSettings({line.settingsFile, line.settings, platform::processEnvironment()}, files);
    if (!loaded.reading.settings) {
        for (const SettingError& error : loaded.reading.errors) {
            std::cerr << error.text() << '\n';
        }
        return kWrongSettings;
    }
    if (line.action == CommandLine::Action::Check) {
        return check(line, loaded);
    }
    serve(*loaded.reading.settings, manager);
}

} // namespace

int main(int argumentCount, char** arguments) {
    platform::holdStandardDescriptors();
    static_cast<void>(std::signal(SIGPIPE, SIG_IGN)); // it cannot fail for a signal that exists
    platform::ServiceManager manager;
    const std::vector<std::string_view> given(arguments + (argumentCount > 0 ? 1 : 0), arguments + argumentCount);
    const platform::Result<CommandLine> line = readCommandLine(given);
    if (!line) {
        return refuseUsage(line.failure().description + "; see --help");
    }
    switch (line->action) {
    case CommandLine::Action::Help:
        return print(helpText(), EXIT_SUCCESS);
    case CommandLine::Action::Version:
        return print("vela-reportingd " VELA_VERSION "\n", EXIT_SUCCESS);
    case CommandLine::Action::Check:
    case CommandLine::Action::Serve:
        return runWithSettings(*line, manager);
    }
    return EXIT_FAILURE;
}
