// A client instance whose surroundings note every step that it takes, in order.
#pragma once

#include "service/Service_test.h"
#include "session/SessionTraceCode.h"

namespace vela {

using Steps = std::vector<std::string>;

/// A message as a bridge or issue capture got it.
struct Handled {
    Dictionary message;
    std::uint32_t category = 0;
    std::uint32_t type = 0;

    friend bool operator==(const Handled&, const Handled&) = default;
};

/// Notes "tally 42".
struct RecordingBridge final : VelaReportingSessionEventHandler {
    RecordingBridge(std::string itsName, Steps& itsSteps, std::vector<Handled>& itsHandled)
        : name(std::move(itsName)),
          steps(itsSteps),
          handled(itsHandled) {}

    void handleEvent(const Dictionary& message, std::uint32_t category, std::uint32_t type,
                     const std::shared_ptr<VelaReportingSession>& session) override {
        steps.push_back(name + " " + std::to_string(session->reporterID()));
        handled.push_back({message, category, type});
    }

    const std::string name;
    Steps& steps;
    std::vector<Handled>& handled;
};

/// What a step that may take long adds to its note.
inline std::string blockingIn(const testing::ManualWorkQueues& queues) {
    return queues.blockingDepth() > 0 ? ", blocking" : "";
}

/// The service as one client sees it, with answers that a test sets.
struct RecordingDelegate final : VelaReportingServiceDelegateProtocol {
    RecordingDelegate(testing::ManualWorkQueues& itsQueues, Steps& itsSteps, std::vector<Handled>& itsHandled)
        : queues(itsQueues),
          queue(itsQueues.makeSerialQueue("com.orvex.vela.test", platform::QualityOfService::UserInteractive)),
          steps(itsSteps),
          handled(itsHandled) {}

    platform::SerialQueue& reportingQueue() const override { return *queue; }
    Sessions getAllActiveReportingSessions() const override {
        steps.emplace_back("active");
        return active;
    }
    std::shared_ptr<VelaReportingSession> findReportingSessionForID(std::int64_t reporterID) const override {
        steps.push_back("find " + std::to_string(reporterID));
        const auto found = std::find_if(others.begin(), others.end(), [reporterID](const auto& session) {
            return session->reporterID() == reporterID;
        });
        return found == others.end() ? nullptr : *found;
    }
    const Clients& getAllClients() const override { return clients; }
    void removeClient(const VelaReportingClientServerInstance& client) override {
        steps.push_back("remove " + std::to_string(client.processIdentifier()) +
                        (client.clientReportingSessions().empty() ? "" : " with its sessions"));
        clients.clear();
    }
    const Dictionary& getDefaults() const override { return defaults; }
    bool isReportingEnabled() const override { return enabled; }
    std::uint64_t activeSessionCount() const override { return count; }
    void setActiveSessionCount(std::uint64_t newCount) override {
        count = newCount;
        steps.push_back("count " + std::to_string(count));
    }
    VelaReportingDriverSnapShot getSnapShot() const override {
        steps.push_back("snapshot" + blockingIn(queues));
        return {{"Haptics-Stats", nullptr}};
    }
    void sendDriverLogsForSession(const std::shared_ptr<VelaReportingSession>& session) const override {
        steps.push_back("driver logs " + std::to_string(session->reporterID()) +
                        (session->driverSnapShot() ? "" : " without a snapshot") + blockingIn(queues));
    }
    std::optional<Dictionary> getFeaturesState() const override {
        steps.emplace_back("features");
        return features;
    }
    void listenForFeatureStateChanges() override {}
    void handleEventForSnag(const Dictionary& message, std::uint32_t category, std::uint32_t type,
                            const std::shared_ptr<VelaReportingSession>& session,
                            const std::optional<std::string>& processName) override {
        steps.push_back("snag " + std::to_string(session->reporterID()) + " of " + processName.value_or("nobody"));
        handled.push_back({message, category, type});
    }

    const testing::ManualWorkQueues& queues;
    const std::unique_ptr<platform::SerialQueue> queue;
    Steps& steps;
    std::vector<Handled>& handled;
    Sessions active;
    Sessions others; ///< of other clients
    Clients clients;
    Dictionary defaults;
    bool enabled = true;
    std::uint64_t count = 0;
    std::optional<Dictionary> features;
};

class RecordedInstanceTest : public ServiceTest {
protected:
    RecordedInstanceTest() {
        fakes_.spoor.setObserver([this](std::uint32_t code) {
            if (code == kTraceStart) {
                steps_.emplace_back("session starts");
            } else if (code == kTraceSend) {
                steps_.emplace_back("session sends");
            } else if (code == kTraceStop) {
                steps_.push_back("session stops" + blockingIn(queues_));
            }
        });
        client_.connection->setExportedObject(
            VelaReportingClientServerInstance::initWithPID(7, recordingDelegate_, context_, {}, client_.connection));
        connections_.push_back(client_.connection);
    }
    void TearDown() override {
        client_.connection->end();
        recordingDelegate_->active.clear();
        recordingDelegate_->others.clear();
        recordingDelegate_->clients.clear();
        queues_.advance(std::chrono::seconds(100));
        recordingDelegate_.reset();
        ServiceTest::TearDown();
    }
    std::shared_ptr<VelaReportingSession> sessionOfAnother(std::int64_t reporterID) {
        auto session = VelaReportingSession::initWithID(reporterID, {8}, context_->sessionPlatform);
        recordingDelegate_->others.push_back(session);
        return session;
    }
    /// The steps since the last time.
    Steps steps() { return std::exchange(steps_, {}); }

    Steps steps_;
    std::vector<Handled> handled_;
    std::shared_ptr<const VelaReportingServiceContext> context_ = std::make_shared<const VelaReportingServiceContext>(
        VelaReportingServicePlatform{platform_}, std::make_unique<RecordingBridge>("tally", steps_, handled_),
        std::make_unique<RecordingBridge>("joule", steps_, handled_),
        std::make_unique<RecordingBridge>("telem", steps_, handled_));
    std::shared_ptr<RecordingDelegate> recordingDelegate_ =
        std::make_shared<RecordingDelegate>(queues_, steps_, handled_);
    Client client_{std::make_shared<testing::FakeIpcConnection>(7), queues_};
};

} // namespace vela
