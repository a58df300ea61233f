// This process. Without state, so thread-safe.
#pragma once

#include "platform/ProcessControl.h"

#include <cstdlib>

namespace vela::platform {

class LinuxProcessControl final : public ProcessControl {
public:
    void exitWithStatus(int status) override { std::_Exit(status); }
};

} // namespace vela::platform
