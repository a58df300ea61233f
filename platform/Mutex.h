// A mutex that clang's thread-safety analysis knows, and its scope. Locks are of this type wherever no condition
// variable is tied to them.
#pragma once

#include <mutex>

#if defined(__clang__)
#define VELA_THREAD_ANNOTATION(x) __attribute__((x))
#else
#define VELA_THREAD_ANNOTATION(x)
#endif

#define VELA_CAPABILITY(x) VELA_THREAD_ANNOTATION(capability(x))
#define VELA_SCOPED_CAPABILITY VELA_THREAD_ANNOTATION(scoped_lockable)
#define VELA_GUARDED_BY(x) VELA_THREAD_ANNOTATION(guarded_by(x))
#define VELA_REQUIRES(...) VELA_THREAD_ANNOTATION(requires_capability(__VA_ARGS__))
#define VELA_ACQUIRE(...) VELA_THREAD_ANNOTATION(acquire_capability(__VA_ARGS__))
#define VELA_RELEASE(...) VELA_THREAD_ANNOTATION(release_capability(__VA_ARGS__))
#define VELA_RETURN_CAPABILITY(x) VELA_THREAD_ANNOTATION(lock_returned(x))
#define VELA_EXCLUDES(...) VELA_THREAD_ANNOTATION(locks_excluded(__VA_ARGS__))
#define VELA_NO_THREAD_SAFETY_ANALYSIS VELA_THREAD_ANNOTATION(no_thread_safety_analysis)

namespace vela {

class VELA_CAPABILITY("mutex") Mutex {
public:
    void lock() VELA_ACQUIRE() { mutex_.lock(); }
    void unlock() VELA_RELEASE() { mutex_.unlock(); }

private:
    std::mutex mutex_;
};

class VELA_SCOPED_CAPABILITY MutexLock {
public:
    explicit MutexLock(Mutex& mutex) VELA_ACQUIRE(mutex) : mutex_(mutex) { mutex_.lock(); }
    ~MutexLock() VELA_RELEASE() { mutex_.unlock(); }
    MutexLock(const MutexLock&) = delete;
    MutexLock& operator=(const MutexLock&) = delete;

private:
    Mutex& mutex_;
};

/// A mutex that its owner may take again, for regions that call back into their object.
class VELA_CAPABILITY("mutex") RecursiveMutex {
public:
    void lock() VELA_ACQUIRE() { mutex_.lock(); }
    void unlock() VELA_RELEASE() { mutex_.unlock(); }

private:
    std::recursive_mutex mutex_;
};

class VELA_SCOPED_CAPABILITY RecursiveMutexLock {
public:
    explicit RecursiveMutexLock(RecursiveMutex& mutex) VELA_ACQUIRE(mutex) : mutex_(mutex) { mutex_.lock(); }
    ~RecursiveMutexLock() VELA_RELEASE() { mutex_.unlock(); }
    RecursiveMutexLock(const RecursiveMutexLock&) = delete;
    RecursiveMutexLock& operator=(const RecursiveMutexLock&) = delete;

private:
    RecursiveMutex& mutex_;
};

} // namespace vela
