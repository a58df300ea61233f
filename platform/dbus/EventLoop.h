// What the endpoint's thread waits on: descriptors, and tokens that other threads ring. Thread-safe, but for `wait` and
// `takeRung`, which are the endpoint's thread's. Replies of connections that are gone may hold it for a while.
#pragma once

#include "platform/Clock.h"
#include "platform/Mutex.h"
#include "platform/Result.h"
#include "platform/linux/FileDescriptor.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <sys/epoll.h>
#include <vector>

namespace vela::platform::dbus {

class EventLoop {
public:
    static Result<std::shared_ptr<EventLoop>> create();

    /// `token` comes back with the events; kRungToken is taken. False with errno set when the system refuses.
    bool add(int descriptor, std::uint32_t events, std::uint64_t token);
    void modify(int descriptor, std::uint32_t events, std::uint64_t token);
    void remove(int descriptor);

    /// Wakes the loop and hands it `token`.
    void ring(std::uint64_t token);

    /// Waits for events, for ever without a timeout. Answers how many there are. Kernels before 5.11 wait for whole
    /// milliseconds, rounded up.
    std::size_t wait(std::span<epoll_event> events, std::optional<Nanoseconds> timeout);
    /// The tokens rung since the last time, after an event with kRungToken.
    std::vector<std::uint64_t> takeRung();

    static constexpr std::uint64_t kRungToken = 0;

private:
    EventLoop(FileDescriptor epoll, FileDescriptor bell) : epoll_(std::move(epoll)), bell_(std::move(bell)) {}

    // Constant after construction.
    FileDescriptor epoll_;
    FileDescriptor bell_; ///< eventfd

    Mutex mutex_;
    std::vector<std::uint64_t> rung_ VELA_GUARDED_BY(mutex_);
};

} // namespace vela::platform::dbus
