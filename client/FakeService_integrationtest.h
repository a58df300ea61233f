// A service for tests, in the test's process: a thread behind a listening socket that records the calls it gets and
// answers them as it is told. Thread-safe.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/dbus/Authentication.h"
#include "platform/dbus/MessageReader.h"
#include "platform/linux/FileDescriptor.h"

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace vela::testing {

struct RecordedCall {
    /// "createReportingSession 42", "sendMessage {"a":1} 1 3 [42]", "sendMessage {} 1 3 all"; without the stamps.
    std::string text;
    Dictionary dictionary; ///< with the stamps
    bool replyExpected = false;
    int connection = 0; ///< counts up from 1
};

class FakeService {
public:
    /// Listens at once.
    explicit FakeService(std::string path);
    ~FakeService();
    FakeService(const FakeService&) = delete;
    FakeService& operator=(const FakeService&) = delete;

    /// Ends as if killed: nothing more is read and all connections are cut. The recorded calls stay.
    void stop();
    void start();

    /// Ends all connections and goes on listening. Takes effect later.
    void cutConnections();

    void setAnswering(bool answering) { answering_ = answering; }
    /// Whether anything is read after the authentication.
    void setReading(bool reading);
    /// So many bytes at a time.
    void setReadBytes(std::size_t bytes) { readBytes_ = bytes; }
    /// Whether new connections are let in.
    void setRefusing(bool refusing) { refusing_ = refusing; }
    /// Every call is answered with com.orvex.audio.reporting.Code1.
    void setDisabled(bool disabled) { disabled_ = disabled; }
    /// Every call is answered with a return of this signature and no body.
    void setWrongReply(bool wrong) { wrongReply_ = wrong; }

    std::vector<RecordedCall> calls() const;
    std::vector<std::string> texts() const;
    /// Waits until there are so many; fails the test after half a minute.
    void waitForCalls(std::size_t count) const;
    int connections() const { return connections_; }
    void waitForConnections(int count) const;

private:
    struct Peer {
        platform::FileDescriptor socket;
        std::unique_ptr<platform::dbus::ServerAuthentication> authentication;
        bool authenticated = false;
        std::string input;
        int number = 0;
    };

    void run();
    void acceptPeer();
    /// False when it is to be cut.
    bool serve(Peer& peer);
    bool authenticate(Peer& peer);
    void handle(Peer& peer, std::string_view message);
    void answer(Peer& peer, const platform::dbus::MessageHeader& header);
    void wake() const;
    template <class Condition>
    void waitFor(const char* what, const Condition& condition) const;

    std::string path_;
    platform::FileDescriptor listener_;
    platform::FileDescriptor wakeup_;
    std::vector<Peer> peers_; // the thread's own
    std::atomic<bool> stopping_ = false;
    std::atomic<bool> cutting_ = false;
    std::atomic<bool> answering_ = true;
    std::atomic<bool> reading_ = true;
    std::atomic<bool> refusing_ = false;
    std::atomic<bool> disabled_ = false;
    std::atomic<bool> wrongReply_ = false;
    std::atomic<std::size_t> readBytes_ = 65536;
    std::atomic<int> connections_ = 0;
    mutable std::mutex mutex_;
    mutable std::condition_variable changed_;
    std::vector<RecordedCall> calls_; // guarded by mutex_
    std::thread thread_;
};

} // namespace vela::testing
