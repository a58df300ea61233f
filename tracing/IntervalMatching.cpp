#include "tracing/IntervalMatching.h"

#include <algorithm>
#include <bit>
#include <cstddef>
#include <optional>
#include <random>

namespace vela {

namespace {

/// Places in a table of a power of two slots, by multiplying with a random odd number. Codes, and thread numbers above
/// all, are what other programs say: nobody can choose them so that they meet in one place.
class TablePlaces {
public:
    void setSlots(std::size_t slots) { shift_ = 64 - static_cast<unsigned>(std::countr_zero(slots)); }

    std::size_t of(std::uint64_t first, std::uint64_t second = 0) const {
        return static_cast<std::size_t>((first * firstFactor_ + second * secondFactor_) >> shift_);
    }

private:
    static std::uint64_t randomOdd() {
        std::random_device device;
        return (std::uint64_t{device()} << 32U | device()) | 1U;
    }

    unsigned shift_ = 0;
    std::uint64_t firstFactor_ = randomOdd();
    std::uint64_t secondFactor_ = randomOdd();
};

/// What an event means to one interval.
struct Role {
    std::uint32_t interval;
    bool begins;
};

/// The roles of every code.
class RolesByCode {
public:
    explicit RolesByCode(std::span<const IntervalCodes> intervals) {
        struct Entry {
            std::uint32_t code;
            Role role;
        };
        std::vector<Entry> entries;
        entries.reserve(2 * intervals.size());
        for (std::uint32_t i = 0; i < intervals.size(); ++i) {
            entries.push_back({intervals[i].begin, {i, true}});
            if (intervals[i].end != intervals[i].begin) {
                entries.push_back({intervals[i].end, {i, false}});
            }
        }
        std::ranges::stable_sort(entries, {}, &Entry::code);
        slots_.resize(std::bit_ceil(4 * entries.size() + 2));
        places_.setSlots(slots_.size());
        roles_.reserve(entries.size());
        for (const Entry& entry : entries) {
            Slot& slot = slotOf(entry.code);
            if (slot.first == slot.end) {
                slot = {entry.code, static_cast<std::uint32_t>(roles_.size()), 0};
            }
            roles_.push_back(entry.role);
            slot.end = static_cast<std::uint32_t>(roles_.size());
        }
    }

    std::span<const Role> of(std::uint32_t code) const {
        std::size_t place = places_.of(code);
        while (slots_[place].code != code && slots_[place].first != slots_[place].end) {
            place = (place + 1) & (slots_.size() - 1);
        }
        const Slot& slot = slots_[place];
        return {roles_.data() + slot.first, roles_.data() + slot.end};
    }

private:
    /// Empty where `first` is `end`.
    struct Slot {
        std::uint32_t code = 0;
        std::uint32_t first = 0;
        std::uint32_t end = 0;
    };

    Slot& slotOf(std::uint32_t code) {
        std::size_t place = places_.of(code);
        while (slots_[place].code != code && slots_[place].first != slots_[place].end) {
            place = (place + 1) & (slots_.size() - 1);
        }
        return slots_[place];
    }

    TablePlaces places_;
    std::vector<Slot> slots_;
    std::vector<Role> roles_; ///< those of one code beside each other
};

/// The pending starts of all intervals that are matched by thread: one flat table, as an event often finds one and then
/// removes it.
class PendingStarts {
public:
    PendingStarts() : slots_(kFirstSlots) { places_.setSlots(slots_.size()); }

    /// Whether there was one already.
    bool set(std::uint32_t interval, std::uint64_t thread, std::uint64_t nanoseconds) {
        if (2 * (used_ + 1) > slots_.size()) {
            grow();
        }
        Slot& slot = slots_[find(interval, thread)];
        const bool replaced = slot.used;
        used_ += replaced ? 0U : 1U;
        slot = {thread, nanoseconds, interval, true};
        return replaced;
    }

    std::optional<std::uint64_t> take(std::uint32_t interval, std::uint64_t thread) {
        const std::size_t place = find(interval, thread);
        if (!slots_[place].used) {
            return std::nullopt;
        }
        const std::uint64_t nanoseconds = slots_[place].nanoseconds;
        remove(place);
        return nanoseconds;
    }

    std::size_t size() const { return used_; }

private:
    struct Slot {
        std::uint64_t thread = 0;
        std::uint64_t nanoseconds = 0;
        std::uint32_t interval = 0;
        bool used = false;
    };
    static constexpr std::size_t kFirstSlots = 64;

    std::size_t next(std::size_t place) const { return (place + 1) & (slots_.size() - 1); }
    std::size_t homeOf(const Slot& slot) const { return places_.of(slot.thread, slot.interval); }

