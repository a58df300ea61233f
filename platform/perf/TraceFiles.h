// The results of performance traces: `probe-<number>-<UTC time>.data`, the newest of them; numbers only go up. While a
// trace runs its file is named with ".part" behind, and held by a lock that ends with the process, so what a killed
// service left is known by being free; it is removed when the next trace begins. Other files are left alone.
//
// Other users may write into the folder. What is published is the file that was reserved, or nothing: a trace is to be
// written to its descriptor and never to its name, and the folder is found by platform/linux/FolderWalk.h.
// `TraceFiles` keeps nothing and is thread-safe; a `TraceFile` is confined to one thread.
#pragma once

#include "platform/Clock.h"
#include "platform/Result.h"
#include "platform/linux/FileDescriptor.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <utility>

namespace vela::platform::perf {

/// The file of one trace, made empty. Removed with this unless it was published.
class TraceFile {
public:
    /// `path`: what it shall be. `folder`: where that is. `held`: what was made there.
    TraceFile(std::string path, FileDescriptor folder, FileDescriptor held)
        : path_(std::move(path)),
          folder_(std::move(folder)),
          held_(std::move(held)) {}
    TraceFile(TraceFile&& other) noexcept = default;
    TraceFile& operator=(TraceFile&&) = delete;
    TraceFile(const TraceFile&) = delete;
    TraceFile& operator=(const TraceFile&) = delete;
    ~TraceFile();

    /// Where the trace is to be written. Open for reading, too.
    const FileDescriptor& held() const { return held_; }
    /// What the file is called until it is published.
    std::string partPath() const;

    /// Gives it its lasting name, and answers that path. Fails where nothing was written, and where something else has
    /// taken the file's place.
    Result<std::string> publish();

private:
    std::string partName() const;
    /// 0, or an error number.
    int checkPlace() const;

    std::string path_;
    FileDescriptor folder_;
    FileDescriptor held_;
};

class TraceFiles {
public:
    /// `folder` is made when it is needed. `most` is at least 1. `clock` outlives this.
    TraceFiles(const std::string& folder, std::size_t most, const Clock& clock);

    /// A new file. Removes what killed services left.
    Result<TraceFile> reserve() const;

    /// Removes the oldest results while there are too many; never the newest.
    void removeOldest() const;

private:
    const std::string folder_;
    const std::size_t most_;
    const Clock& clock_;
};

/// The "file" URL of an absolute path.
std::string fileUrl(std::string_view path);

} // namespace vela::platform::perf
