#include "reporters/pipewire/Graph.h"

namespace vela::reporter {

const char* textOf(NodeState state) {
    switch (state) {
    case NodeState::Creating:
        return "creating";
    case NodeState::Suspended:
        return "suspended";
    case NodeState::Idle:
        return "idle";
    case NodeState::Running:
        return "running";
    case NodeState::Error:
        return "error";
    }
    return "";
}

NodeKind nodeKind(const std::string& mediaClass) {
    if (mediaClass == "Stream/Output/Audio") {
        return NodeKind::PlaybackStream;
    }
    if (mediaClass == "Stream/Input/Audio") {
        return NodeKind::CaptureStream;
    }
    if (mediaClass.starts_with("Audio/Sink") || mediaClass == "Audio/Duplex") {
        return NodeKind::Sink;
    }
    return mediaClass.starts_with("Audio/Source") ? NodeKind::Source : NodeKind::Other;
}

} // namespace vela::reporter
