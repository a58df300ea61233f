#include "platform/spoor/TracePaths.h"

namespace vela::platform::spoor {

std::string traceFolder(std::string_view runtimeFolder) { return std::string(runtimeFolder) + "/trace"; }

std::string controlFile(std::string_view runtimeFolder) { return traceFolder(runtimeFolder) + "/control"; }

std::string ringFolder(std::string_view runtimeFolder) { return traceFolder(runtimeFolder) + "/rings"; }

std::vector<EmitterFolder> emitterFolders(const EmitterEnvironment& environment) {
    if (!environment.velaRuntime.empty()) {
        return {{environment.velaRuntime, true}};
    }
    std::vector<EmitterFolder> folders;
    if (!environment.runtimeHome.empty()) {
        folders.push_back({environment.runtimeHome + "/vela", false});
    }
    folders.push_back({environment.systemRuntime, true});
    return folders;
}

} // namespace vela::platform::spoor
