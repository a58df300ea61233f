// What the tests of this folder share: the whole service on fakes, whose time and queues stand still until a test moves
// them, and clients that call it.
#pragma once

#include "common/VelaReportingUtility.h"
#include "common/values/TextualForm.h"
#include "service/VelaReportingClientServerInstance.h"
#include "service/VelaReportingServiceDelegate.h"
#include "testing/CapturingLog.h"
#include "testing/FakeBeacon.h"
#include "testing/FakeDeviceProperties.h"
#include "testing/FakeFileSystem.h"
#include "testing/FakeHwStats.h"
#include "testing/FakeIpc.h"
#include "testing/FakeJoule.h"
#include "testing/FakeJsonWriting.h"
#include "testing/FakeMalady.h"
#include "testing/FakeMetricsheet.h"
#include "testing/FakeNotifications.h"
#include "testing/FakePreferences.h"
#include "testing/FakeProbe.h"
#include "testing/FakeProcessControl.h"
#include "testing/FakeProcessInformation.h"
#include "testing/FakePropertyListReading.h"
#include "testing/FakeSpoor.h"
#include "testing/FakeTally.h"
#include "testing/FakeTelem.h"
#include "testing/ManualClock.h"
#include "testing/ManualWorkQueues.h"

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <functional>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <initializer_list>
#include <memory>
#include <optional>
#include <ostream>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

namespace vela {

// NOLINTNEXTLINE(readability-identifier-naming): the test framework looks for this name
inline void PrintTo(const Dictionary& dictionary, std::ostream* stream) { *stream << textualForm(Value(dictionary)); }
// NOLINTNEXTLINE(readability-identifier-naming)
inline void PrintTo(const Value& value, std::ostream* stream) { *stream << textualForm(value); }

using platform::LogLevel;
using testing::CapturedLine;
using BeaconOperation = testing::FakeBeacon::Operation;
using BeaconDiscovery = testing::FakeBeacon::Discovery;

inline CapturedLine serviceLine(LogLevel level, std::string message) {
    return {level, "velars", "VelaReportingServiceDelegate", std::move(message)};
}

/// A session as a list of sessions shows it.
inline std::string shown(std::int64_t reporterID, const std::string& serviceName, std::int32_t pid, bool started,
                         const std::string& application = "Unknown") {
    return "\"reporterID=" + std::to_string(reporterID) + ",serviceName=" + serviceName +
           ",ownerPid=" + std::to_string(pid) + ",HostApplicationDisplayID=" + application +
           ",started=" + (started ? "1" : "0") + "\"";
}

/// What came back of one call.
template <class... Types>
struct Answer {
    int calls = 0;
    std::optional<std::pair<std::string, std::int32_t>> error; ///< domain and code
    std::string limit;
    std::optional<std::tuple<Types...>> values;

    static platform::IpcReply<Types...> into(const std::shared_ptr<Answer>& answer) {
        return [answer](const std::optional<platform::IpcError>& replied, Types... content) {
            ++answer->calls;
            answer->error = replied ? std::optional(std::pair(replied->domain, replied->code)) : std::nullopt;
            answer->limit = replied ? replied->limit : "";
            answer->values = std::tuple<Types...>(std::move(content)...);
        };
    }
};
template <class... Types>
std::shared_ptr<Answer<Types...>> newAnswer() {
    return std::make_shared<Answer<Types...>>();
}

using ReporterIDs = std::optional<std::vector<std::int64_t>>;
inline ReporterIDs to(std::initializer_list<std::int64_t> reporterIDs) {
    return std::vector<std::int64_t>(reporterIDs);
}

/// A client's calls, each with all that it sets in motion, and its one answer; none unless it came exactly once.
struct Client {
    std::shared_ptr<testing::FakeIpcConnection> connection;
    testing::ManualWorkQueues& queues;

