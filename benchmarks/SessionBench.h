// What the session's benchmarks share: a platform that discards what it is given, and messages of twelve entries.
#pragma once

#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxFileSystem.h"
#include "platform/linux/LinuxJsonWriting.h"
#include "platform/linux/LinuxWorkQueues.h"
#include "session/VelaReportingSession.h"

#include <array>
#include <atomic>
#include <cstdint>
#include <cstdio>
#include <ctime>
#include <memory>
#include <optional>
#include <semaphore>
#include <string>
#include <string_view>
#include <utility>

namespace vela {

class DiscardingBeacon final : public platform::Beacon {
public:
    Value newBeaconHierarchyToken(ValueRef) override { return "token"; }
    std::shared_ptr<platform::BeaconSession> createBeaconSession(const Dictionary&, const Dictionary&) override {
        return std::make_shared<Session>(*this);
    }
    platform::Result<platform::Done> sendOneBeaconMessage(const Dictionary&, const Dictionary&, std::uint16_t,
                                                          std::uint16_t, const Dictionary&) override {
        return platform::Done();
    }

    /// Whether a discovery finds back ends at once, or never answers.
    bool answers = true;
    std::atomic<std::uint64_t> sent = 0;

private:
    class Session final : public platform::BeaconSession {
    public:
        explicit Session(DiscardingBeacon& beacon) : beacon_(beacon) {}
        void
        startBeaconBackendDiscovery(platform::UniqueFunction<void(std::optional<Array> backends)> completion) override {
            if (beacon_.answers) {
                completion(Array{"discarded"});
            }
        }
        platform::Result<platform::Done> sendBeaconMessage(std::uint16_t, std::uint16_t, const Dictionary&) override {
            ++beacon_.sent;
            return platform::Done();
        }
        void flushBeaconMessages() override {}
        std::string description() const override { return "discarding"; }

    private:
        DiscardingBeacon& beacon_;
    };
};

class DiscardingSpoor final : public platform::Spoor {
public:
    using platform::Spoor::emit;
    std::unique_ptr<platform::SpoorSession> createSession() override { return nullptr; }
    void emit(std::uint32_t, const std::array<std::uint64_t, 4>&) override {}
};

class DiscardingAnalytics final : public VelaReportingSessionEventHandler {
public:
    void handleEvent(const Dictionary&, std::uint32_t, std::uint32_t,
                     const std::shared_ptr<VelaReportingSession>&) override {}
};

/// A session's surroundings on the real queues and files; logging is off unless the program turns it on.
struct SessionBench {
    explicit SessionBench(std::string pathRoot = "")
        : platform{beacon, clock, fileSystem, json, spoor, queues, analytics, std::move(pathRoot)} {}

    std::shared_ptr<VelaReportingSession> startedSession() {
        std::shared_ptr<VelaReportingSession> session = VelaReportingSession::initWithID(42, {1}, platform);
        session->setServiceType(AudioServiceTypeHaptics);
        session->setBeaconReportingEnabled(true);
        session->start();
        if (beacon.answers) {
            // Shared: this thread may go on while the other is still leaving `release`.
            const auto ready = std::make_shared<std::binary_semaphore>(0);
            session->setTransactionCompleteBlock(
                [ready](const std::optional<platform::IpcError>&, bool) { ready->release(); });
            ready->acquire();
        }
        return session;
    }

    DiscardingBeacon beacon;
    DiscardingSpoor spoor;
    DiscardingAnalytics analytics;
    platform::LinuxClock clock;
    platform::LinuxFileSystem fileSystem;
    platform::LinuxJsonWriting json;
    platform::LinuxWorkQueues queues;
    VelaReportingSessionPlatform platform;
};

/// Twelve entries: 3 booleans, 4 integers, 3 reals, 2 strings of 24 characters. Numbers and one of the strings are each
/// message's own. Output goes on and off every 100 messages, the volume changes every 50, a second passes from one to
/// the next.
inline Dictionary benchMessage(std::int64_t number) {
    char devices[40];
    std::snprintf(devices, sizeof(devices), "Speaker,Receiver%08lld", static_cast<long long>(number));
    DictionaryBuilder message;
    message.add("session_output_running", number / 100 % 2 == 0);
    message.add("spatializationEnabled", false);
    message.add("muted", number % 2 == 0);
    message.add("underruns", number);
    message.add("frames", number * 512);
    message.add("mChannelsPerFrame", 2);
    message.add("sample_rate", 48'000);
    message.add("NexoSessionVolume", static_cast<double>(number / 50 % 16) / 16);
    message.add("load", static_cast<double>(number) / 1024);
    message.add("velareporting_timestamp", 1.7e9 + static_cast<double>(number));
    message.add("route", std::string_view(devices));
    message.add("session_selected_format", "48000 Hz, 2 ch, F32 LE..");
    return message.build();
}

/// Processor time of the calling thread, in seconds.
inline double threadSeconds() {
    std::timespec time{};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
}

} // namespace vela
