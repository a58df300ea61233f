// What other programs see of a pool thread: its name and its nice value. Free functions, thread-safe; the setters act
// on the calling thread.
#pragma once

#include "platform/WorkQueue.h"

#include <array>
#include <csignal>
#include <string_view>

namespace vela::platform {

/// A thread's name as the kernel keeps it: at most 15 bytes and a NUL.
using ThreadName = std::array<char, 16>;

/// The part of a queue's name that fits: leading dot-separated components are dropped until it does; when even the last
/// one is too long, the last 15 bytes.
ThreadName threadNameFor(std::string_view queueName);

/// The calling thread's nice value.
int threadNice();

/// The nice value for work of `quality` in a process whose own one is `base`.
int niceFor(QualityOfService quality, int base);

/// Whether a thread that made itself nicer may take that back, tried on a thread made for it: capability bits alone do
/// not tell, a container's may be worth nothing. Without it a thread that once served background work would stay slow.
bool niceCanBeTakenBack();

/// The calling thread's name and nice value, changed through the system only where they differ.
class ThreadAppearance {
public:
    /// Knows nothing of the thread yet.
    ThreadAppearance() = default;
    /// Names the calling thread, whose nice value is `nice`.
    ThreadAppearance(const ThreadName& name, int nice) : nice_(nice) { adopt(name); }

    void adopt(const ThreadName& name);
    void adopt(int nice);
    int nice() const { return nice_; }

private:
    ThreadName name_{};
    int nice_ = 0;
};

/// Signals are for the threads that wait for them: threads made within this scope take only those of their own faults.
class SignalsBlocked {
public:
    SignalsBlocked();
    ~SignalsBlocked();
    SignalsBlocked(const SignalsBlocked&) = delete;
    SignalsBlocked& operator=(const SignalsBlocked&) = delete;

private:
    sigset_t before_;
};

} // namespace vela::platform
