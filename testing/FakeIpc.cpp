#include "testing/FakeIpc.h"

#include <utility>

namespace vela::testing {

FakeIpcConnection::FakeIpcConnection(std::int32_t pid, std::string description)
    : pid_(pid),
      description_(std::move(description)) {}

FakeIpcConnection::~FakeIpcConnection() = default;

void FakeIpcConnection::setObserver(std::function<void(std::string_view)> observer) {
    const MutexLock lock(mutex_);
    observer_ = std::move(observer);
}

void FakeIpcConnection::setPeerIdentity(std::optional<platform::Identity> identity) {
    const MutexLock lock(mutex_);
    identity_ = std::move(identity);
}

std::optional<platform::Identity> FakeIpcConnection::peerIdentity() const {
    const MutexLock lock(mutex_);
    return identity_;
}

std::shared_ptr<platform::ReportingServiceProtocol> FakeIpcConnection::client() const {
    const MutexLock lock(mutex_);
    return object_;
}

void FakeIpcConnection::interrupt() {
    Handler handler;
    {
        const MutexLock lock(mutex_);
        handler = interruptionHandler_;
    }
    if (handler != nullptr) {
        (*handler)();
    }
}

void FakeIpcConnection::end() {
    Handler handler;
    Handler interruption;
    {
        const MutexLock lock(mutex_);
        handler = std::move(invalidationHandler_);
        interruption = std::move(interruptionHandler_);
    }
    if (handler != nullptr) {
        (*handler)();
    }
    std::shared_ptr<platform::ReportingServiceProtocol> object; // let go outside the lock
    const MutexLock lock(mutex_);
    std::swap(object, object_);
}

bool FakeIpcConnection::resumed() const {
    const MutexLock lock(mutex_);
    return resumed_;
}

std::vector<std::string> FakeIpcConnection::calls() const {
    const MutexLock lock(mutex_);
    return calls_;
}

void FakeIpcConnection::setExportedObject(std::shared_ptr<platform::ReportingServiceProtocol> object) {
    note("setExportedObject");
    const MutexLock lock(mutex_);
    std::swap(object_, object);
}

void FakeIpcConnection::setInterruptionHandler(platform::UniqueFunction<void()> handler) {
    note("setInterruptionHandler");
    const MutexLock lock(mutex_);
    interruptionHandler_ = std::make_shared<platform::UniqueFunction<void()>>(std::move(handler));
}

void FakeIpcConnection::setInvalidationHandler(platform::UniqueFunction<void()> handler) {
    note("setInvalidationHandler");
    const MutexLock lock(mutex_);
    invalidationHandler_ = std::make_shared<platform::UniqueFunction<void()>>(std::move(handler));
}

void FakeIpcConnection::resume() {
    note("resume");
    const MutexLock lock(mutex_);
    resumed_ = true;
}

void FakeIpcConnection::note(std::string_view call) {
    std::function<void(std::string_view)> observer;
    {
        const MutexLock lock(mutex_);
        calls_.emplace_back(call);
        observer = observer_;
    }
    if (observer) {
        observer(call);
    }
}

} // namespace vela::testing
