// Bounds what sessions keep in memory: each one's messages and configuration, and those of all together. What does not
// fit is refused and counted.
//
// Everything here is thread-safe. `VelaReportingSessionMemory` is one for the service and outlives every session; a
// budget is one session's part, a share what one message takes of it, given back when the share is destroyed.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <utility>

namespace vela {

struct VelaReportingSessionLimits {
    std::uint64_t sessionBytes = 0; ///< limits.session_bytes
    std::uint64_t totalBytes = 0;   ///< limits.total_bytes
};

/// Why a message was refused.
enum class VelaReportingMemoryLimit : std::uint8_t { SessionBytes, TotalBytes };

class VelaReportingSessionMemory {
public:
    explicit VelaReportingSessionMemory(const VelaReportingSessionLimits& limits) : limits_(limits) {}

    const VelaReportingSessionLimits& limits() const { return limits_; }
    /// Bytes that all sessions keep.
    std::uint64_t bytes() const { return bytes_; }
    /// Messages refused since the service began.
    std::uint64_t refusals() const { return refusals_; }

private:
    friend class VelaReportingSessionBudget;

    const VelaReportingSessionLimits limits_;
    std::atomic<std::uint64_t> bytes_ = 0;
    std::atomic<std::uint64_t> refusals_ = 0;
};

class VelaReportingSessionBudget {
public:
    explicit VelaReportingSessionBudget(VelaReportingSessionMemory& memory) : memory_(memory) {}

    /// Takes `bytes`, or says which limit they would pass. With `always` they are taken whatever the limits.
    std::optional<VelaReportingMemoryLimit> take(std::uint64_t bytes, bool always = false) {
        const bool passesOwn = bytes_.fetch_add(bytes) + bytes > memory_.limits_.sessionBytes;
        const bool passesTotal = memory_.bytes_.fetch_add(bytes) + bytes > memory_.limits_.totalBytes;
        if (always || (!passesOwn && !passesTotal)) {
            return std::nullopt;
        }
        give(bytes);
        ++memory_.refusals_;
        return passesOwn ? VelaReportingMemoryLimit::SessionBytes : VelaReportingMemoryLimit::TotalBytes;
    }
    void give(std::uint64_t bytes) {
        bytes_ -= bytes;
        memory_.bytes_ -= bytes;
    }

    const VelaReportingSessionMemory& memory() const { return memory_; }
    std::uint64_t bytes() const { return bytes_; }

private:
    VelaReportingSessionMemory& memory_;
    std::atomic<std::uint64_t> bytes_ = 0;
};

class VelaReportingSessionShare {
public:
    /// Of no bytes.
    VelaReportingSessionShare() = default;
    /// Of `bytes` that were taken from `budget`.
    VelaReportingSessionShare(std::shared_ptr<VelaReportingSessionBudget> budget, std::uint64_t bytes)
        : budget_(std::move(budget)),
          bytes_(bytes) {}
    VelaReportingSessionShare(VelaReportingSessionShare&& other) noexcept = default;
    VelaReportingSessionShare& operator=(VelaReportingSessionShare&& other) noexcept {
        std::swap(budget_, other.budget_);
        std::swap(bytes_, other.bytes_);
        return *this;
    }
    ~VelaReportingSessionShare() {
        if (budget_ != nullptr) {
            budget_->give(bytes_);
        }
    }

    /// Makes it `bytes`, or leaves it as it is and says which limit that would pass.
    std::optional<VelaReportingMemoryLimit> resize(std::uint64_t bytes) {
        if (bytes <= bytes_) {
            budget_->give(bytes_ - bytes);
        } else if (const auto limit = budget_->take(bytes - bytes_)) {
            return limit;
        }
        bytes_ = bytes;
        return std::nullopt;
    }
    /// Its bytes, which are from now on the caller's to give back.
    std::uint64_t keep() { return std::exchange(bytes_, 0); }

private:
    std::shared_ptr<VelaReportingSessionBudget> budget_;
    std::uint64_t bytes_ = 0;
};

} // namespace vela
