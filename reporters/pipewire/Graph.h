// What the reporter knows of an audio graph: plain data in the reporter's own words, so that nothing but the binding
// knows the audio server's library.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace vela::reporter {

/// One instant on both clocks. Lengths are taken from the monotonic one, which nobody sets.
struct Moment {
    std::chrono::nanoseconds monotonic{}; ///< of CLOCK_MONOTONIC
    double epoch = 0;                     ///< seconds since 1970

    friend bool operator==(const Moment&, const Moment&) = default;
};

enum class NodeState : std::uint8_t { Creating, Suspended, Idle, Running, Error };

/// "creating", "suspended", "idle", "running", "error".
const char* textOf(NodeState state);

enum class NodeKind : std::uint8_t { Other, PlaybackStream, CaptureStream, Sink, Source };

/// By the node's media class, such as "Stream/Output/Audio".
NodeKind nodeKind(const std::string& mediaClass);

/// Texts that the server does not give are empty.
struct NodeProperties {
    std::uint64_t serial = 0; ///< of the object; unlike its ID never used again while the server runs
    std::string mediaClass;
    std::string role;    ///< of the media: "Music", "Notification", ...
    std::string eventId; ///< of a notification: "message-new-instant", ...
    std::string application;
    std::string name;
    std::optional<std::uint32_t> client; ///< ID of the client that made it

    friend bool operator==(const NodeProperties&, const NodeProperties&) = default;
};

struct Volume {
    double volume = 1;
    std::vector<double> channels;
    bool muted = false;

    friend bool operator==(const Volume&, const Volume&) = default;
};

struct Format {
    std::string encoding; ///< "F32LE"
    std::uint32_t rate = 0;
    std::uint32_t channels = 0;

    friend bool operator==(const Format&, const Format&) = default;
};

struct Link {
    std::uint32_t output = 0; ///< node that gives
    std::uint32_t input = 0;  ///< node that takes
};

/// What one node did in one cycle of its driver. Times are nanoseconds of CLOCK_MONOTONIC; 0 where it has not come to
/// that.
struct NodeCycle {
    std::uint32_t id = 0;
    std::string name;
    std::int64_t signal = 0; ///< told to run
    std::int64_t awake = 0;  ///< began
    std::int64_t finish = 0; ///< was done
    int status = 0;          ///< 3: done
};

/// One cycle of a driver, the node whose clock wakes the others.
struct Cycle {
    std::int64_t xruns = 0;  ///< of the driver since it was made
    std::int64_t frames = 0; ///< of one cycle
    NodeCycle driver;
    std::vector<NodeCycle> followers;
};

} // namespace vela::reporter
