#include "platform/hwstats/SystemSampler.h"

#include "platform/hwstats/SystemReading.h"
#include "platform/linux/ThreadAttributes.h"

#include <iterator>
#include <pthread.h>
#include <system_error>
#include <utility>

namespace vela::platform::hwstats {

SystemSampler::SystemSampler(std::string root, const Clock& clock) : root_(std::move(root)), clock_(clock) {}

SystemSampler::~SystemSampler() {
    {
        const std::lock_guard lock(mutex_);
        ending_ = true;
    }
    changed_.notify_all();
    if (thread_.joinable()) {
        thread_.join();
    }
}

bool SystemSampler::sample(const std::vector<SystemSource*>& sources, Samples& samples,
                           std::chrono::milliseconds wait) {
    const auto until = std::chrono::steady_clock::now() + wait;
    std::unique_lock lock(mutex_);
    if (!changed_.wait_until(lock, until, [this] { return reading_ == nullptr; })) {
        return false;
    }
    const auto reading = std::make_shared<Reading>();
    reading->sources = sources;
    reading->samples.time = samples.time;
    reading_ = reading;
    if (!begin()) {
        read(*reading); // no thread is to be had
        reading_ = nullptr;
    } else {
        changed_.notify_all();
        if (!changed_.wait_until(lock, until, [&reading] { return reading->done; })) {
            return false;
        }
    }
    samples.blocks.insert(samples.blocks.end(), std::move_iterator(reading->samples.blocks.begin()),
                          std::move_iterator(reading->samples.blocks.end()));
    return true;
}

bool SystemSampler::isBusy() {
    const std::lock_guard lock(mutex_);
    return reading_ != nullptr;
}

/// Answers whether there is a thread to read.
bool SystemSampler::begin() {
    if (!thread_.joinable()) {
        try {
            const SignalsBlocked blocked;
            thread_ = std::thread([this] { run(); });
        } catch (const std::system_error&) {
            return false;
        }
    }
    return true;
}

void SystemSampler::run() {
    pthread_setname_np(pthread_self(), "driver-files");
    std::unique_lock lock(mutex_);
    for (;;) {
        changed_.wait(lock, [this] { return ending_ || reading_ != nullptr; });
        if (reading_ == nullptr) {
            return;
        }
        const std::shared_ptr<Reading> reading = reading_;
        lock.unlock();
        read(*reading);
        lock.lock();
        reading->done = true;
        reading_ = nullptr;
        changed_.notify_all();
    }
}

void SystemSampler::read(Reading& reading) const {
    SystemReading system(root_, clock_);
    for (SystemSource* const source : reading.sources) {
        source->sample(system, reading.samples);
    }
}

} // namespace vela::platform::hwstats
