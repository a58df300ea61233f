// vela-pipewire-reporter: wiring only.
#include "platform/linux/LinuxFileSystem.h"
#include "reporters/pipewire/GraphModel.h"
#include "reporters/pipewire/LibraryCalls.h"
#include "reporters/pipewire/PipeWireWatcher.h"
#include "reporters/pipewire/ReportSender.h"
#include "reporters/pipewire/ReporterCommandLine.h"
#include "reporters/pipewire/ReporterSettings.h"
#include "reporters/pipewire/StatisticsChannels.h"

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <string>
#include <vector>

namespace {

using namespace vela;
using namespace vela::reporter;

constexpr int kWrongUsage = 64;
constexpr int kWrongSettings = 78;

/// For what is still to be told when the reporter ends.
constexpr std::chrono::seconds kPatience{3};

void tell(const std::string& line) { std::cerr << "vela-pipewire-reporter: " + line + "\n" << std::flush; }

int print(std::string_view text) {
    std::cout << text << std::flush;
    return std::cout ? EXIT_SUCCESS : EXIT_FAILURE;
}

/// Signals are read from the loop; no thread may take them before.
void blockEndSignals() {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGINT);
    sigaddset(&signals, SIGTERM);
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

/// Says so where names have to be left out that were to be hashed.
NamePolicy namePolicyOf(NameTreatment treatment) {
    constexpr const char* kFile = "/etc/machine-id";
    constexpr std::size_t kMost = 256;
    const platform::Result<std::string> text = platform::LinuxFileSystem().readFile(kFile, kMost);
    const std::string secret = deviceSecretOf(text ? *text : "");
    if (treatment == NameTreatment::Hash && secret.empty()) {
        tell(std::string("names of applications are left out: ") + kFile + " has no ID to hash them with");
    }
    return {treatment, secret};
}

int watch(const ReporterSettings& settings) {
    blockEndSignals();
    LibraryCalls service(settings.address);
    if (service.status() != VelaReportingStatusOk) {
        tell(std::string("there is no client of the reporting service: ") + reporting::textOf(service.status()));
        return EXIT_FAILURE;
    }
    std::unique_ptr<StatisticsSink> statistics = std::make_unique<NoStatistics>();
    if (settings.statistics) {
        statistics = std::make_unique<StatisticsChannels>(
            settings.folder, [](const std::string& reason) { tell("statistics are not published: " + reason); });
    }
    ReportSender sender(service);
    const ReportingRules rules{settings.leftOutApplications, settings.leftOutRoles, settings.leftOutNodes,
                               namePolicyOf(settings.names), settings.deviceSessions};
    GraphModel model(rules, sender, *statistics);
    PipeWireWatcher watcher({settings.remote, settings.statistics}, model, tell);
    const bool watched = watcher.run();
    if (!watched) {
        tell("the audio server's library cannot be set up");
    }
    const std::size_t left = sender.end(kPatience);
    if (left + sender.dropped() > 0) {
        tell(std::to_string(left + sender.dropped()) + " calls did not reach the reporting service");
    }
    return watched ? EXIT_SUCCESS : EXIT_FAILURE;
}

int runWithSettings(const ReporterCommandLine& line) {
    const ReporterSettingsReading reading =
        loadReporterSettings(line.settingsFile, line.settings, platform::LinuxFileSystem());
    if (!reading.settings) {
        for (const SettingError& error : reading.errors) {
            std::cerr << error.text() << '\n';
        }
        return kWrongSettings;
    }
    if (line.action == ReporterCommandLine::Action::Check) {
        return print("The settings are right.\n");
    }
    return watch(*reading.settings);
}

} // namespace

int main(int argumentCount, char** arguments) {
    static_cast<void>(std::signal(SIGPIPE, SIG_IGN)); // it cannot fail for a signal that exists
    const std::vector<std::string_view> given(arguments + (argumentCount > 0 ? 1 : 0), arguments + argumentCount);
    const platform::Result<ReporterCommandLine> line = readReporterCommandLine(given);
    if (!line) {
        tell(line.failure().description + "; see --help");
        return kWrongUsage;
    }
    switch (line->action) {
    case ReporterCommandLine::Action::Help:
        return print(reporterHelpText());
    case ReporterCommandLine::Action::Version:
        return print("vela-pipewire-reporter " VELA_VERSION "\n");
    case ReporterCommandLine::Action::Example:
        return print(exampleReporterSettings());
    case ReporterCommandLine::Action::Check:
    case ReporterCommandLine::Action::Watch:
        return runWithSettings(*line);
    }
    return EXIT_FAILURE;
}
