#include "platform/linux/ThreadAttributes.h"

#include <algorithm>
#include <pthread.h>
#include <sys/resource.h>
#include <system_error>
#include <thread>
#include <unistd.h>

namespace vela::platform {

namespace {

constexpr int kNicest = 19;

/// Answers whether the system allowed it.
bool setThreadNice(int nice) {
    constexpr id_t kCallingThread = 0; // in Linux; not its process
    return setpriority(PRIO_PROCESS, kCallingThread, nice) == 0;
}

} // namespace

ThreadName threadNameFor(std::string_view queueName) {
    ThreadName name{};
    const std::size_t room = name.size() - 1;
    std::string_view rest = queueName;
    while (rest.size() > room) {
        const std::size_t dot = rest.find('.');
        if (dot == std::string_view::npos || dot + 1 == rest.size()) {
            rest.remove_prefix(rest.size() - room);
            break;
        }
        rest.remove_prefix(dot + 1);
    }
    std::copy(rest.begin(), rest.end(), name.begin());
    return name;
}

int threadNice() { return getpriority(PRIO_PROCESS, 0); }

int niceFor(QualityOfService quality, int base) {
    constexpr std::array<int, 4> kNicer = {0, 1, 5, 10};
    return std::min(base + kNicer[static_cast<std::size_t>(quality)], kNicest);
}

bool niceCanBeTakenBack() {
    const int base = threadNice();
    if (base >= kNicest) {
        return false;
    }
    bool taken = false;
    try {
        std::thread trial([base, &taken] { taken = setThreadNice(base + 1) && setThreadNice(base); });
        trial.join();
    } catch (const std::system_error&) {
        return false;
    }
    return taken;
}

void ThreadAppearance::adopt(const ThreadName& name) {
    if (name_ != name) {
        name_ = name;
        pthread_setname_np(pthread_self(), name_.data());
    }
}

void ThreadAppearance::adopt(int nice) {
    if (nice_ != nice) {
        nice_ = nice;
        setThreadNice(nice);
    }
}

SignalsBlocked::SignalsBlocked() {
    sigset_t all;
    sigfillset(&all);
    for (const int fault : {SIGSEGV, SIGBUS, SIGFPE, SIGILL, SIGTRAP, SIGABRT, SIGSYS}) {
        sigdelset(&all, fault);
    }
    pthread_sigmask(SIG_SETMASK, &all, &before_);
}

SignalsBlocked::~SignalsBlocked() { pthread_sigmask(SIG_SETMASK, &before_, nullptr); }

} // namespace vela::platform
