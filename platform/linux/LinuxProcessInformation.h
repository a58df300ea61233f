// Processes as procfs shows them. Immutable, so thread-safe.
//
// A process that has ended but was not yet waited for (a zombie) still has its record, and the record is answered: a
// client that just died can still be named. The number of a thread that is not its process's first gives that thread's
// record; numbers that sockets report are always those of processes.
#pragma once

#include "platform/ProcessInformation.h"

#include <cstdint>
#include <string>

namespace vela::platform {

class LinuxProcessInformation final : public ProcessInformation {
public:
    /// `root` is where procfs is mounted.
    explicit LinuxProcessInformation(std::string root = "/proc") : root_(std::move(root)) {}

    std::int32_t ownPid() const override;
    /// Empty where procfs cannot be read.
    std::string ownName() const override;
    bool read(std::int32_t pid, ProcessRecord& record) const override;

private:
    const std::string root_;
};

} // namespace vela::platform
