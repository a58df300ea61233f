// Notifications with a 64-bit state as files (LinuxNotificationFiles.h), told by inotify. Thread-safe. One thread of
// its own, from the first registration on, which sleeps without limit while nothing is posted.
//
// However many posts come, each token has at most one call waiting in its queue:
//
//     idle -- post --> waiting -- queue --> called -- handler ends --> idle
//                                             \-- post --> called, posted again -- handler ends --> waiting
#pragma once

#include "platform/Mutex.h"
#include "platform/Notifications.h"
#include "platform/linux/LinuxNotificationWatch.h"

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <thread>

namespace vela::platform {

class LinuxNotifications final : public Notifications, private LinuxNotificationWatch::Listener {
public:
    /// `runtimeFolder` is `<runtime>`, an absolute path. Touches nothing before the first registration.
    explicit LinuxNotifications(const std::string& runtimeFolder);
    /// Cancels what is registered. Does not wait for a call that runs: whose handler uses this cancels it before, and
    /// lets its queue run empty.
    ~LinuxNotifications() override;
    LinuxNotifications(const LinuxNotifications&) = delete;
    LinuxNotifications& operator=(const LinuxNotifications&) = delete;

    /// The status is an error number of the system; EINVAL for a name that cannot be a file's. Makes the folder where
    /// it is missing; where that fails the registration does.
    NotificationRegistration registerForNotification(std::string_view name, WorkQueue& queue,
                                                     UniqueFunction<void(std::int32_t token)> handler) override;

    /// None where the name was never posted, and where its file does not hold a number of 64 bits.
    std::optional<std::uint64_t> state(std::int32_t token) const override;

    void cancel(std::int32_t token) override;

private:
    class Registration;

    void replaced(std::string_view name) override VELA_REQUIRES(mutex_);
    void overlooked() override VELA_REQUIRES(mutex_);
    void watchUntilEnd();

    const std::string folder_;
    mutable Mutex mutex_;
    LinuxNotificationWatch watch_; ///< guarded by the mutex but for `wait` and `wake`
    std::map<std::int32_t, std::shared_ptr<Registration>> registrations_ VELA_GUARDED_BY(mutex_); ///< as they came
    std::int32_t lastToken_ VELA_GUARDED_BY(mutex_) = 0;
    std::thread thread_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela::platform
