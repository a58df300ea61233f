// The service's side of the control page: makes or takes over `<runtime>/trace/control`, which is never unlinked, and
// says in it what is collected. Confined to its owner's lock. One service at a time has a page.
#pragma once

#include "platform/Result.h"
#include "platform/linux/FileDescriptor.h"
#include "platform/spoor/ControlPage.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <sys/types.h>
#include <vector>

namespace vela::platform::spoor {

class TraceControl {
public:
    /// Makes the folders where they are missing: when root does so and there is an `emitterGroup`, that group may make
    /// rings. Whatever a service before this one left active ends. Fails with EBUSY where another service lives.
    static Result<std::unique_ptr<TraceControl>> open(const std::string& runtimeFolder,
                                                      std::optional<gid_t> emitterGroup);
    /// Ends what is active.
    ~TraceControl();
    TraceControl(const TraceControl&) = delete;
    TraceControl& operator=(const TraceControl&) = delete;

    /// Where emitters write events for the kernel; empty: they use rings only. While nothing is active.
    void setMarker(const std::string& path);

    /// Lets emitters pass on codes from `low` to `high`. The answer is for `deactivate`.
    std::size_t activate(std::uint32_t low, std::uint32_t high);
    void deactivate(std::size_t slot);

    /// The service lives and collects.
    void beat(std::uint64_t now) { store(page_->heartbeat, now); }

private:
    struct Range {
        std::uint32_t low;
        std::uint32_t high;
        bool used;
    };

    TraceControl(FileDescriptor file, ControlPage* page) : file_(std::move(file)), page_(page) {}
    void show(std::size_t slot);

    FileDescriptor file_; ///< its lock tells that the service lives
    ControlPage* const page_;
    std::vector<Range> ranges_; ///< of all that collect; those beyond the slots share the last one
};

} // namespace vela::platform::spoor
