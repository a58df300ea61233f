// The kernel trace facility on Linux. Events of this process and of every process that emits go through the kernel's
// trace buffer where this process may open it, else through rings in shared memory; one reader serves both.
//
// Thread-safe. Sessions may outlive it. Opens the control page at once, so that emitters find it, and everything else
// with the first session.
#pragma once

#include "platform/Clock.h"
#include "platform/Spoor.h"
#include "platform/spoor/TraceEmitter.h"
#include "platform/spoor/TraceReader.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <sys/types.h>
#include <vector>

namespace vela::platform {

struct LinuxSpoorOptions {
    std::string runtimeFolder;
    /// Where the kernel's trace file system may be mounted; none: rings only.
    std::vector<std::string> traceFolders = {"/sys/kernel/tracing", "/sys/kernel/debug/tracing"};
    /// What the kernel's instances are called.
    std::string instanceName = "vela-reporting";
    std::size_t bufferKilobytes = 8192; ///< of each processor, while sessions collect
    /// Who may make rings in a folder that root makes here; without one, root.
    std::optional<gid_t> emitterGroup;
};

class LinuxSpoor final : public Spoor {
public:
    using Spoor::emit;

    /// The clock outlives it and its sessions.
    LinuxSpoor(LinuxSpoorOptions options, const Clock& clock);
    LinuxSpoor(const LinuxSpoor&) = delete;
    LinuxSpoor& operator=(const LinuxSpoor&) = delete;

    std::unique_ptr<SpoorSession> createSession() override;
    void emit(std::uint32_t eventCode, const std::array<std::uint64_t, 4>& arguments) override {
        emitter_.emit(eventCode, arguments);
    }

    /// Whether the kernel's buffer is used. Known with the first session's start.
    bool usesFtrace() { return reader_->usesFtrace(); }

private:
    const Clock& clock_;
    const std::shared_ptr<spoor::TraceReader> reader_;
    spoor::TraceEmitter emitter_;
};

} // namespace vela::platform
