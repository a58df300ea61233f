#include "platform/spoor/TraceReader.h"

#include "common/VelaReportingLogCategories.h"
#include "platform/linux/ThreadAttributes.h"
#include "platform/spoor/TracePaths.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <pthread.h>
#include <sched.h>
#include <system_error>
#include <utility>

namespace vela::platform::spoor {

namespace {

using SteadyClock = std::chrono::steady_clock;

constexpr std::chrono::milliseconds kInterval{5};
/// Emitters may be held up between looking at the clock and writing.
constexpr std::uint64_t kPatience = 2'000'000;
constexpr std::chrono::seconds kWarmTime{60};
constexpr int kRealTimePriority = 5;

const LogCategory& traceLog() { return VelaReportingTraceCategory(); }

/// What other threads keep the processor from must still be read in time. Where this is not allowed, the buffers' depth
/// must do.
void becomeUrgent() {
    pthread_setname_np(pthread_self(), "vela-spoor");
    const sched_param parameters{kRealTimePriority};
    static_cast<void>(pthread_setschedparam(pthread_self(), SCHED_FIFO, &parameters));
}

} // namespace

TraceReader::TraceReader(TraceReaderOptions options)
    : options_(std::move(options)),
      rings_(ringFolder(options_.runtimeFolder)) {
    if (openControl() == 0 && rings_.begin()) {
        rings_.end(); // rings of emitters that are gone are gone, too
    }
}

TraceReader::~TraceReader() {
    {
        const std::lock_guard<std::mutex> lock(mutex_);
        stopping_ = true;
    }
    wake_.notify_one();
    if (thread_.joinable()) {
        thread_.join();
    }
}

int TraceReader::openControl() {
    if (control_ != nullptr) {
        return 0;
    }
    auto control = TraceControl::open(options_.runtimeFolder, options_.emitterGroup);
    if (!control) {
        traceLog().info("kernel trace: %@", control.failure().description);
        return control.failure().code != 0 ? control.failure().code : EIO;
    }
    control_ = *std::move(control);
    return 0;
}

void TraceReader::openFtrace() {
    if (std::exchange(triedFtrace_, true) || options_.ftrace.traceFolders.empty()) {
        return;
    }
    auto instance = FtraceInstance::open(options_.ftrace);
    if (!instance) {
        traceLog().info("kernel trace: rings only: %@", instance.failure().description);
        return;
    }
    ftrace_ = *std::move(instance);
}

int TraceReader::beginSources() {
    if (const Result<Done> begun = rings_.begin(); !begun) {
        traceLog().info("kernel trace: %@", begun.failure().description);
        return begun.failure().code;
    }
    openFtrace();
    if (ftrace_ != nullptr) {
        if (const Result<Done> begun = ftrace_->begin(); !begun) {
            traceLog().info("kernel trace: rings only: %@", begun.failure().description);
            ftrace_.reset();
        }
    }
    control_->setMarker(ftrace_ != nullptr ? ftrace_->markerPath() : std::string());
    return 0;
}

void TraceReader::endSources() {
    if (ftrace_ != nullptr) {
        ftrace_->stop();
        ftrace_->end();
        warm_ = true;
    }
    rings_.end();
    if (merge_.late() != 0) {
        traceLog().info("kernel trace: %llu events came late", merge_.late());
    }
    merge_.clear();
}

bool TraceReader::startThread() {
    if (thread_.joinable()) {
        return true;
    }
    try {
        const SignalsBlocked blocked;
        thread_ = std::thread([this] { run(); });
        return true;
    } catch (const std::system_error&) {
        return false;
    }
}

int TraceReader::start(std::shared_ptr<TraceCollection> collection) {
    const std::lock_guard<std::mutex> lock(mutex_);
    if (const int error = openControl(); error != 0) {
        return error;
    }
    if (!startThread()) {
        return EAGAIN;
    }
    if (running_.empty()) {
        if (const int error = beginSources(); error != 0) {
            return error;
        }
    }
    Running running{std::move(collection), std::nullopt, traceNow(), std::nullopt};
    const auto& ranges = running.collection->ranges();
    if (!ranges.empty()) {
        const auto low = std::ranges::min_element(ranges, {}, &TraceCollection::Range::first);
        const auto high = std::ranges::max_element(ranges, {}, &TraceCollection::Range::last);
        running.slot = control_->activate(low->first, high->last);
    }
    running_.push_back(std::move(running));
    wake_.notify_one();
    return 0;
}

std::vector<TraceReader::Running>::iterator TraceReader::find(const TraceCollection& collection) {
    return std::ranges::find_if(running_,
                                [&](const Running& running) { return running.collection.get() == &collection; });
}

void TraceReader::deactivate(Running& running) {
    if (running.slot) {
        control_->deactivate(*std::exchange(running.slot, std::nullopt));
    }
}

void TraceReader::end(const TraceCollection& collection) {
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto found = find(collection);
    if (found != running_.end() && !found->end) {
        found->end = traceNow();
        deactivate(*found);
        wake_.notify_one();
    }
}

void TraceReader::remove(const TraceCollection& collection) {
    std::shared_ptr<TraceCollection> removed; // destroyed behind the lock
    const std::lock_guard<std::mutex> lock(mutex_);
    const auto found = find(collection);
    if (found == running_.end()) {
        return;
    }
    deactivate(*found);
    removed = std::move(found->collection);
    running_.erase(found);
    if (running_.empty()) {
        endSources();
        wake_.notify_one();
    }
}

bool TraceReader::usesFtrace() {
    const std::lock_guard<std::mutex> lock(mutex_);
    return ftrace_ != nullptr;
}

bool TraceReader::isAnyEnded() const {
    return std::ranges::any_of(running_, [](const Running& running) { return running.end.has_value(); });
}

void TraceReader::cycle() {
    const std::uint64_t now = traceNow();
    control_->beat(now);
    const bool isAnEnd = isAnyEnded();
    const bool isTheEnd = std::ranges::all_of(running_, [](const Running& running) { return running.end.has_value(); });
    std::uint64_t lost = 0;
    if (ftrace_ != nullptr) {
        if (isTheEnd) {
            ftrace_->stop(); // what was written before is in the buffer
        }
        ftrace_->drain(merge_.incoming(), lost);
    }
    rings_.drain(isAnEnd, merge_.incoming(), lost);
    merge_.merge();
    const auto ready = merge_.until(now - kPatience);
    for (Running& running : running_) {
        running.collection->addLost(lost);
        running.collection->deliver(running.end ? merge_.all() : ready, running.begin,
                                    running.end.value_or(~std::uint64_t{0}));
        if (running.end) {
            TraceCollection::complete(std::move(running.collection));
        }
    }
    merge_.drop(ready.size());
    std::erase_if(running_, [](const Running& running) { return running.collection == nullptr; });
    if (running_.empty()) {
        endSources();
    }
}

void TraceReader::rest(std::unique_lock<std::mutex>& lock) {
    const auto isOver = [this] { return stopping_ || !running_.empty(); };
    // One more wake-up for the memory of the kernel's buffer, which another session might have wanted soon.
    if (warm_ && !wake_.wait_for(lock, kWarmTime, isOver) && ftrace_ != nullptr) {
        ftrace_->cool();
    }
    warm_ = false;
    wake_.wait(lock, isOver);
}

void TraceReader::run() {
    becomeUrgent();
    std::unique_lock<std::mutex> lock(mutex_);
    while (!stopping_) {
        if (running_.empty()) {
            rest(lock);
            continue;
        }
        const auto begin = SteadyClock::now();
        cycle();
        // However much emitters write, half of the time is left to others.
        const auto spent = std::min<SteadyClock::duration>(SteadyClock::now() - begin, kInterval);
        const auto next = std::max(begin + kInterval, SteadyClock::now() + spent);
        wake_.wait_until(lock, next, [this] { return stopping_ || isAnyEnded(); });
    }
}

} // namespace vela::platform::spoor
