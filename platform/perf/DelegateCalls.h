// What a trace tells its delegate: in the order told, one call at a time, on a queue that may be of any kind. Thread-
// safe. Shared by a session and the queue's item, so that an end is told when the session is gone already. The queue
// outlives it.
#pragma once

#include "platform/Mutex.h"
#include "platform/Probe.h"
#include "platform/UniqueFunction.h"
#include "platform/WorkQueue.h"

#include <deque>
#include <memory>
#include <optional>
#include <string>

namespace vela::platform::perf {

class DelegateCalls : public std::enable_shared_from_this<DelegateCalls> {
public:
    explicit DelegateCalls(WorkQueue& queue) : queue_(queue) {}

    /// Waits for the end of a call that is under way, except within that call: afterwards only `delegate` is called.
    void setDelegate(std::weak_ptr<ProbeTraceDelegate> delegate);

    // These never block. Whoever is the delegate when the call is due gets it; without one it is dropped.
    void didStart(std::optional<Failure> error);
    void didStop(std::optional<Failure> error);
    void didComplete(std::string url, std::optional<Failure> error);

private:
    using Call = UniqueFunction<void(ProbeTraceDelegate&)>;

    void post(Call call);
    void deliverAll();
    void deliver(Call& call);

    WorkQueue& queue_;
    Mutex mutex_;
    std::deque<Call> waiting_ VELA_GUARDED_BY(mutex_);
    bool isPosted_ VELA_GUARDED_BY(mutex_) = false; ///< an item delivers or will
    RecursiveMutex delegateMutex_;                  ///< held during a call, around whatever the delegate locks
    std::weak_ptr<ProbeTraceDelegate> delegate_ VELA_GUARDED_BY(delegateMutex_);
};

} // namespace vela::platform::perf
