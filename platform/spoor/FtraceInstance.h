// A trace instance of the kernel's, into which emitters write markers. Its name is one of a fixed few: an instance
// stays for as long as an emitter holds its marker file, and whoever comes next takes it over. The kernel stops it by
// itself when its owner ends in any way. Confined to its owner's lock.
#pragma once

#include "platform/Result.h"
#include "platform/linux/FileDescriptor.h"
#include "platform/spoor/FtracePage.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

namespace vela::platform::spoor {

struct FtraceOptions {
    std::vector<std::string> traceFolders; ///< where the kernel's trace file system may be mounted
    std::string name;                      ///< instances are called NAME-s0 to NAME-s3
    std::size_t bufferKilobytes = 8192;    ///< of each processor, while sessions collect
};

class FtraceInstance {
public:
    static Result<std::unique_ptr<FtraceInstance>> open(const FtraceOptions& options);
    /// Removes the instance when no emitter holds it.
    ~FtraceInstance();
    FtraceInstance(const FtraceInstance&) = delete;
    FtraceInstance& operator=(const FtraceInstance&) = delete;

    const std::string& markerPath() const { return marker_; }

    /// Begins to record, from nothing. Takes some ms when the buffer is cold.
    Result<Done> begin();
    /// Appends what has been recorded since the last time, processor by processor.
    void drain(std::vector<TraceRecord>& records, std::uint64_t& lost);
    /// No event is recorded any more; those that were can still be drained.
    void stop();
    /// Behind the last drain. The buffer stays warm.
    void end();
    /// Gives the buffer's memory back.
    void cool();

private:
    struct Processor {
        std::uint32_t number;
        FileDescriptor pipe;
    };

    FtraceInstance() = default;
    static Result<std::unique_ptr<FtraceInstance>> take(const std::string& folder, const FtraceOptions& options);
    Result<Done> configure(const std::string& folder);
    Result<Done> write(const char* file, const std::string& text) const;
    Result<Done> openPipes();

    std::string path_;
    std::string marker_;
    std::size_t bufferKilobytes_ = 0;
    FtraceLayout layout_;
    FileDescriptor folder_;     ///< its lock keeps other services out
    FileDescriptor freeBuffer_; ///< held, as the kernel ends the recording when it is closed
    std::vector<Processor> processors_;
    std::vector<char> page_;
    bool warm_ = false;
};

} // namespace vela::platform::spoor
