#include "platform/perf/PerfProcess.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <limits>
#include <poll.h>
#include <pthread.h>
#include <sys/eventfd.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace vela::platform::perf {

namespace {

constexpr int kNotRun = 127;
constexpr int kFirstOutOfTheWay = 10;

/// Nothing of the service's environment, and no configuration of a user: the same trace whoever runs the service.
constexpr std::array kEnvironment = {"LC_ALL=C", "PATH=/usr/sbin:/usr/bin:/sbin:/bin", "HOME=/",
                                     "PERF_CONFIG=/dev/null"};

struct Pipe {
    FileDescriptor out;
    FileDescriptor in;

    /// False with errno set.
    bool make() {
        std::array<int, 2> ends{-1, -1};
        if (pipe2(ends.data(), O_CLOEXEC) != 0) {
            return false;
        }
        out = FileDescriptor(ends[0]);
        in = FileDescriptor(ends[1]);
        return true;
    }
};

Failure failureOf(const std::string& operation, int code) {
    return {code, operation + ": " + std::generic_category().message(code)};
}

void setNonBlocking(const FileDescriptor& descriptor) {
    fcntl(descriptor.get(), F_SETFL, fcntl(descriptor.get(), F_GETFL) | O_NONBLOCK);
}

/// Reads what is there, at most one block; false at the end.
template <class Use>
bool readBlock(const FileDescriptor& descriptor, Use use) {
    std::array<char, 4096> block; // NOLINT(cppcoreguidelines-pro-type-member-init): read fills it
    const ssize_t got = ::read(descriptor.get(), block.data(), block.size());
    if (got > 0) {
        use(std::string_view(block.data(), static_cast<std::size_t>(got)));
    }
    return got > 0 || (got < 0 && (errno == EAGAIN || errno == EINTR));
}

int millisecondsUntil(const PerfProcess::Deadline& deadline) {
    if (!deadline) {
        return -1;
    }
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(*deadline - std::chrono::steady_clock::now());
    constexpr std::chrono::milliseconds::rep kMost = std::numeric_limits<int>::max();
    return static_cast<int>(std::clamp<std::chrono::milliseconds::rep>(left.count(), 0, kMost));
}

/// Whether a line of perf's is told on every run.
bool isChatter(std::string_view line) {
    return line.empty() || line == "Error:" || line.starts_with("Events ") || line.starts_with("[ perf record:");
}

} // namespace

/// What the new process needs to become the program. All of it is made before the fork: from there to the exec there
/// are only calls that a signal handler might make.
struct PerfProcess::Child {
    std::array<int, 6> ends; ///< by the number that each shall have in the program
    int report;
    pid_t parent;
    const char* program;
    char* const* arguments;
    char* const* environment;

    [[noreturn]] void become() {
        if (setUp()) {
            execve(program, arguments, environment);
        }
        const int error = errno;
        static_cast<void>(write(report, &error, sizeof(error)) > 0);
        _exit(kNotRun);
    }

private:
    bool setUp() {
        setpgid(0, 0); // a terminal's interrupt is for the service; and it is killed with all that it started
        if (prctl(PR_SET_PDEATHSIG, SIGKILL) != 0) {
            return false;
        }
        if (getppid() != parent) { // which died before that was set
            _exit(kNotRun);
        }
        for (int& end : ends) {
            if (!moveOutOfTheWay(end)) {
                return false;
            }
        }
        if (!moveOutOfTheWay(report)) {
            return false;
        }
        for (std::size_t number = 0; number < ends.size(); ++number) {
            if (dup2(ends[number], static_cast<int>(number)) < 0) {
                return false;
            }
        }
        close_range(kResult + 1, std::numeric_limits<unsigned>::max(), CLOSE_RANGE_CLOEXEC);
        resetSignals();
        return true;
    }

