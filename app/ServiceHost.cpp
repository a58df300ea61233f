#include "app/ServiceHost.h"

#include "common/VelaReportingLogCategories.h"
#include "platform/dbus/Protocol.h"
#include "tracing/TraceRunner.h"

#include <chrono>

namespace vela {

namespace {

/// How long the end waits for what clients had sent before it. A stop that waits for its trace may take longer.
constexpr std::chrono::seconds kEndPatience{5};

const LogCategory& hostLog() { return VelaReportingServiceDelegateCategory(); }

constexpr std::uint32_t kFolderPermissions = 0755;

platform::dbus::AccessRule accessRuleOf(const Settings& settings) {
    std::vector<std::string> unknown;
    platform::dbus::AccessRule rule =
        platform::dbus::AccessRule::ofNames(settings.access.users, settings.access.groups, unknown);
    for (const std::string& name : unknown) {
        hostLog().error("access: this system knows no %@", name);
    }
    return rule;
}

/// Who may connect as a group may emit trace events, too: the first one named, as a folder has one group.
platform::LinuxSpoorOptions spoorOptionsOf(const Settings& settings, const platform::dbus::AccessRule& access) {
    platform::LinuxSpoorOptions options;
    options.runtimeFolder = settings.paths.runtime;
    if (!access.groups().empty()) {
        options.emitterGroup = access.groups().front();
    }
    return options;
}

platform::PerfProbe::Options probeOptionsOf(const std::string& pathRoot) {
    platform::PerfProbe::Options options;
    options.folder = pathRoot + std::string(VelaReportingTracingLogsDirectory);
    return options;
}

} // namespace

ServiceHost::ServiceHost(const Settings& settings, ServicePlatform& servicePlatform, platform::ServiceManager& manager)
    : settings_(settings),
      platform_(servicePlatform),
      manager_(manager),
      pathRoot_(settings.paths.root == "/" ? std::string() : settings.paths.root),
      access_(accessRuleOf(settings)),
      buildType_(servicePlatform.deviceProperties()),
      ledger_(servicePlatform.processes().ownPid()),
      memory_({settings.limits.sessionBytes, settings.limits.totalBytes}),
      hwStats_(platform::hwStatsOptionsOf(settings), servicePlatform.clock()),
      spoor_(spoorOptionsOf(settings, access_), servicePlatform.clock()),
      probe_(probeOptionsOf(pathRoot_), servicePlatform.clock(), servicePlatform.queues().background()),
      metricsheet_(servicePlatform.fileSystem()) {}

platform::Result<platform::Done> ServiceHost::serve() {
    auto backends =
        makeDeliveryBackends({settings_, ledger_, platform_.clock(), [this] { return platform_.recentLog(); }});
    if (!backends) {
        return backends.failure();
    }
    backends_ = *std::move(backends);
    facilities_ = std::make_unique<platform::Platform>(facilities(*backends_));
    delegate_ = VelaReportingServiceDelegate::init({*facilities_, pathRoot_, &memory_, &ledger_});
    backends_->setInspection(*delegate_);
    auto endpoint = openEndpoint();
    if (!endpoint) {
        return endpoint.failure();
    }
    platform::DbusServiceEndpoint& listener = **endpoint;
    listener.setDelegate(*delegate_);
    listener.setInspection(*delegate_);
    static_cast<void>(manager_.tellReady());
    platform::Result<platform::Done> served = listener.resume();
    static_cast<void>(manager_.tellStopping());
    handleWhatIsQueued();
    backends_->close();
    return served;
}

platform::Platform ServiceHost::facilities(DeliveryBackends& backends) {
    return {.beacon = backends.beacon(),
            .clock = platform_.clock(),
            .deviceProperties = platform_.deviceProperties(),
            .fileSystem = platform_.fileSystem(),
            .hwStats = hwStats_,
            .joule = backends.joule(),
            .jsonWriting = platform_.json(),
            .malady = backends.malady(),
            .metricsheet = metricsheet_,
            .notifications = platform_.notifications(),
            .preferences = platform_.preferences(),
            .probe = probe_,
            .processControl = processControl_,
            .processInformation = platform_.processes(),
            .propertyListReading = platform_.propertyLists(),
            .spoor = spoor_,
            .tally = backends.tally(),
            .telem = backends.telem(),
            .workQueues = platform_.queues()};
}

platform::Result<std::unique_ptr<platform::DbusServiceEndpoint>> ServiceHost::openEndpoint() {
    platform::DbusServiceOptions options = endpointOptions();
    auto handed = manager_.takeListeningSocket();
    if (!handed) {
        return handed.failure();
    }
    if (*handed) {
        options.listeningDescriptor = (*std::move(handed))->release();
    } else {
        const platform::Result<platform::Done> made =
            platform_.fileSystem().createDirectories(settings_.paths.runtime, kFolderPermissions);
        if (!made) {
            return made.failure();
        }
        options.socketPath = settings_.paths.runtime + "/" + std::string(platform::dbus::kSocketName);
    }
    const std::string place = options.socketPath.empty() ? "the socket of the service manager" : options.socketPath;
    auto endpoint = platform::DbusServiceEndpoint::open(std::move(options));
    if (endpoint) {
        hostLog().standard("serving at %@", place);
    }
    return endpoint;
}

platform::DbusServiceOptions ServiceHost::endpointOptions() {
    platform::DbusServiceOptions options;
    options.access = access_;
    options.version = VELA_VERSION;
    options.messageBytes = settings_.limits.messageBytes;
    options.valueDepth = settings_.limits.valueDepth;
    options.sessionsPerClient = settings_.limits.sessionsPerClient;
    options.clientsPerUser = settings_.limits.clientsPerUser;
    options.unsentReplies = settings_.limits.unsentReplies;
    options.isBehind = [this] { return backends_->isBehind(); };
    if (const auto limit = manager_.watchdogLimit()) {
        options.interval = std::chrono::duration_cast<std::chrono::milliseconds>(*limit / 2);
        options.periodic = [this] { static_cast<void>(manager_.tellAlive()); };
    }
    return options;
}

void ServiceHost::handleWhatIsQueued() {
    const auto done = std::shared_ptr<platform::Semaphore>(platform_.queues().makeSemaphore(0));
    delegate_->reportingQueue().post([done] { done->signal(); });
    done->wait(kEndPatience);
}

} // namespace vela
