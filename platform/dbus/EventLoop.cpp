#include "platform/dbus/EventLoop.h"

#include <cerrno>
#include <chrono>
#include <sys/eventfd.h>
#include <utility>

namespace vela::platform::dbus {

Result<std::shared_ptr<EventLoop>> EventLoop::create() {
    FileDescriptor epoll(epoll_create1(EPOLL_CLOEXEC));
    if (!epoll) {
        return Failure{errno, "cannot create the event loop"};
    }
    FileDescriptor bell(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    if (!bell) {
        return Failure{errno, "cannot create the event loop's wake-up"};
    }
    std::shared_ptr<EventLoop> loop(new EventLoop(std::move(epoll), std::move(bell)));
    if (!loop->add(loop->bell_.get(), EPOLLIN, kRungToken)) {
        return Failure{errno, "cannot watch the event loop's wake-up"};
    }
    return loop;
}

bool EventLoop::add(int descriptor, std::uint32_t events, std::uint64_t token) {
    epoll_event event{};
    event.events = events;
    event.data.u64 = token;
    return epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, descriptor, &event) == 0;
}

void EventLoop::modify(int descriptor, std::uint32_t events, std::uint64_t token) {
    epoll_event event{};
    event.events = events;
    event.data.u64 = token;
    epoll_ctl(epoll_.get(), EPOLL_CTL_MOD, descriptor, &event);
}

void EventLoop::remove(int descriptor) { epoll_ctl(epoll_.get(), EPOLL_CTL_DEL, descriptor, nullptr); }

void EventLoop::ring(std::uint64_t token) {
    const MutexLock lock(mutex_);
    rung_.push_back(token);
    if (rung_.size() == 1) {
        constexpr std::uint64_t kOne = 1;
        [[maybe_unused]] const ssize_t written = write(bell_.get(), &kOne, sizeof(kOne));
    }
}

std::size_t EventLoop::wait(std::span<epoll_event> events, std::optional<Nanoseconds> timeout) {
    const int room = static_cast<int>(events.size());
    int count = -1;
    if (!timeout || *timeout == Nanoseconds::zero()) {
        count = epoll_wait(epoll_.get(), events.data(), room, timeout ? 0 : -1);
    } else {
        const auto seconds = std::chrono::floor<std::chrono::seconds>(*timeout);
        const timespec time{seconds.count(), (*timeout - seconds).count()};
        count = epoll_pwait2(epoll_.get(), events.data(), room, &time, nullptr);
        if (count < 0 && (errno == ENOSYS || errno == EPERM)) { // an old kernel, or a sandbox's filter
            const auto milliseconds = std::chrono::ceil<std::chrono::milliseconds>(*timeout);
            count = epoll_wait(epoll_.get(), events.data(), room, static_cast<int>(milliseconds.count()));
        }
    }
    return count < 0 ? 0 : static_cast<std::size_t>(count);
}

std::vector<std::uint64_t> EventLoop::takeRung() {
    const MutexLock lock(mutex_);
    std::uint64_t count = 0;
    [[maybe_unused]] const ssize_t got = read(bell_.get(), &count, sizeof(count));
    return std::exchange(rung_, {});
}

} // namespace vela::platform::dbus
