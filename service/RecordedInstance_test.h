// A client instance whose surroundings note every step that it takes, in order.
#pragma once

#include "service/Service_test.h"
#include "session/SessionTraceCode.h"

namespace vela {

using Steps = std::vector<std::string>;

/// Notes "tally 42".
struct RecordingBridge final : VelaReportingSessionEventHandler {
    RecordingBridge(std::string itsName, Steps& itsSteps) : name(std::move(itsName)), steps(itsSteps) {}

    void handleEvent(const Dictionary&, std::uint32_t, std::uint32_t,
                     const std::shared_ptr<VelaReportingSession>& session) override {
        steps.push_back(name + " " + std::to_string(session->reporterID()));
    }

    const std::string name;
    Steps& steps;
};

/// The service as one client sees it, with answers that a test sets.
struct RecordingDelegate final : VelaReportingServiceDelegateProtocol {
    RecordingDelegate(platform::WorkQueues& queues, Steps& itsSteps)
        : queue(queues.makeSerialQueue("com.orvex.vela.test", platform::QualityOfService::UserInteractive)),
          steps(itsSteps) {}

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
        steps.push_back("remove " + std::to_string(client.processIdentifier()));
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
        steps.emplace_back("snapshot");
        return {{"Haptics-Stats", nullptr}};
    }
    void sendDriverLogsForSession(const std::shared_ptr<VelaReportingSession>& session) const override {
        steps.push_back("driver logs " + std::to_string(session->reporterID()) +
                        (session->driverSnapShot() ? "" : " without a snapshot"));
    }
    std::optional<Dictionary> getFeaturesState() const override {
        steps.emplace_back("features");
        return features;
    }
    void listenForFeatureStateChanges() override {}
    void handleEventForSnag(const Dictionary&, std::uint32_t, std::uint32_t,
                            const std::shared_ptr<VelaReportingSession>& session,
                            const std::optional<std::string>& processName) override {
        steps.push_back("snag " + std::to_string(session->reporterID()) + " of " + processName.value_or("nobody"));
    }

    const std::unique_ptr<platform::SerialQueue> queue;
    Steps& steps;
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
                steps_.emplace_back("session stops");
            }
        });
        client_.connection->setExportedObject(
            VelaReportingClientServerInstance::initWithPID(7, recordingDelegate_, context_));
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
    std::shared_ptr<const VelaReportingServiceContext> context_ = std::make_shared<const VelaReportingServiceContext>(
        VelaReportingServicePlatform{platform_}, std::make_unique<RecordingBridge>("tally", steps_),
        std::make_unique<RecordingBridge>("joule", steps_), std::make_unique<RecordingBridge>("telem", steps_));
    std::shared_ptr<RecordingDelegate> recordingDelegate_ = std::make_shared<RecordingDelegate>(queues_, steps_);
    Client client_{std::make_shared<testing::FakeIpcConnection>(7), queues_};
};

} // namespace vela
