// The events collected for one trace, as many as there is room for. Not thread-safe.
#pragma once

#include "tracing/TraceData.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

namespace vela {

class TracePointList {
public:
    /// About 300 MB: 20 seconds of 200,000 events each.
    static constexpr std::size_t kMostPoints = std::size_t{4} << 20U;

    explicit TracePointList(std::size_t mostPoints = kMostPoints) : mostPoints_(mostPoints) {
        constexpr std::size_t kReservedPoints = 10'000;
        points_.reserve(kReservedPoints);
    }

    /// Keeps `point`, or counts it where there is no room.
    void add(const trace_point& point) {
        if (points_.size() < mostPoints_) {
            points_.push_back(point);
        } else {
            ++lost_;
        }
    }

    /// Gives the memory back; what was lost stays counted.
    void clear() { std::vector<trace_point>().swap(points_); }

    /// In the order delivered.
    std::span<const trace_point> points() const { return points_; }
    std::uint64_t lost() const { return lost_; }

private:
    std::size_t mostPoints_;
    std::vector<trace_point> points_;
    std::uint64_t lost_ = 0;
};

} // namespace vela