    /// Where it is, or would be.
    std::size_t find(std::uint32_t interval, std::uint64_t thread) const {
        std::size_t place = places_.of(thread, interval);
        while (slots_[place].used && (slots_[place].thread != thread || slots_[place].interval != interval)) {
            place = next(place);
        }
        return place;
    }

    /// Closes the gap, so that no search ends at it too early.
    void remove(std::size_t gap) {
        for (std::size_t place = next(gap); slots_[place].used; place = next(place)) {
            const std::size_t mask = slots_.size() - 1;
            const std::size_t fromHome = (place - homeOf(slots_[place])) & mask;
            if (fromHome >= ((place - gap) & mask)) {
                slots_[gap] = slots_[place];
                gap = place;
            }
        }
        slots_[gap].used = false;
        --used_;
    }

    void grow() {
        std::vector<Slot> old(2 * slots_.size());
        old.swap(slots_);
        places_.setSlots(slots_.size());
        for (const Slot& slot : old) {
            if (slot.used) {
                slots_[find(slot.interval, slot.thread)] = slot;
            }
        }
    }

    TablePlaces places_;
    std::vector<Slot> slots_;
    std::size_t used_ = 0;
};

class Walk {
public:
    Walk(const platform::SpoorSession& session, std::span<const IntervalCodes> intervals, TraceTimeline* timeline,
         const MatchingLimits& limits)
        : session_(session),
          limits_(limits),
          roles_(intervals),
          timeline_(timeline),
          matches_(intervals.size()) {
        for (const IntervalCodes& interval : intervals) {
            states_.push_back({{}, interval.matchedByThread});
        }
    }

    void run(std::span<const trace_point> points) {
        for (const trace_point& point : points) {
            const std::span<const Role> roles = roles_.of(point.eventCode);
            if (roles.empty()) {
                continue;
            }
            steps_ += roles.size();
            if (steps_ > limits_.steps || byThread_.size() > limits_.pendingStarts) {
                ++unmatchedEvents_;
                continue;
            }
            const std::uint64_t now = session_.nanoseconds(point.timestamp);
            for (const Role role : roles) {
                if (role.begins) {
                    begin(role.interval, point, now);
                } else {
                    end(role.interval, point, now);
                }
            }
        }
    }

    MatchedIntervals takeMatches() { return {std::move(matches_), unmatchedEvents_}; }

private:
    /// The pending start of an interval that is matched process-wide.
    struct WideStart {
        std::uint64_t timestamp = 0; ///< 0: none
        std::uint64_t nanoseconds = 0;
        std::uint64_t thread = 0;
        std::int32_t process = 0;
    };
    struct State {
        WideStart wide;
        bool byThread = false;
    };

    void begin(std::uint32_t interval, const trace_point& point, std::uint64_t now) {
        State& state = states_[interval];
        bool replaced = false;
        if (state.byThread) {
            replaced = byThread_.set(interval, point.threadID, now);
        } else {
            replaced = state.wide.timestamp != 0;
            state.wide = {point.timestamp, now, point.threadID, point.processID};
        }
        matches_[interval].droppedStarts += replaced ? 1U : 0U;
    }

    void end(std::uint32_t interval, const trace_point& point, std::uint64_t now) {
        State& state = states_[interval];
        if (state.byThread) {
            const std::optional<std::uint64_t> start = byThread_.take(interval, point.threadID);
            if (start) {
                add({*start, now, point.threadID, point.threadID, point.processID, interval});
                return;
            }
        } else if (state.wide.timestamp != 0) {
            const WideStart& start = state.wide;
            add({start.nanoseconds, now, start.thread, point.threadID, start.process, interval});
            state.wide.timestamp = 0;
            return;
        }
        ++matches_[interval].droppedStops;
    }

    void add(const TraceSpan& span) {
        matches_[span.interval].durations.push_back(span.end - span.begin);
        if (timeline_ != nullptr) {
            timeline_->add(span);
        }
    }

    const platform::SpoorSession& session_;
    const MatchingLimits limits_;
    const RolesByCode roles_;
    TraceTimeline* const timeline_;
    std::vector<State> states_;
    PendingStarts byThread_;
    std::vector<IntervalMatches> matches_;
    std::uint64_t steps_ = 0;
    std::uint64_t unmatchedEvents_ = 0;
};

} // namespace

MatchedIntervals matchIntervals(const platform::SpoorSession& session, std::span<const trace_point> points,
                                std::span<const IntervalCodes> intervals, TraceTimeline* timeline,
                                const MatchingLimits& limits) {
    Walk walk(session, intervals, timeline, limits);
    walk.run(points);
    return walk.takeMatches();
}

} // namespace vela
