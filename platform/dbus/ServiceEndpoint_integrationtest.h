// What the endpoint's tests share: a service that records and answers as told, an endpoint on a thread of its own, and
// a client that sends bytes as they are.
#pragma once

#include "platform/dbus/MessageBytes_test.h"
#include "platform/dbus/RawClient_integrationtest.h"
#include "platform/dbus/ServiceEndpoint.h"
#include "testing/TemporaryFolder.h"

#include <algorithm>
#include <condition_variable>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <mutex>
#include <set>
#include <thread>

namespace vela::platform::dbus {

/// Facts that other threads add and the test waits for. Thread-safe.
class Journal {
public:
    void add(std::string line) {
        const std::lock_guard lock(mutex_);
        lines_.push_back(std::move(line));
        changed_.notify_all();
    }
    std::vector<std::string> lines() const {
        const std::lock_guard lock(mutex_);
        return lines_;
    }
    /// The lines once there are `count`.
    std::vector<std::string> waitFor(std::size_t count) const {
        std::unique_lock lock(mutex_);
        EXPECT_TRUE(changed_.wait_for(lock, kPatience, [&] { return lines_.size() >= count; }));
        return lines_;
    }
    std::size_t count(const std::string& line) const {
        const std::lock_guard lock(mutex_);
        return static_cast<std::size_t>(std::count(lines_.begin(), lines_.end(), line));
    }

private:
    mutable std::mutex mutex_;
    mutable std::condition_variable changed_;
    std::vector<std::string> lines_;
};

/// Answers at once, or keeps the replies. Thread-safe.
class RecordingService : public ReportingServiceProtocol {
public:
    explicit RecordingService(Journal& journal) : journal_(journal) {}

    void createReportingSession(std::int64_t id, IpcReply<bool> reply) override {
        finish("create " + std::to_string(id), std::move(reply));
    }
    void setServiceType(std::uint16_t type, std::int64_t id, IpcReply<bool> reply) override {
        finish("type " + std::to_string(type) + ' ' + std::to_string(id), std::move(reply));
    }
    void getServiceNameForReporterID(std::int64_t id, IpcReply<std::uint16_t> reply) override {
        journal_.add("name " + std::to_string(id));
        reply({}, 65535);
    }
    void setConfiguration(Dictionary configuration, std::int64_t id, IpcReply<bool> reply) override {
        received(std::move(configuration));
        finish("configure " + std::to_string(id), std::move(reply));
    }
    void startReportingSessionForID(std::int64_t id, std::shared_ptr<void> underWay, IpcReply<bool> reply) override {
        {
            const std::lock_guard lock(mutex_);
            if (keepTokens_) {
                tokens_.push_back(std::move(underWay));
            }
        }
        underWay.reset();
        finish("start " + std::to_string(id), std::move(reply));
    }
    void sendMessage(Dictionary message, std::uint32_t category, std::uint16_t type,
                     std::optional<std::vector<std::int64_t>> ids, IpcReply<> reply) override {
        received(std::move(message));
        std::string line = "send " + std::to_string(category) + " " + std::to_string(type);
        if (!ids) {
            line += " to all";
        } else {
            for (const std::int64_t id : *ids) {
                line += ' ';
                line += std::to_string(id);
            }
        }
        std::optional<IpcError> error;
        {
            const std::lock_guard lock(mutex_);
            error = error_;
        }
        answerOrKeep(std::move(line), [reply = std::move(reply), error]() mutable { reply(error); });
    }
    void stopReportingSessionForID(std::int64_t id, IpcReply<bool> reply) override {
        finish("stop " + std::to_string(id), std::move(reply));
    }
    void destroyReportingSession(std::int64_t id, IpcReply<bool> reply) override {
        finish("destroy " + std::to_string(id), std::move(reply));
    }
    void reporterID(std::int64_t id, IpcReply<Dictionary> valid) override {
        journal_.add("reporter " + std::to_string(id));
        valid({}, Dictionary{{"reporterID", id}, {"serviceType", 65535}});
    }
    void getAllReporters(IpcReply<std::vector<std::int64_t>> reply) override {
        journal_.add("all");
        reply({}, {1, -2});
    }
    void killService(IpcReply<bool> reply) override { finish("kill", std::move(reply)); }

    void keepReplies() { setting(keepReplies_); }
    void keepTokens() { setting(keepTokens_); }
    /// What sendMessage answers from now on.
    void fail(IpcError error) {
        const std::lock_guard lock(mutex_);
        error_ = std::move(error);
    }

    /// The kept replies, in the order of their calls; each is called by calling it.
    std::vector<UniqueFunction<void()>> takeReplies() {
        const std::lock_guard lock(mutex_);
        return std::exchange(kept_, {});
    }
    void dropTokens() {
        const std::lock_guard lock(mutex_);
        tokens_.clear();
    }
    std::vector<Dictionary> messages() const {
        const std::lock_guard lock(mutex_);
        return messages_;
    }

private:
    void setting(bool& which) {
        const std::lock_guard lock(mutex_);
        which = true;
    }
    void received(Dictionary message) {
        const std::lock_guard lock(mutex_);
        messages_.push_back(std::move(message));
    }
    void finish(std::string line, IpcReply<bool> reply) {
        answerOrKeep(std::move(line), [reply = std::move(reply)]() mutable { reply({}, true); });
    }
    /// Journals before it answers and after it keeps, so that whoever waits for the line or the answer finds both.
    void answerOrKeep(std::string line, UniqueFunction<void()> answer) {
        {
            const std::lock_guard lock(mutex_);
            if (keepReplies_) {
                kept_.push_back(std::move(answer));
                answer = nullptr;
            }
        }
        journal_.add(std::move(line));
        if (answer) {
            answer();
        }
    }

