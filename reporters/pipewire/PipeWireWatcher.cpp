#include "reporters/pipewire/PipeWireWatcher.h"

#include "reporters/pipewire/ConnectionPauses.h"
#include "reporters/pipewire/ServerConnection.h"
#include "reporters/pipewire/SocketWatch.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <ctime>
#include <optional>
// The profiler's interface stands on that of the implementation.
#include <pipewire/extensions/profiler.h>
#include <pipewire/impl.h>
#include <pipewire/pipewire.h>
#include <spa/param/param.h>
#include <sys/random.h>
#include <utility>

namespace vela::reporter {

namespace {

using std::chrono::nanoseconds;

constexpr long kNanosecondsPerSecond = 1'000'000'000;

timespec timespecOf(nanoseconds time) {
    return {static_cast<std::time_t>(time.count() / kNanosecondsPerSecond),
            static_cast<long>(time.count() % kNanosecondsPerSecond)};
}

/// Reporter IDs of other programs on the device are small numbers, as a rule; those of other connections differ in
/// these bits. Together with a serial number of 32 bits they are exact in every JSON reader.
std::int64_t newReporterIDBase() {
    constexpr std::uint32_t kBits = 0xFFFFF;
    constexpr unsigned kSerialBits = 32;
    std::uint32_t random = 0;
    if (getrandom(&random, sizeof(random), 0) != static_cast<ssize_t>(sizeof(random))) {
        random = static_cast<std::uint32_t>(std::time(nullptr));
    }
    return std::int64_t{std::max<std::uint32_t>(random & kBits, 1)} << kSerialBits;
}

} // namespace

/// The main loop with its sources, and the connection when there is one.
struct PipeWireWatcher::Loop final : ServerConnectionOwner {
    Loop(const WatcherOptions& watcherOptions, GraphModel& watched, const std::function<void(const std::string&)>& log)
        : options(watcherOptions),
          graph(watched),
          tell(log) {}
    ~Loop() override;
    Loop(const Loop&) = delete;
    Loop& operator=(const Loop&) = delete;

    GraphModel& model() override { return graph; }
    bool wantsCycles() const override { return options.cycles; }
    /// Sets the timer to what the model waits for.
    void modelChanged() override;
    void connectionLost() override;

    bool setUp();
    void connect();
    void connectAfter(std::chrono::milliseconds pause);
    void dropConnection();

