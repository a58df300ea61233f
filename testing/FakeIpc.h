// A client's connection without a transport: a test calls the exported object as the endpoint would, and ends the
// connection as it likes. Thread-safe; the service's handlers run on the thread that ends it, outside the lock.
#pragma once

#include "platform/Ipc.h"
#include "platform/Mutex.h"

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vela::testing {

class FakeIpcConnection final : public platform::IpcConnection {
public:
    explicit FakeIpcConnection(std::int32_t pid, std::string description = "FakeIpcConnection");
    ~FakeIpcConnection() override;
    FakeIpcConnection(const FakeIpcConnection&) = delete;
    FakeIpcConnection& operator=(const FakeIpcConnection&) = delete;

    // What a test arranges.
    /// Called at the start of every call with its name, outside the lock.
    void setObserver(std::function<void(std::string_view call)> observer);
    /// Nobody knows the peer's until it is set.
    void setPeerIdentity(std::optional<platform::Identity> identity);
    /// The peer's process is gone, and its identifier may be another one's.
    void loseProcess() { processIsLost_ = true; }

    // What a test does. Each handler that is not set is passed over.
    /// The exported object; null when there is none, and after the end.
    std::shared_ptr<platform::ReportingServiceProtocol> client() const;
    /// Calls the interruption handler.
    void interrupt();
    /// The orderly end of the stream: the invalidation handler, once, then exported object and handlers are let go.
    void end();
    /// A stream that cannot be read any further: an interruption, then the end.
    void breakStream() {
        interrupt();
        end();
    }

    // What a test looks at.
    bool resumed() const;
    /// "setExportedObject", "setInterruptionHandler", "setInvalidationHandler", "resume" in the order called.
    std::vector<std::string> calls() const;

    std::int32_t processIdentifier() const override { return pid_; }
    bool confirmProcess() const override { return !processIsLost_; }
    std::optional<platform::Identity> peerIdentity() const override;
    void setExportedObject(std::shared_ptr<platform::ReportingServiceProtocol> object) override;
    void setInterruptionHandler(platform::UniqueFunction<void()> handler) override;
    void setInvalidationHandler(platform::UniqueFunction<void()> handler) override;
    void resume() override;
    std::string description() const override { return description_; }

private:
    using Handler = std::shared_ptr<platform::UniqueFunction<void()>>;

    void note(std::string_view call);

    const std::int32_t pid_;
    const std::string description_;
    std::atomic<bool> processIsLost_ = false;
    mutable Mutex mutex_;
    std::function<void(std::string_view)> observer_ VELA_GUARDED_BY(mutex_);
    std::vector<std::string> calls_ VELA_GUARDED_BY(mutex_);
    std::optional<platform::Identity> identity_ VELA_GUARDED_BY(mutex_);
    std::shared_ptr<platform::ReportingServiceProtocol> object_ VELA_GUARDED_BY(mutex_);
    Handler interruptionHandler_ VELA_GUARDED_BY(mutex_);
    Handler invalidationHandler_ VELA_GUARDED_BY(mutex_);
    bool resumed_ VELA_GUARDED_BY(mutex_) = false;
};

} // namespace vela::testing
