#include "platform/linux/LinuxNotifications.h"

#include "platform/linux/LinuxNotificationFiles.h"
#include "platform/linux/ThreadAttributes.h"

#include <cerrno>
#include <pthread.h>
#include <utility>

namespace vela::platform {

/// Thread-safe. Outlives its token by the call that waits or runs.
class LinuxNotifications::Registration : public std::enable_shared_from_this<Registration> {
public:
    Registration(std::string name, std::int32_t token, WorkQueue& queue, UniqueFunction<void(std::int32_t)> handler)
        : name_(std::move(name)),
          token_(token),
          queue_(queue),
          handler_(std::move(handler)) {}

    const std::string& name() const { return name_; }

    void posted() {
        const MutexLock lock(mutex_);
        switch (delivery_) {
        case Delivery::Idle:
            enqueue();
            break;
        case Delivery::Called:
            delivery_ = Delivery::CalledAndPosted;
            break;
        case Delivery::Waiting:
        case Delivery::CalledAndPosted:
        case Delivery::Cancelled:
            break;
        }
    }

    void cancel() {
        const MutexLock lock(mutex_);
        delivery_ = Delivery::Cancelled;
    }

private:
    enum class Delivery : std::uint8_t { Idle, Waiting, Called, CalledAndPosted, Cancelled };

    void enqueue() VELA_REQUIRES(mutex_) {
        delivery_ = Delivery::Waiting;
        queue_.post([self = shared_from_this()] { self->call(); });
    }

    void call() {
        {
            const MutexLock lock(mutex_);
            if (delivery_ == Delivery::Cancelled) {
                return;
            }
            delivery_ = Delivery::Called;
        }
        handler_(token_);
        const MutexLock lock(mutex_);
        if (delivery_ == Delivery::CalledAndPosted) {
            enqueue();
        } else if (delivery_ == Delivery::Called) {
            delivery_ = Delivery::Idle;
        }
    }

    const std::string name_;
    const std::int32_t token_;
    WorkQueue& queue_;                           // used by items of its own, and while not cancelled
    UniqueFunction<void(std::int32_t)> handler_; // used by the one call that runs
    Mutex mutex_;
    Delivery delivery_ VELA_GUARDED_BY(mutex_) = Delivery::Idle;
};

LinuxNotifications::LinuxNotifications(const std::string& runtimeFolder)
    : folder_(notificationFolder(runtimeFolder)),
      watch_(folder_, *this) {}

LinuxNotifications::~LinuxNotifications() {
    std::thread thread;
    std::map<std::int32_t, std::shared_ptr<Registration>> registrations;
    {
        const MutexLock lock(mutex_);
        thread.swap(thread_);
        registrations.swap(registrations_);
    }
    for (const auto& [token, registration] : registrations) {
        registration->cancel();
    }
    if (thread.joinable()) {
        watch_.wake();
        thread.join();
    }
}

NotificationRegistration LinuxNotifications::registerForNotification(std::string_view name, WorkQueue& queue,
                                                                     UniqueFunction<void(std::int32_t token)> handler) {
    if (!isNotificationName(name)) {
        return {.status = EINVAL, .token = -1};
    }
    const MutexLock lock(mutex_);
    if (const int error = watch_.arm(); error != 0) {
        return {.status = error, .token = -1};
    }
    if (!thread_.joinable()) {
        const SignalsBlocked signalsBlocked;
        thread_ = std::thread([this] { watchUntilEnd(); });
    }
    const std::int32_t token = ++lastToken_;
    registrations_[token] = std::make_shared<Registration>(std::string(name), token, queue, std::move(handler));
    return {.status = 0, .token = token};
}

std::optional<std::uint64_t> LinuxNotifications::state(std::int32_t token) const {
    std::string name;
    {
        const MutexLock lock(mutex_);
        const auto found = registrations_.find(token);
        if (found == registrations_.end()) {
            return std::nullopt;
        }
        name = found->second->name();
    }
    return notificationState(folder_, name);
}

void LinuxNotifications::cancel(std::int32_t token) {
    std::shared_ptr<Registration> registration; // its handler goes outside the lock
    const MutexLock lock(mutex_);
    const auto found = registrations_.find(token);
    if (found != registrations_.end()) {
        registration = std::move(found->second);
        registrations_.erase(found);
        registration->cancel();
    }
}

void LinuxNotifications::replaced(std::string_view name) {
    for (const auto& [token, registration] : registrations_) {
        if (registration->name() == name) {
            registration->posted();
        }
    }
}

// Every file of a folder that took another's place was posted since. After too many events for the kernel any name may
// have been.
void LinuxNotifications::overlooked() {
    for (const auto& [token, registration] : registrations_) {
        if (access((folder_ + "/" + registration->name()).c_str(), F_OK) == 0) {
            registration->posted();
        }
    }
}

void LinuxNotifications::watchUntilEnd() {
    pthread_setname_np(pthread_self(), "notifications");
    while (watch_.wait()) {
        const MutexLock lock(mutex_);
        watch_.read();
    }
}

} // namespace vela::platform
