#include "platform/perf/PerfTraceSession.h"

#include "platform/linux/ThreadAttributes.h"

#include <cerrno>
#include <poll.h>
#include <pthread.h>
#include <string>
#include <sys/eventfd.h>
#include <system_error>
#include <utility>
#include <vector>

namespace vela::platform::perf {

namespace {

/// For a killed process to be gone; longer only where the kernel holds it.
constexpr std::chrono::milliseconds kKillPatience{5000};

Failure abandoned() { return {ECANCELED, "the session of the trace was destroyed"}; }

Failure withoutAnswer(const PerfProcess& perf, const std::string& what, std::chrono::milliseconds limit) {
    const std::string why = perf.explanation();
    return {ETIMEDOUT, what + " within " + std::to_string(limit.count()) + " ms" + (why.empty() ? "" : ": " + why)};
}

std::vector<std::string> argumentsFor(const PerfProbe::Options& options) {
    return {"record", "-a", "-e", "cpu-clock", "-F", "999", "-g", "-k", "CLOCK_MONOTONIC",
            "--delay=-1", // counts from the first "enable" on
            // Synthesizing these makes the end several times slower, and a trace of programs needs none.
            "--no-bpf-event",
            "--no-buildid-cache", // writes nothing but its result
            "--max-size=" + std::to_string(options.mostBytes) + "B",
            "--control=fd:" + std::to_string(PerfProcess::kCommands) + "," + std::to_string(PerfProcess::kAnswers),
            // Not by its name, in whose place somebody else's file may stand.
            "-o", "/proc/self/fd/" + std::to_string(PerfProcess::kResult)};
}

} // namespace

PerfTraceSession::PerfTraceSession(const PerfProbe::Options& options, std::shared_ptr<TracePlaces> places,
                                   const Clock& clock, WorkQueue& queue)
    : options_(options),
      places_(std::move(places)),
      files_(options.folder, options.mostFiles, clock),
      calls_(std::make_shared<DelegateCalls>(queue)),
      wakeUp_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

PerfTraceSession::~PerfTraceSession() {
    {
        const MutexLock lock(mutex_);
        isAbandoned_ = true;
    }
    wake();
    if (thread_.joinable()) {
        thread_.join();
    }
}

void PerfTraceSession::setDelegate(std::weak_ptr<ProbeTraceDelegate> delegate) {
    calls_->setDelegate(std::move(delegate));
}

void PerfTraceSession::startProbeTrace() {
    MaybeFailure failure;
    {
        const MutexLock lock(mutex_);
        if (isTracing_) {
            return;
        }
        failure = takePlace();
        isTracing_ = isStartWanted_ = !failure;
        isStopWanted_ = false;
        // Under the mutex: behind it the trace may fail, and whoever is told may let go of this.
        wake();
    }
    if (failure) {
        const std::shared_ptr<DelegateCalls> calls = calls_;
        calls->didStart(failure);
        calls->didComplete({}, failure);
    }
}

void PerfTraceSession::stopProbeTrace() {
    const MutexLock lock(mutex_);
    if (isTracing_) {
        isStopWanted_ = true;
        wake();
    }
}

PerfTraceSession::MaybeFailure PerfTraceSession::takePlace() {
    if (!places_->take()) {
        const std::string limit = std::to_string(places_->limit());
        return Failure{EBUSY, limit + " performance traces run already, the limit is " + limit};
    }
    MaybeFailure failure = makeThread();
    if (failure) {
        places_->giveBack();
    }
    return failure;
}

PerfTraceSession::MaybeFailure PerfTraceSession::makeThread() {
    if (!wakeUp_) {
        return Failure{EMFILE, "no descriptor for a performance trace"};
    }
    if (!thread_.joinable()) {
        const SignalsBlocked blocked;
        try {
            thread_ = std::thread([this] { work(); });
        } catch (const std::system_error& error) {
            return Failure{error.code().value(), "thread of a performance trace: " + error.code().message()};
        }
    }
    return std::nullopt;
}

void PerfTraceSession::wake() const {
    static_cast<void>(eventfd_write(wakeUp_.get(), 1)); // fails only when it was woken before
}

void PerfTraceSession::work() {
    pthread_setname_np(pthread_self(), "probe-trace");
    while (awaitStart()) {
        trace();
    }
}

// False at the session's end; a trace that was asked for before is made, and given up at once.
bool PerfTraceSession::awaitStart() {
    while (true) {
        {
            const MutexLock lock(mutex_);
            if (std::exchange(isStartWanted_, false)) {
                return true;
            }
            if (isAbandoned_) {
                return false;
            }
        }
        pollfd polled{wakeUp_.get(), POLLIN, 0};
        poll(&polled, 1, -1);
        eventfd_t ignored = 0;
        eventfd_read(wakeUp_.get(), &ignored);
    }
}

void PerfTraceSession::trace() {
    Result<TraceFile> reserved = files_.reserve();
    if (!reserved) {
        calls_->didStart(reserved.failure());
        complete({}, reserved.failure());
        return;
    }
    std::optional<TraceFile> file(*std::move(reserved));
    PerfProcess perf;
    MaybeFailure failure = begin(perf, *file);
    calls_->didStart(failure);
    if (!failure) {
        failure = halt(perf);
        calls_->didStop(failure);
    }
    if (!failure) {
        failure = finish(perf);
    }
    perf.kill(kKillPatience);
    std::string url;
    if (!failure) {
        if (const Result<std::string> path = file->publish()) {
            url = fileUrl(*path);
        } else {
            failure = path.failure();
        }
    }
    file.reset();
    files_.removeOldest();
    complete(url, std::move(failure));
}

PerfTraceSession::MaybeFailure PerfTraceSession::begin(PerfProcess& perf, const TraceFile& file) {
    if (isAbandoned()) {
        return abandoned();
    }
    if (Result<Done> started = perf.start(options_.program, argumentsFor(options_), file.held()); !started) {
        return started.failure();
    }
    return ask(perf, "enable", options_.startLimit);
}

PerfTraceSession::MaybeFailure PerfTraceSession::halt(PerfProcess& perf) {
    MaybeFailure failure = awaitStop(perf);
    if (!failure && !perf.endedWell()) {
        failure = ask(perf, "disable", options_.stopLimit);
    }
    // It ends by itself when its result has the largest size, maybe just now.
    return perf.endedWell() ? std::nullopt : failure;
}

PerfTraceSession::MaybeFailure PerfTraceSession::awaitStop(PerfProcess& perf) {
    while (!isAbandoned()) {
        if (isStopWanted()) {
            return std::nullopt;
        }
        if (perf.wait(wakeUp_.get(), std::nullopt) == PerfProcess::Event::Ended) {
            return perf.endedWell() ? std::nullopt : MaybeFailure(perf.failure());
        }
    }
    return abandoned();
}

PerfTraceSession::MaybeFailure PerfTraceSession::finish(PerfProcess& perf) {
    perf.send("stop");
    const auto deadline = std::chrono::steady_clock::now() + options_.endLimit;
    while (!isAbandoned()) {
        switch (perf.wait(wakeUp_.get(), deadline)) {
        case PerfProcess::Event::Ended:
            return perf.endedWell() ? std::nullopt : MaybeFailure(perf.failure());
        case PerfProcess::Event::TimedOut:
            return withoutAnswer(perf, options_.program + " did not end", options_.endLimit);
        case PerfProcess::Event::Answer:
        case PerfProcess::Event::Woken:
            break;
        }
    }
    return abandoned();
}

PerfTraceSession::MaybeFailure PerfTraceSession::ask(PerfProcess& perf, std::string_view command, Limit limit) {
    perf.send(command);
    const auto deadline = std::chrono::steady_clock::now() + limit;
    while (!isAbandoned()) {
        switch (perf.wait(wakeUp_.get(), deadline)) {
        case PerfProcess::Event::Answer:
            return std::nullopt;
        case PerfProcess::Event::Ended:
            return perf.failure();
        case PerfProcess::Event::TimedOut:
            return withoutAnswer(perf, options_.program + " did not answer \"" + std::string(command) + "\"", limit);
        case PerfProcess::Event::Woken:
            break;
        }
    }
    return abandoned();
}

void PerfTraceSession::complete(const std::string& url, MaybeFailure failure) {
    {
        const MutexLock lock(mutex_);
        isTracing_ = false;
        places_->giveBack();
    }
    calls_->didComplete(url, std::move(failure));
}

bool PerfTraceSession::isStopWanted() {
    const MutexLock lock(mutex_);
    return isStopWanted_;
}

bool PerfTraceSession::isAbandoned() {
    const MutexLock lock(mutex_);
    return isAbandoned_;
}

} // namespace vela::platform::perf
