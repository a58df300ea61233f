#include "reporters/pipewire/SocketWatch.h"

#include <array>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <sys/inotify.h>
#include <unistd.h>

namespace vela::reporter {

namespace {

std::string environmentText(const char* name) {
    const char* const value = std::getenv(name); // NOLINT(concurrency-mt-unsafe): nobody changes the environment
    return value == nullptr ? std::string() : std::string(value);
}

} // namespace

std::string socketPathOf(const std::string& remote) {
    std::string name = remote.empty() ? environmentText("PIPEWIRE_REMOTE") : remote;
    if (name.empty()) {
        name = "pipewire-0";
    }
    if (name.starts_with('/')) {
        return name;
    }
    for (const char* const variable : {"PIPEWIRE_RUNTIME_DIR", "XDG_RUNTIME_DIR", "USERPROFILE"}) {
        if (std::string folder = environmentText(variable); !folder.empty()) {
            return folder.append("/").append(name);
        }
    }
    return {};
}

SocketWatch::SocketWatch(const std::string& socketPath) {
    const std::size_t slash = socketPath.rfind('/');
    if (slash == std::string::npos) {
        return;
    }
    name_ = socketPath.substr(slash + 1);
    descriptor_ = inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
    const std::string folder = socketPath.substr(0, slash + 1);
    if (descriptor_ >= 0 && inotify_add_watch(descriptor_, folder.c_str(), IN_CREATE | IN_MOVED_TO | IN_ATTRIB) < 0) {
        close(descriptor_);
        descriptor_ = -1;
    }
}

SocketWatch::~SocketWatch() {
    if (descriptor_ >= 0) {
        close(descriptor_);
    }
}

bool SocketWatch::hasCome() {
    constexpr std::size_t kRoom = 4096;
    alignas(inotify_event) std::array<char, kRoom> events{};
    bool come = false;
    for (ssize_t size = 0; (size = read(descriptor_, events.data(), events.size())) > 0;) {
        for (std::size_t at = 0; at < static_cast<std::size_t>(size);) {
            inotify_event event{};
            std::memcpy(&event, events.data() + at, sizeof(event));
            come = come || (event.len > 0 && name_ == events.data() + at + sizeof(event));
            at += sizeof(event) + event.len;
        }
    }
    return come;
}

} // namespace vela::reporter
