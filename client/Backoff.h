// When to try the next connection: at once, then after 50 ms, doubling up to 5 s. A connection that lasted a second
// begins this anew; one that ended sooner does not, or a service that throws everybody out would be called without a
// pause. Queue-confined: its owner's thread.
#pragma once

#include <algorithm>
#include <chrono>
#include <optional>

namespace vela::client {

using Moment = std::chrono::steady_clock::time_point;

class Backoff {
public:
    /// The attempt that may be made now or later.
    Moment next() const { return next_; }
    void attemptFailed(Moment now) { postpone(now); }
    void connected(Moment now) { connectedAt_ = now; }
    void connectionLost(Moment now) {
        if (connectedAt_ && now - *connectedAt_ >= kLasting) {
            delay_ = {};
            next_ = now;
        } else {
            postpone(now);
        }
        connectedAt_.reset();
    }

private:
    static constexpr std::chrono::milliseconds kFirst{50};
    static constexpr std::chrono::milliseconds kLongest{5000};
    static constexpr std::chrono::seconds kLasting{1};

    void postpone(Moment now) {
        delay_ = delay_.count() == 0 ? kFirst : std::min(delay_ * 2, kLongest);
        next_ = now + delay_;
    }

    std::chrono::milliseconds delay_{0};
    Moment next_{};
    std::optional<Moment> connectedAt_;
};

} // namespace vela::client
