// Tells which files of a folder are replaced, also when the folder itself goes and comes back. While it is missing and
// cannot be made, the nearest folder above it that is there is watched instead. Not thread-safe but for `wake`.
#pragma once

#include "platform/linux/FileDescriptor.h"

#include <cstdint>
#include <string>
#include <string_view>

struct inotify_event;

namespace vela::platform {

class LinuxNotificationWatch {
public:
    /// What the watch saw. Called by `read`, and by `arm` for a folder that took the place of another.
    class Listener {
    public:
        virtual ~Listener() = default;
        /// The file `name` was replaced.
        virtual void replaced(std::string_view name) = 0;
        /// Files may have been replaced unseen.
        virtual void overlooked() = 0;
    };

    /// `folder` is an absolute path.
    LinuxNotificationWatch(std::string folder, Listener& listener);

    /// Makes the folder where it is missing and watches it. 0 or an error number; with one, `read` goes on trying
    /// whenever something changes above the folder.
    int arm();

    /// Waits, without limit, until there is something to read (true) or `wake` was called (false).
    bool wait() const;
    /// Takes some of what there is, so that whoever guards this lets others in between.
    void read();
    /// Ends every `wait`. Any thread.
    void wake() const;

private:
    int addWatch(const std::string& path, std::uint32_t events) const;
    int watchFolder();
    bool watchAbove();
    void take(const inotify_event& event, std::string_view name);

    const std::string folder_;
    Listener& listener_;
    const FileDescriptor events_;
    const FileDescriptor end_;
    int folderWatch_ = -1;
    int aboveWatch_ = -1;
    std::string awaited_; ///< the name in the folder above that leads to ours
    bool wasWatched_ = false;
};

} // namespace vela::platform