    platform::ReportingServiceProtocol& operations() const { return *connection->client(); }
    std::shared_ptr<VelaReportingClientServerInstance> instance() const {
        return std::dynamic_pointer_cast<VelaReportingClientServerInstance>(connection->client());
    }
    std::shared_ptr<VelaReportingSession> session(std::int64_t reporterID) const {
        return instance()->findReportingSessionForID(reporterID, false);
    }

    std::optional<bool> create(std::int64_t reporterID) const {
        return once<bool>([&](auto reply) { operations().createReportingSession(reporterID, std::move(reply)); });
    }
    std::optional<bool> setServiceType(std::uint16_t type, std::int64_t reporterID) const {
        return once<bool>([&](auto reply) { operations().setServiceType(type, reporterID, std::move(reply)); });
    }
    std::optional<std::uint16_t> serviceType(std::int64_t reporterID) const {
        return once<std::uint16_t>(
            [&](auto reply) { operations().getServiceNameForReporterID(reporterID, std::move(reply)); });
    }
    std::optional<bool> setConfiguration(const Dictionary& configuration, std::int64_t reporterID) const {
        return once<bool>(
            [&](auto reply) { operations().setConfiguration(configuration, reporterID, std::move(reply)); });
    }
    std::optional<bool> start(std::int64_t reporterID) const {
        return once<bool>(
            [&](auto reply) { operations().startReportingSessionForID(reporterID, nullptr, std::move(reply)); });
    }
    std::optional<bool> stop(std::int64_t reporterID) const {
        return once<bool>([&](auto reply) { operations().stopReportingSessionForID(reporterID, std::move(reply)); });
    }
    std::optional<bool> destroy(std::int64_t reporterID) const {
        return once<bool>([&](auto reply) { operations().destroyReportingSession(reporterID, std::move(reply)); });
    }
    std::optional<Dictionary> validate(std::int64_t reporterID) const {
        return once<Dictionary>([&](auto reply) { operations().reporterID(reporterID, std::move(reply)); });
    }
    std::optional<std::vector<std::int64_t>> allReporters() const {
        return once<std::vector<std::int64_t>>([&](auto reply) { operations().getAllReporters(std::move(reply)); });
    }
    /// Whether it was answered once, without an error.
    bool send(const Dictionary& message, std::uint32_t category, std::uint16_t type, ReporterIDs reporterIDs) const {
        const auto answer = newAnswer<>();
        operations().sendMessage(message, category, type, std::move(reporterIDs), Answer<>::into(answer));
        queues.runUntilIdle();
        return answer->calls == 1 && !answer->error;
    }
    /// Created, typed and started.
    std::shared_ptr<VelaReportingSession> running(std::int64_t reporterID, std::uint16_t type = 1) const {
        create(reporterID);
        setServiceType(type, reporterID);
        start(reporterID);
        return session(reporterID);
    }

private:
    template <class Type, class Call>
    std::optional<Type> once(const Call& call) const {
        const auto answer = newAnswer<Type>();
        call(Answer<Type>::into(answer));
        queues.runUntilIdle();
        if (answer->calls != 1 || answer->error) {
            return std::nullopt;
        }
        return std::get<0>(*answer->values);
    }
};

/// Everything of the platform but the clock and the queues.
struct FakeFacilities {
    FakeFacilities() {
        processes.add({.pid = 7, .parent = 1, .commandName = "player", .startTimeTicks = 5});
        processes.add({.pid = 8, .parent = 1, .commandName = "recorder", .startTimeTicks = 6});
        beacon.setDiscovery(BeaconDiscovery::FindsBackends);
        probe.completeWhenStopped("file:///traces/1.data");
    }