    const WatcherOptions& options;
    GraphModel& graph;
    const std::function<void(const std::string&)>& tell;
    pw_main_loop* mainLoop = nullptr;
    pw_loop* loop = nullptr;
    pw_context* context = nullptr;
    spa_source* modelTimer = nullptr;
    spa_source* connectTimer = nullptr;
    spa_source* lossEvent = nullptr;
    std::optional<SocketWatch> socketWatch;
    std::unique_ptr<ServerConnection> connection;
    std::optional<nanoseconds> armed;
    ConnectionPauses pauses;
    bool isWaitingTold = false;
};

PipeWireWatcher::Loop::~Loop() {
    connection.reset();
    if (context != nullptr) {
        pw_context_destroy(context);
    }
    if (mainLoop != nullptr) {
        pw_main_loop_destroy(mainLoop);
    }
}

bool PipeWireWatcher::Loop::setUp() {
    mainLoop = pw_main_loop_new(nullptr);
    if (mainLoop == nullptr) {
        return false;
    }
    loop = pw_main_loop_get_loop(mainLoop);
    const auto quit = [](void* data, int /*signal*/) { pw_main_loop_quit(static_cast<Loop*>(data)->mainLoop); };
    pw_loop_add_signal(loop, SIGINT, quit, this);
    pw_loop_add_signal(loop, SIGTERM, quit, this);
    modelTimer = pw_loop_add_timer(
        loop,
        [](void* data, std::uint64_t /*expirations*/) {
            auto* const self = static_cast<Loop*>(data);
            self->armed.reset();
            self->graph.onTime(momentNow());
            self->modelChanged();
        },
        this);
    connectTimer = pw_loop_add_timer(
        loop, [](void* data, std::uint64_t /*expirations*/) { static_cast<Loop*>(data)->connect(); }, this);
    lossEvent = pw_loop_add_event(
        loop, [](void* data, std::uint64_t /*count*/) { static_cast<Loop*>(data)->dropConnection(); }, this);
    pw_properties* const properties =
        pw_properties_new(PW_KEY_APP_NAME, "vela-pipewire-reporter", PW_KEY_MEDIA_CATEGORY, "Manager",
                          PW_KEY_CONFIG_NAME, "client.conf", nullptr);
    context = pw_context_new(loop, properties, 0);
    if (context == nullptr || modelTimer == nullptr || connectTimer == nullptr || lossEvent == nullptr) {
        return false;
    }
    // Without it the profiler's events are not understood.
    if (options.cycles && pw_context_load_module(context, PW_EXTENSION_MODULE_PROFILER, nullptr, nullptr) == nullptr) {
        tell("there will be no statistics: the server library's module-profiler cannot be loaded");
    }
    socketWatch.emplace(socketPathOf(options.remote));
    if (socketWatch->descriptor() >= 0) {
        pw_loop_add_io(
            loop, socketWatch->descriptor(), SPA_IO_IN, false,
            [](void* data, int /*descriptor*/, std::uint32_t /*mask*/) {
                auto* const self = static_cast<Loop*>(data);
                if (self->socketWatch->hasCome() && !self->connection) {
                    self->pauses.reset();
                    self->connect();
                }
            },
            this);
    }
    return true;
}

void PipeWireWatcher::Loop::connect() {
    if (connection) {
        return;
    }
    pw_properties* const properties =
        options.remote.empty() ? nullptr : pw_properties_new(PW_KEY_REMOTE_NAME, options.remote.c_str(), nullptr);
    pw_core* const core = pw_context_connect(context, properties, 0);
    if (core == nullptr) {
        if (!std::exchange(isWaitingTold, true)) {
            tell(std::string("waiting for an audio server: ") + std::strerror(errno)); // NOLINT(concurrency-mt-unsafe)
        }
        if (const auto pause = pauses.attemptFailed(socketWatch->descriptor() >= 0)) {
            connectAfter(*pause);
        }
        return;
    }
    isWaitingTold = false;
    pauses.connected(momentNow().monotonic);
    graph.connected(newReporterIDBase());
    connection = std::make_unique<ServerConnection>(*this, core);
    if (connection->isLost()) {
        dropConnection();
        return;
    }
    tell("connected to the audio server");
}

void PipeWireWatcher::Loop::connectAfter(std::chrono::milliseconds pause) {
    timespec value = timespecOf(pause);
    pw_loop_update_timer(loop, connectTimer, &value, nullptr, false);
}

/// The connection cannot be destroyed in a call of its own.
void PipeWireWatcher::Loop::connectionLost() { pw_loop_signal_event(loop, lossEvent); }

void PipeWireWatcher::Loop::dropConnection() {
    if (connection) {
        tell("the connection to the audio server is lost");
        connection.reset();
        connectAfter(pauses.connectionLost(momentNow().monotonic));
    }
}

void PipeWireWatcher::Loop::modelChanged() {
    const std::optional<nanoseconds> deadline = graph.deadline();
    if (deadline == armed) {
        return;
    }
    armed = deadline;
    timespec value = deadline ? timespecOf(std::max(*deadline, nanoseconds(1))) : timespec{};
    pw_loop_update_timer(loop, modelTimer, &value, nullptr, true);
}

PipeWireWatcher::PipeWireWatcher(WatcherOptions options, GraphModel& model,
                                 std::function<void(const std::string&)> tell)
    : options_(std::move(options)),
      model_(model),
      tell_(std::move(tell)) {
    pw_init(nullptr, nullptr);
}

PipeWireWatcher::~PipeWireWatcher() { pw_deinit(); }

bool PipeWireWatcher::run() {
    Loop loop(options_, model_, tell_);
    if (!loop.setUp()) {
        return false;
    }
    loop.connect();
    pw_main_loop_run(loop.mainLoop);
    model_.serverLost(momentNow());
    return true;
}

} // namespace vela::reporter
