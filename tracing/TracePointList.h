// The events collected for one trace, as many as there is room for: in this trace, and in what all traces share. Not
// thread-safe.
#pragma once

#include "tracing/TraceData.h"
#include "tracing/TracePointBudget.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <utility>
#include <vector>

namespace vela {

class TracePointList {
public:
    /// 302 MB: 20 seconds of 200,000 events each. While the list grows it takes up to 189 MB more.
    static constexpr std::size_t kMostPoints = std::size_t{4} << 20U;

    explicit TracePointList(std::shared_ptr<TracePointBudget> budget, std::size_t mostPoints = kMostPoints)
        : budget_(std::move(budget)),
          mostPoints_(mostPoints) {
        constexpr std::size_t kReservedPoints = 10'000;
        points_.reserve(kReservedPoints);
    }
    ~TracePointList() { budget_->giveBack(granted_); }
    TracePointList(const TracePointList&) = delete;
    TracePointList& operator=(const TracePointList&) = delete;

    /// Keeps `point`, or counts it where there is no room.
    void add(const trace_point& point) {
        if (points_.size() < granted_ || makeRoom()) {
            points_.push_back(point);
        } else {
            ++lost_;
        }
    }

    /// Gives the memory back; what was lost stays counted.
    void clear() {
        std::vector<trace_point>().swap(points_);
        budget_->giveBack(std::exchange(granted_, 0));
    }

    /// In the order delivered.
    std::span<const trace_point> points() const { return points_; }
    std::uint64_t lost() const { return lost_; }
    /// Events for which there is memory.
    std::size_t capacity() const { return points_.capacity(); }

private:
    bool makeRoom() {
        constexpr std::size_t kStep = 1'024; // so that the shared count is seldom touched
        granted_ += budget_->take(std::min(kStep, mostPoints_ - granted_));
        if (granted_ > points_.capacity()) {
            // As a vector grows by itself, but not beyond what it may hold.
            points_.reserve(std::min(mostPoints_, std::max(granted_, 2 * points_.capacity())));
        }
        return points_.size() < granted_;
    }

    const std::shared_ptr<TracePointBudget> budget_;
    const std::size_t mostPoints_;
    std::vector<trace_point> points_;
    std::size_t granted_ = 0; ///< of the budget
    std::uint64_t lost_ = 0;
};

} // namespace vela
