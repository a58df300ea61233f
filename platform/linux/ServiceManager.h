// What a service manager hands to a program that it starts, and what the program tells it: a listening socket, its
// state and signs of life. Made from the environment before the first thread, whose variables it takes away, so that
// programs started from here see nothing of them. Thread-safe afterwards.
#pragma once

#include "platform/Clock.h"
#include "platform/Mutex.h"
#include "platform/Result.h"
#include "platform/linux/FileDescriptor.h"

#include <optional>
#include <string>
#include <string_view>

namespace vela::platform {

class ServiceManager {
public:
    ServiceManager();

    /// The socket that clients connect to, once. None where nobody handed one over; a failure for anything but one
    /// listening stream socket of the Unix family.
    Result<std::optional<FileDescriptor>> takeListeningSocket();

    /// Whether somebody is told what the operations below say. Without, they do nothing and it worked.
    bool isListening() const { return !address_.empty(); }

    /// Start-up has finished.
    Result<Done> tellReady() const { return tell("READY=1"); }
    /// The end has begun.
    Result<Done> tellStopping() const { return tell("STOPPING=1"); }
    /// A sign of life; more often than `watchdogLimit`.
    Result<Done> tellAlive() const { return tell("WATCHDOG=1"); }
    /// One line for a person; a line break in it becomes a space.
    Result<Done> tellStatus(std::string_view status) const;

    /// After how long without a sign of life the manager takes this process for dead; none where it does not look.
    std::optional<Nanoseconds> watchdogLimit() const { return watchdogLimit_; }

private:
    Result<Done> tell(std::string_view message) const;

    // Constant after construction.
    std::string address_; ///< a path, or "@" and an abstract name; empty for nobody
    std::optional<Nanoseconds> watchdogLimit_;

    Mutex mutex_;
    int handedOver_ VELA_GUARDED_BY(mutex_) = 0; ///< how many descriptors, from 3 on, that nobody took
};

} // namespace vela::platform
