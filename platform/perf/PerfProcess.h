// One run of a program that is controlled as `perf record` is: it reads commands, one a line, from one descriptor and
// answers each with a line on another. Commands go through pipes, so there is nothing in the file system to clean up.
// Confined to the thread that starts it, which must live as long as the run: the kernel kills the program when that
// thread ends, and so when this process is killed. That thread blocks SIGPIPE. Destruction kills what still runs.
#pragma once

#include "platform/Result.h"
#include "platform/linux/FileDescriptor.h"

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <vector>

namespace vela::platform::perf {

class PerfProcess {
public:
    /// The program's own numbers of the descriptors it is controlled by, and of the one that it writes its result to.
    static constexpr int kCommands = 3;
    static constexpr int kAnswers = 4;
    static constexpr int kResult = 5;
    static constexpr std::size_t kMostErrorBytes = 4096;

    enum class Event : std::uint8_t { Answer, Ended, Woken, TimedOut };
    using Deadline = std::optional<std::chrono::steady_clock::time_point>;

    PerfProcess() = default;
    ~PerfProcess();
    PerfProcess(const PerfProcess&) = delete;
    PerfProcess& operator=(const PerfProcess&) = delete;

    /// Once. That `program` (an absolute path) cannot be run shows as its end. `result`: an open file.
    Result<Done> start(const std::string& program, const std::vector<std::string>& arguments,
                       const FileDescriptor& result);

    /// Forgets earlier answers. A program that has ended is not told.
    void send(std::string_view command);

    /// The next thing that happens. `wakeUp` is an eventfd, and is emptied. Each answer is told once, and before an end
    /// that came with it; the end is told again and again.
    Event wait(int wakeUp, Deadline deadline);

    /// With everything in its process group. Waits until it is gone, but no longer than `patience`.
    void kill(std::chrono::milliseconds patience);

    // After the end.
    bool endedWell() const;
    Failure failure() const;

    /// What the program printed on its standard error that explains a failure, on one line; may be empty.
    std::string explanation() const;

private:
    struct Child;

    void readAnswers();
    void readErrors();
    void reap();

    std::string program_;
    FileDescriptor commands_;
    FileDescriptor answers_;
    FileDescriptor errors_;
    FileDescriptor report_; ///< gives the error number of an exec that failed
    FileDescriptor process_;
    pid_t pid_ = -1;
    int unseenAnswers_ = 0;
    std::string errorText_;
    std::optional<int> status_; ///< as waitpid answers it, once it has ended
    int execError_ = 0;
};

} // namespace vela::platform::perf
