// What the tests of this folder share: a session on fakes, whose time and queues stand still until a test moves them.
#pragma once

#include "common/VelaReportingUtility.h"
#include "common/values/TextualForm.h"
#include "session/VelaReportingSession.h"
#include "testing/CapturingLog.h"
#include "testing/FakeBeacon.h"
#include "testing/FakeDeviceProperties.h"
#include "testing/FakeFileSystem.h"
#include "testing/FakeJsonWriting.h"
#include "testing/FakeSpoor.h"
#include "testing/ManualClock.h"
#include "testing/ManualWorkQueues.h"

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <iterator>
#include <memory>
#include <optional>
#include <ostream>
#include <string>
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

/// Lines of the session's own log and of its real-time path.
inline CapturedLine sessionLine(LogLevel level, std::string message) {
    return {level, "velarr", "VelaReportingSession", std::move(message)};
}
inline CapturedLine beaconLine(LogLevel level, std::string message) {
    return {level, "velari", "VelaReportingSession", std::move(message)};
}

inline std::vector<std::string> keysOf(const Dictionary& dictionary) {
    std::vector<std::string> keys;
    for (const auto& entry : dictionary) {
        keys.emplace_back(entry.key.text());
    }
    return keys;
}

/// A message's key in the list and the message itself, in textual form: "Generic_Start_1 {a = 1;}".
inline std::vector<std::string> recordedBy(VelaReportingSessionMessageList& list) {
    const MutexLock lock(list.mutex());
    std::vector<std::string> messages;
    for (const StoredMessage& stored : list.messages()) {
        messages.push_back(list.keyOf(stored) + " " + textualForm(Value(stored.message)));
    }
    return messages;
}
inline std::vector<std::string> recordedKeysOf(VelaReportingSessionMessageList& list) {
    const MutexLock lock(list.mutex());
    std::vector<std::string> keys;
    for (const StoredMessage& stored : list.messages()) {
        keys.push_back(list.keyOf(stored));
    }
    return keys;
}
inline bool listExists(VelaReportingSession& session) {
    VelaReportingSessionMessageList& list = session.nestedAggregatedPayloadData();
    const MutexLock lock(list.mutex());
    return list.exists();
}
inline std::optional<std::uint32_t> countOf(VelaReportingSession& session, const std::string& identifier) {
    VelaReportingSessionMessageList& list = session.nestedAggregatedPayloadData();
    const MutexLock lock(list.mutex());
    return list.messageIdentifierCount(identifier);
}

/// The analytics bridge: keeps what it was handed, and how many messages the session had recorded then.
class RecordingAnalytics final : public VelaReportingSessionEventHandler {
public:
    struct Event {
        Dictionary message;
        std::uint32_t category;
        std::uint32_t type;
        const VelaReportingSession* session;
        std::size_t recordedBefore;
    };
    std::vector<Event> events;

    void handleEvent(const Dictionary& message, std::uint32_t category, std::uint32_t type,
                     const std::shared_ptr<VelaReportingSession>& session) override {
        events.push_back(
            {message, category, type, session.get(), recordedKeysOf(session->nestedAggregatedPayloadData()).size()});
    }
};

class SessionTest : public ::testing::Test {
protected:
    /// Every session must be gone when its owner has let it go and its work is done.
    void TearDown() override {
        session_.reset();
        queues_.advance(std::chrono::seconds(100));
        EXPECT_EQ(queues_.liveQueues(), 0U);
        EXPECT_EQ(queues_.pendingItems(), 0U);
    }

    /// Made at the first use: reporter 42 of process 7, with Beacon.
    VelaReportingSession& session() {
        if (session_ == nullptr) {
            session_ = makeSession(42);
            session_->setBeaconReportingEnabled(true);
        }
        return *session_;
    }
    std::shared_ptr<VelaReportingSession> makeSession(std::int64_t reporterID) {
        return VelaReportingSession::initWithID(reporterID, {7, 1}, platform_, client_);
    }
    void release() { session_.reset(); }

    /// Started, with back ends; what that logged and told Beacon is forgotten.
    VelaReportingSession& runningSession() {
        beacon_.setDiscovery(BeaconDiscovery::FindsBackends);
        session().start();
        queues_.runUntilIdle();
        forget();
        return session();
    }
    void forget() {
        log_.clear();
        spoor_.clear();
        beacon_.clearCalls();
    }
    void send(const Dictionary& message, std::uint32_t category = 1, std::uint16_t type = 1) {
        session().sendMessage(message, category, type, false, {});
    }
    std::vector<std::string> recorded() { return recordedBy(session().nestedAggregatedPayloadData()); }
    std::vector<std::string> recordedKeys() { return recordedKeysOf(session().nestedAggregatedPayloadData()); }

    /// Payloads of the messages that were sent through Beacon sessions.
    std::vector<Dictionary> sentPayloads() const {
        std::vector<Dictionary> payloads;
        for (const auto& call : beacon_.callsOf(BeaconOperation::Send)) {
            payloads.push_back(call.payload);
        }
        return payloads;
    }
    /// Lines with this message, whatever their level and category.
    std::size_t linesSaying(const std::string& message) const {
        const auto lines = log_.lines();
        return static_cast<std::size_t>(
            std::count_if(lines.begin(), lines.end(), [&](const auto& line) { return line.message == message; }));
    }
    void makeInternalBuild() { device_.setBoolean("InternalBuild", true); }
    /// A start that plays at one volume, and a stop ten seconds on: one volume message. Of another volume it repeats
    /// no message.
    void sendOnePlayback(double volume = 0.5) {
        send({{"session_output_running", true}, {"NexoSessionVolume", volume}, {"velareporting_timestamp", 1000.0}}, 4,
             1);
        send({{"session_output_running", false}, {"playback", volume}, {"velareporting_timestamp", 1010.0}}, 4, 2);
    }

    testing::CapturingLog log_;
    testing::ManualClock clock_;
    testing::ManualWorkQueues queues_{clock_};
    testing::FakeBeacon beacon_;
    testing::FakeSpoor spoor_;
    testing::FakeFileSystem fileSystem_;
    testing::FakeJsonWriting json_;
    testing::FakeDeviceProperties device_;
    RecordingAnalytics analytics_;
    VelaReportingBuildType buildType_{device_};
    VelaReportingSessionPlatform platform_{beacon_, clock_, fileSystem_, json_, spoor_, queues_, analytics_, ""};
    std::optional<platform::Identity> client_;

private:
    std::shared_ptr<VelaReportingSession> session_;
};

} // namespace vela