    testing::FakeBeacon beacon;
    testing::FakeDeviceProperties device;
    testing::FakeFileSystem fileSystem;
    testing::FakeHwStats hwStats;
    testing::FakeJoule joule;
    testing::FakeJsonWriting json;
    testing::FakeMalady malady;
    testing::FakeNotifications notifications;
    testing::FakePreferences preferences;
    testing::FakeProcessInformation processes;
    testing::FakeSpoor spoor;
    testing::FakeTally tally;
    testing::FakeTelem telem;
    testing::FakeMetricsheet metricsheet;
    testing::FakeProbe probe;
    testing::FakeProcessControl processControl;
    testing::FakePropertyListReading propertyListReading;

    platform::Platform platformWith(platform::Clock& clock, platform::WorkQueues& queues) {
        return {beacon,      clock, device,         fileSystem,  hwStats,
                joule,       json,  malady,         metricsheet, notifications,
                preferences, probe, processControl, processes,   propertyListReading,
                spoor,       tally, telem,          queues};
    }
};

class ServiceTest : public ::testing::Test {
protected:
    /// Everything must be gone when the clients have left and what they began is done.
    void TearDown() override {
        for (const auto& connection : connections_) {
            connection->end();
        }
        queues_.advance(std::chrono::seconds(100));
        connections_.clear();
        fakes_.tally.dropAll(); // payloads that nobody built hold their session
        delegate_.reset();
        EXPECT_EQ(queues_.liveQueues(), 0U);
        EXPECT_EQ(queues_.pendingItems(), 0U);
        EXPECT_TRUE(fakes_.notifications.registrations().empty());
    }

    /// Made at the first use.
    VelaReportingServiceDelegate& service() {
        if (delegate_ == nullptr) {
            delegate_ = VelaReportingServiceDelegate::init({platform_});
        }
        return *delegate_;
    }
    /// A connection that is accepted, its registration still to run.
    Client accept(std::int32_t pid) {
        connections_.push_back(std::make_shared<testing::FakeIpcConnection>(pid));
        EXPECT_TRUE(service().shouldAcceptNewConnection(connections_.back()));
        return {connections_.back(), queues_};
    }
    /// A registered client. What that logged is forgotten.
    Client connect(std::int32_t pid) {
        Client client = accept(pid);
        queues_.runUntilIdle();
        log_.clear();
        return client;
    }
    /// Runs `body` on the reporting queue, and what that sets in motion.
    void onQueue(std::function<void()> body) {
        service().reportingQueue().post([body = std::move(body)] { body(); });
        queues_.runUntilIdle();
    }
    std::uint64_t activeSessionCount() {
        std::uint64_t count = 0;
        onQueue([&] { count = service().activeSessionCount(); });
        return count;
    }
    void setActiveSessionCount(std::uint64_t count) {
        onQueue([&] { service().setActiveSessionCount(count); });
    }
    void makeInternalBuild() { fakes_.device.setBoolean("InternalBuild", true); }

    /// A driver whose counter "Frames" goes on by 3 from each sampling to the next.
    void publishFrames() {
        platform::HwStatsChannel frames;
        frames.format = 1;
        frames.channelName = "Frames";
        frames.simpleValue = 3;
        testing::FakeHwStats::Driver driver;
        driver.channels = {frames};
        driver.delta = std::vector{frames};
        fakes_.hwStats.set("Haptics", "Stats", std::move(driver));
    }

    std::vector<CapturedLine> serviceLines() const { return log_.linesOf("velars"); }
    std::size_t linesSaying(const std::string& message) const {
        const auto lines = log_.lines();
        return static_cast<std::size_t>(
            std::count_if(lines.begin(), lines.end(), [&](const auto& line) { return line.message == message; }));
    }

    testing::CapturingLog log_;
    testing::ManualClock clock_;
    testing::ManualWorkQueues queues_{clock_};
    FakeFacilities fakes_;
    VelaReportingBuildType buildType_{fakes_.device};
    platform::Platform platform_ = fakes_.platformWith(clock_, queues_);
    std::shared_ptr<VelaReportingServiceDelegate> delegate_;
    std::vector<std::shared_ptr<testing::FakeIpcConnection>> connections_;
};

} // namespace vela
