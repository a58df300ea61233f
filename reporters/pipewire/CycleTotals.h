// What the cycles of one stream came to: counts, and how long it waited and worked. Queue-confined: one thread.
#pragma once

#include "reporters/pipewire/Reports.h"

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace vela::reporter {

/// Bounds of the buckets of wait and busy times, in microseconds.
inline constexpr std::array<std::int64_t, 12> kTimeBounds{0,    50,   100,   250,   500,   1000,
                                                          2500, 5000, 10000, 25000, 50000, 100000};

class CycleTotals {
public:
    /// `times` are those of a cycle that was completed.
    void add(const std::optional<StatisticsSink::CycleTimes>& times);

    std::int64_t cycles() const { return complete_ + incomplete_; }
    std::int64_t incomplete() const { return incomplete_; }

    /// Counts, means and greatest times.
    std::vector<ReportField> summary() const;
    /// "0-50:12,50-100:3": the hits of each bucket that has any, for wait and busy.
    std::vector<ReportField> histograms() const;

private:
    struct Times {
        std::int64_t sum = 0;
        std::int64_t greatest = 0;
        std::array<std::int64_t, kTimeBounds.size() - 1> hits{};

        void add(std::int64_t microseconds);
        std::string text() const;
    };

    std::int64_t complete_ = 0;
    std::int64_t incomplete_ = 0;
    Times wait_;
    Times busy_;
};

} // namespace vela::reporter
