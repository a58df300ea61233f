#include "platform/perf/DelegateCalls.h"

#include <utility>

namespace vela::platform::perf {

void DelegateCalls::setDelegate(std::weak_ptr<ProbeTraceDelegate> delegate) {
    const RecursiveMutexLock lock(delegateMutex_);
    delegate_ = std::move(delegate);
}

void DelegateCalls::didStart(std::optional<Failure> error) {
    post([error = std::move(error)](ProbeTraceDelegate& delegate) { delegate.performanceTraceDidStart(error); });
}

void DelegateCalls::didStop(std::optional<Failure> error) {
    post([error = std::move(error)](ProbeTraceDelegate& delegate) { delegate.performanceTraceDidStop(error); });
}

void DelegateCalls::didComplete(std::string url, std::optional<Failure> error) {
    post([url = std::move(url), error = std::move(error)](ProbeTraceDelegate& delegate) {
        delegate.performanceTraceDidComplete(url, {}, error);
    });
}

void DelegateCalls::post(Call call) {
    {
        const MutexLock lock(mutex_);
        waiting_.push_back(std::move(call));
        if (std::exchange(isPosted_, true)) {
            return;
        }
    }
    queue_.post([self = shared_from_this()] { self->deliverAll(); });
}

void DelegateCalls::deliverAll() {
    while (true) {
        Call call;
        {
            const MutexLock lock(mutex_);
            if (waiting_.empty()) {
                isPosted_ = false;
                return;
            }
            call = std::move(waiting_.front());
            waiting_.pop_front();
        }
        deliver(call);
    }
}

void DelegateCalls::deliver(Call& call) {
    std::shared_ptr<ProbeTraceDelegate> delegate; // let go of behind the lock
    const RecursiveMutexLock lock(delegateMutex_);
    delegate = delegate_.lock();
    if (delegate != nullptr) {
        call(*delegate);
    }
}

} // namespace vela::platform::perf
