// When to call the audio server again: after 50 ms, doubling up to 5 s. A connection that lasted a second begins this
// anew; one that ended sooner does not, or a server that throws everybody out would be called without a pause. Times
// are those of the monotonic clock. Queue-confined: the thread of the graph.
#pragma once

#include <algorithm>
#include <chrono>
#include <optional>
#include <utility>

namespace vela::reporter {

class ConnectionPauses {
public:
    using Pause = std::chrono::milliseconds;

    /// The pause after an attempt that failed. None once the longest was made where `isWatched`, the server's socket: a
    /// server that comes makes it anew.
    std::optional<Pause> attemptFailed(bool isWatched) {
        return isWatched && next_ == kLongest ? std::nullopt : std::optional(take());
    }
    void connected(std::chrono::nanoseconds now) { connectedAt_ = now; }
    /// The pause after a connection that ended.
    Pause connectionLost(std::chrono::nanoseconds now) {
        if (connectedAt_ && now - *connectedAt_ >= kLasting) {
            reset();
        }
        connectedAt_.reset();
        return take();
    }
    /// There may be another server.
    void reset() { next_ = kFirst; }

private:
    static constexpr Pause kFirst{50};
    static constexpr Pause kLongest{5000};
    static constexpr std::chrono::seconds kLasting{1};

    Pause take() { return std::exchange(next_, std::min(next_ * 2, kLongest)); }

    Pause next_ = kFirst;
    std::optional<std::chrono::nanoseconds> connectedAt_;
};

} // namespace vela::reporter
