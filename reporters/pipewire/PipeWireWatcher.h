// Binds the reporter's model to a PipeWire server: connects, listens, and connects again when the server comes back.
// Everything runs on the thread that calls run().
#pragma once

#include "reporters/pipewire/GraphModel.h"

#include <functional>
#include <memory>
#include <string>

namespace vela::reporter {

struct WatcherOptions {
    std::string remote; ///< empty: the server library's own choice
    bool cycles = true; ///< whether to ask for the cycles of nodes
};

class PipeWireWatcher {
public:
    /// `model` outlives this object. `tell` takes lines for the log.
    PipeWireWatcher(WatcherOptions options, GraphModel& model, std::function<void(const std::string&)> tell);
    ~PipeWireWatcher();
    PipeWireWatcher(const PipeWireWatcher&) = delete;
    PipeWireWatcher& operator=(const PipeWireWatcher&) = delete;

    /// Watches until SIGINT or SIGTERM, which all threads must have blocked; then ends every session of the model.
    /// Whether the server library could be set up; it waits for a server that is not there.
    bool run();

private:
    struct Loop;

    const WatcherOptions options_;
    GraphModel& model_;
    const std::function<void(const std::string&)> tell_;
};

} // namespace vela::reporter
