#include "platform/linux/LinuxNotificationWatch.h"

#include "platform/linux/LinuxFileSystem.h"

#include <array>
#include <cerrno>
#include <climits>
#include <cstddef>
#include <cstring>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/inotify.h>
#include <utility>

namespace vela::platform {

namespace {

constexpr std::uint32_t kFolderPermissions = 0755;
constexpr std::uint32_t kFolderEvents = IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
constexpr std::uint32_t kAboveEvents =
    IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
constexpr std::uint32_t kGone = IN_DELETE_SELF | IN_MOVE_SELF | IN_IGNORED | IN_UNMOUNT;

} // namespace

LinuxNotificationWatch::LinuxNotificationWatch(std::string folder, Listener& listener)
    : folder_(std::move(folder)),
      listener_(listener),
      events_(inotify_init1(IN_CLOEXEC | IN_NONBLOCK)),
      end_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

int LinuxNotificationWatch::arm() {
    if (!events_ || !end_) {
        return EMFILE;
    }
    const Result<Done> made = LinuxFileSystem().createDirectories(folder_, kFolderPermissions);
    // A folder that comes between the look at it and the watch above it would not be told: looked at again.
    int error = watchFolder();
    while (watchAbove()) {
        error = watchFolder();
    }
    return error != 0 && !made && made.failure().code != 0 ? made.failure().code : error;
}

bool LinuxNotificationWatch::wait() const {
    std::array<pollfd, 2> polled{{{events_.get(), POLLIN, 0}, {end_.get(), POLLIN, 0}}};
    while (poll(polled.data(), polled.size(), -1) < 0 && errno == EINTR) {
    }
    return polled[1].revents == 0;
}

void LinuxNotificationWatch::read() {
    constexpr std::size_t kLongestEvent = sizeof(inotify_event) + NAME_MAX + 1;
    alignas(inotify_event) std::array<char, 64 * kLongestEvent> buffer;
    const ssize_t size = ::read(events_.get(), buffer.data(), buffer.size());
    for (ssize_t at = 0; at < size;) {
        const char* const place = buffer.data() + at;
        inotify_event event;
        std::memcpy(&event, place, sizeof(event));
        take(event, event.len == 0 ? std::string_view() : std::string_view(place + sizeof(event)));
        at += static_cast<ssize_t>(sizeof(event) + event.len);
    }
}

void LinuxNotificationWatch::wake() const {
    static_cast<void>(eventfd_write(end_.get(), 1)); // fails only when it was called before
}

void LinuxNotificationWatch::take(const inotify_event& event, std::string_view name) {
    if ((event.mask & IN_Q_OVERFLOW) != 0) {
        arm();
        listener_.overlooked();
    } else if (event.wd == folderWatch_ && (event.mask & kGone) != 0) {
        inotify_rm_watch(events_.get(), folderWatch_); // a folder that was only moved is watched still
        folderWatch_ = -1;
        arm();
    } else if (event.wd == folderWatch_) {
        listener_.replaced(name);
    } else if (event.wd == aboveWatch_ && ((event.mask & kGone) != 0 || name == awaited_)) {
        arm();
    }
}

int LinuxNotificationWatch::addWatch(const std::string& path, std::uint32_t events) const {
    return inotify_add_watch(events_.get(), path.c_str(), events);
}

// 0 or an error number. The same folder has the same number as before.
int LinuxNotificationWatch::watchFolder() {
    const int watch = addWatch(folder_, kFolderEvents);
    const int error = watch < 0 ? errno : 0;
    const int before = std::exchange(folderWatch_, watch);
    if (before >= 0 && before != watch) {
        inotify_rm_watch(events_.get(), before);
    }
    if (watch >= 0 && before != watch && std::exchange(wasWatched_, true)) {
        listener_.overlooked();
    }
    return error;
}

// Watches the nearest folder above ours that is there. Whether what it waits for in it has come by then.
bool LinuxNotificationWatch::watchAbove() {
    const int before = aboveWatch_;
    std::string below = folder_;
    do {
        const std::size_t slash = below.rfind('/');
        awaited_ = below.substr(slash + 1);
        below = below.substr(0, slash);
        aboveWatch_ = addWatch(below.empty() ? "/" : below, kAboveEvents);
    } while (aboveWatch_ < 0 && !below.empty());
    if (before >= 0 && before != aboveWatch_) {
        inotify_rm_watch(events_.get(), before);
    }
    return aboveWatch_ >= 0 && folderWatch_ < 0 && access((below + "/" + awaited_).c_str(), F_OK) == 0 &&
           aboveWatch_ != before;
}

} // namespace vela::platform
