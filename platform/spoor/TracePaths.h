// Where the control page and the rings of a service stand, and where emitters look for them. Pure functions.
#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace vela::platform::spoor {

/// Below a service's runtime folder.
std::string traceFolder(std::string_view runtimeFolder);
std::string controlFile(std::string_view runtimeFolder);
std::string ringFolder(std::string_view runtimeFolder);

/// A runtime folder that an emitter looks at.
struct EmitterFolder {
    std::string runtime;
    /// Whoever owns the control page there can end the emitters that map it. Where this is false, it must be root or
    /// the emitter's own user.
    bool anyOwner = true;

    friend bool operator==(const EmitterFolder&, const EmitterFolder&) = default;
};

/// What emitters find in their environment.
struct EmitterEnvironment {
    std::string velaRuntime; ///< $VELA_RUNTIME: a service's runtime folder
    std::string runtimeHome; ///< $XDG_RUNTIME_DIR
    std::string systemRuntime = "/run/vela";
};

/// In the order in which they are looked at: $VELA_RUNTIME alone when it is set, else the user's and the system's.
std::vector<EmitterFolder> emitterFolders(const EmitterEnvironment& environment);

} // namespace vela::platform::spoor