    static bool moveOutOfTheWay(int& descriptor) {
        const int moved = fcntl(descriptor, F_DUPFD_CLOEXEC, kFirstOutOfTheWay);
        descriptor = moved < 0 ? descriptor : moved;
        return moved >= 0;
    }

    static void resetSignals() {
        struct sigaction standard {};
        standard.sa_handler = SIG_DFL;
        for (int signal = 1; signal < NSIG; ++signal) {
            sigaction(signal, &standard, nullptr); // refused for the two that cannot be handled
        }
        sigset_t none;
        sigemptyset(&none);
        pthread_sigmask(SIG_SETMASK, &none, nullptr);
    }
};

PerfProcess::~PerfProcess() {
    if (pid_ > 0 && !status_) {
        kill(std::chrono::milliseconds(0));
        if (!status_) {
            reap();
        }
    }
}

Result<Done> PerfProcess::start(const std::string& program, const std::vector<std::string>& arguments,
                                const FileDescriptor& result) {
    program_ = program;
    Pipe commands;
    Pipe answers;
    Pipe errors;
    Pipe report;
    const FileDescriptor nothing(open("/dev/null", O_RDWR | O_CLOEXEC));
    if (!nothing || !commands.make() || !answers.make() || !errors.make() || !report.make()) {
        return failureOf("pipes for " + program_, errno);
    }
    std::vector<char*> words{const_cast<char*>(program_.c_str())};
    for (const std::string& argument : arguments) {
        words.push_back(const_cast<char*>(argument.c_str()));
    }
    words.push_back(nullptr);
    std::vector<char*> environment;
    environment.reserve(kEnvironment.size() + 1);
    for (const char* variable : kEnvironment) {
        environment.push_back(const_cast<char*>(variable));
    }
    environment.push_back(nullptr);
    Child child{{nothing.get(), nothing.get(), errors.in.get(), commands.out.get(), answers.in.get(), result.get()},
                report.in.get(),
                getpid(),
                program_.c_str(),
                words.data(),
                environment.data()};
    pid_ = fork();
    if (pid_ == 0) {
        child.become();
    }
    if (pid_ < 0) {
        return failureOf("process for " + program_, errno);
    }
    setpgid(pid_, pid_); // whoever of the two comes first
    process_ = FileDescriptor(static_cast<int>(syscall(SYS_pidfd_open, pid_, 0)));
    if (!process_) {
        return failureOf("watch over " + program_, errno);
    }
    commands_ = std::move(commands.in);
    answers_ = std::move(answers.out);
    errors_ = std::move(errors.out);
    report_ = std::move(report.out);
    for (const FileDescriptor* end : {&commands_, &answers_, &errors_, &report_}) {
        setNonBlocking(*end);
    }
    return Done();
}

void PerfProcess::send(std::string_view command) {
    unseenAnswers_ = 0;
    const std::string line = std::string(command) + "\n";
    // Fails when the program has ended, which the next wait tells. A few bytes always fit.
    static_cast<void>(write(commands_.get(), line.data(), line.size()) > 0);
}

PerfProcess::Event PerfProcess::wait(int wakeUp, Deadline deadline) {
    while (true) {
        if (unseenAnswers_ > 0) {
            --unseenAnswers_;
            return Event::Answer;
        }
        if (status_) {
            return Event::Ended;
        }
        std::array<pollfd, 4> polled{{{answers_.get(), POLLIN, 0},
                                      {errors_.get(), POLLIN, 0},
                                      {process_.get(), POLLIN, 0},
                                      {wakeUp, POLLIN, 0}}};
        const int count = poll(polled.data(), polled.size(), millisecondsUntil(deadline));
        const auto happened = [&](std::size_t index) { return count > 0 && polled[index].revents != 0; };
        if (happened(0)) {
            readAnswers();
        }
        if (happened(1)) {
            readErrors();
        }
        if (happened(2)) {
            reap();
        } else if (happened(3)) {
            eventfd_t ignored = 0;
            eventfd_read(wakeUp, &ignored);
            return Event::Woken;
        } else if (unseenAnswers_ == 0 && deadline && std::chrono::steady_clock::now() >= *deadline) {
            return Event::TimedOut; // also of a program that prints without end
        }
    }
}