    Journal& journal_;
    mutable std::mutex mutex_;
    bool keepReplies_ = false;
    bool keepTokens_ = false;
    std::optional<IpcError> error_;
    std::vector<UniqueFunction<void()>> kept_;
    std::vector<std::shared_ptr<void>> tokens_;
    std::vector<Dictionary> messages_;
};

/// Takes every connection, unless told otherwise, and journals what becomes of it.
class TestDelegate : public IpcListenerDelegate {
public:
    TestDelegate(Journal& journal, std::shared_ptr<ReportingServiceProtocol> service)
        : journal_(journal),
          service_(std::move(service)) {}

    bool shouldAcceptNewConnection(const std::shared_ptr<IpcConnection>& connection) override {
        if (refusing_) {
            journal_.add("refused");
            return false;
        }
        connection->setExportedObject(service_);
        connection->setInterruptionHandler([this] { journal_.add("interrupted"); });
        connection->setInvalidationHandler([this] { journal_.add("invalidated"); });
        {
            const std::lock_guard lock(mutex_);
            last_ = connection;
        }
        journal_.add("connected");
        if (!holding_) {
            connection->resume();
        }
        return true;
    }
    void refuse() { refusing_ = true; }
    /// Connections are not resumed.
    void hold() { holding_ = true; }
    std::shared_ptr<IpcConnection> lastConnection() const {
        const std::lock_guard lock(mutex_);
        return last_;
    }

private:
    Journal& journal_;
    const std::shared_ptr<ReportingServiceProtocol> service_;
    std::atomic<bool> refusing_{false};
    std::atomic<bool> holding_{false};
    mutable std::mutex mutex_;
    std::shared_ptr<IpcConnection> last_;
};

/// An endpoint that runs on a thread of its own until the end of its scope.
class RunningEndpoint {
public:
    explicit RunningEndpoint(DbusServiceOptions options = {}) : RunningEndpoint(std::move(options), nullptr) {}
    RunningEndpoint(DbusServiceOptions options, const ServiceInspection* inspection) {
        options.socketPath = path();
        options.endsOnSignals = false;
        auto opened = DbusServiceEndpoint::open(std::move(options));
        EXPECT_TRUE(opened) << (opened ? "" : opened.failure().description);
        endpoint_ = *std::move(opened);
        endpoint_->setDelegate(delegate);
        if (inspection != nullptr) {
            endpoint_->setInspection(*inspection);
        }
        thread_ = std::thread([this] { EXPECT_TRUE(endpoint_->resume()); });
    }
    ~RunningEndpoint() { stop(); }
    RunningEndpoint(const RunningEndpoint&) = delete;
    RunningEndpoint& operator=(const RunningEndpoint&) = delete;

    void stop() {
        if (thread_.joinable()) {
            endpoint_->stop();
            thread_.join();
        }
    }
    std::string path() const { return folder_ / "socket"; }
    DbusServiceEndpoint& operator*() { return *endpoint_; }
    RawClient client() const {
        RawClient result(path());
        result.authenticate();
        return result;
    }

    Journal journal;
    const std::shared_ptr<RecordingService> service = std::make_shared<RecordingService>(journal);
    TestDelegate delegate{journal, service};

private:
    const vela::testing::TemporaryFolder folder_;
    std::unique_ptr<DbusServiceEndpoint> endpoint_;
    std::thread thread_;
};

/// Whether `turns` stands still for a while, sooner or later. A loop that spins or looks at the clock never does.
inline bool becomesQuiet(const std::atomic<int>& turns) {
    for (int attempt = 0; attempt < 50; ++attempt) {
        const int before = turns;
        std::this_thread::sleep_for(std::chrono::milliseconds(200));
        if (turns == before) {
            return true;
        }
    }
    return false;
}

// Calls, whose replies are known by their serials.

inline std::string simpleCall(std::string_view member, std::int64_t id, std::uint32_t serial = 7,
                              Order order = Order::Little, std::uint8_t flags = 0) {
    return callOf(member, "x", Bytes(order).u64(static_cast<std::uint64_t>(id)), serial, flags);
}

inline std::string sendMessageCall(const Dictionary& message, const std::optional<std::vector<std::int64_t>>& ids,
                                   std::uint32_t serial = 7, bool replyExpected = true) {
    std::string buffer;
    MessageWriter writer(buffer);
    writer.beginCall({.serial = serial,
                      .path = kObjectPath,
                      .interface = kReportingInterface,
                      .member = kSendMessage,
                      .signature = "a{sv}uqaax",
                      .replyExpected = replyExpected});
    writer.dictionary(message);
    writer.uint32(3);
    writer.uint16(4);
    writer.optionalInt64s(ids);
    EXPECT_TRUE(writer.finish());
    return buffer;
}

} // namespace vela::platform::dbus