void PerfProcess::kill(std::chrono::milliseconds patience) {
    if (pid_ <= 0 || status_) {
        return;
    }
    // Not reaped yet, so the numbers are still its own.
    ::kill(-pid_, SIGKILL);
    ::kill(pid_, SIGKILL);
    pollfd polled{process_.get(), POLLIN, 0};
    if (process_ && poll(&polled, 1, static_cast<int>(patience.count())) > 0) {
        reap();
    }
}

void PerfProcess::readAnswers() {
    const bool isOpen = readBlock(answers_, [this](std::string_view bytes) {
        unseenAnswers_ += static_cast<int>(std::count(bytes.begin(), bytes.end(), '\n'));
    });
    if (!isOpen) {
        answers_ = FileDescriptor();
    }
}

void PerfProcess::readErrors() {
    const bool isOpen = readBlock(errors_, [this](std::string_view bytes) {
        errorText_ += bytes.substr(0, kMostErrorBytes - std::min(kMostErrorBytes, errorText_.size()));
    });
    if (!isOpen) {
        errors_ = FileDescriptor();
    }
}

// Blocks until the program has ended.
void PerfProcess::reap() {
    siginfo_t ended{};
    int waited = -1;
    do {
        waited = waitid(P_PID, static_cast<id_t>(pid_), &ended, WEXITED | WNOWAIT);
    } while (waited != 0 && errno == EINTR);
    if (waited == 0) {
        ::kill(-pid_, SIGKILL); // what it left behind in its group, whose number is still its own
    }
    int status = 0;
    pid_t reaped = -1;
    do {
        reaped = waitpid(pid_, &status, 0);
    } while (reaped < 0 && errno == EINTR);
    status_ = reaped == pid_ ? status : kNotRun << 8; // somebody else took its status: nothing good is known
    if (answers_) {
        readAnswers();
    }
    if (errors_) {
        readErrors();
    }
    if (report_ && ::read(report_.get(), &execError_, sizeof(execError_)) != sizeof(execError_)) {
        execError_ = 0;
    }
}

bool PerfProcess::endedWell() const { return status_ && WIFEXITED(*status_) && WEXITSTATUS(*status_) == 0; }

Failure PerfProcess::failure() const {
    if (execError_ != 0) {
        return failureOf("cannot run " + program_, execError_);
    }
    std::string text = program_;
    if (status_ && WIFSIGNALED(*status_)) {
        const char* const name = sigabbrev_np(WTERMSIG(*status_));
        text += " was ended by signal " + std::to_string(WTERMSIG(*status_));
        text += name == nullptr ? "" : std::string(" (SIG") + name + ")";
    } else {
        text += " ended with status " + std::to_string(status_ ? WEXITSTATUS(*status_) : -1);
    }
    const std::string why = explanation();
    return {0, why.empty() ? text : text + ": " + why};
}

std::string PerfProcess::explanation() const {
    constexpr std::size_t kMostBytes = 400;
    std::string text;
    std::string_view rest = errorText_;
    while (!rest.empty() && text.size() < kMostBytes) {
        const std::size_t end = std::min(rest.find('\n'), rest.size());
        std::string_view line = rest.substr(0, end);
        rest.remove_prefix(std::min(end + 1, rest.size()));
        line.remove_prefix(std::min(line.find_first_not_of(" \t"), line.size()));
        if (!isChatter(line)) {
            text.append(text.empty() ? "" : " ").append(line);
        }
    }
    if (text.size() > kMostBytes) {
        text = text.substr(0, kMostBytes) + "...";
    }
    return text;
}

} // namespace vela::platform::perf
