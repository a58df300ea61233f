// The reporting session of one node of the graph: turns what happens to the node into calls of the service. Time is
// given with every call, so that nothing here waits or reads a clock. Queue-confined: the thread of the graph.
//
//   Waiting --running--> Starting --conditions known, or 50 ms--> Running --not running--> Gap --running--> Running
//   Gap --more than 50 ms--> Ending --statistics have come, or 1.2 s--> Waiting
//   Ending --running--> Starting (the run before is finished first)
//   any --removed, or the server lost--> (the run is ended and finished) Gone
#pragma once

#include "reporters/pipewire/CycleTotals.h"
#include "reporters/pipewire/Graph.h"
#include "reporters/pipewire/Reports.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vela::reporter {

/// A start waits so long for volume, format and devices to be known.
inline constexpr std::chrono::milliseconds kStartDelay{50};
/// A silence that is not longer belongs to the run.
inline constexpr std::chrono::milliseconds kStopDelay{50};
/// Changes of devices that come together are one.
inline constexpr std::chrono::milliseconds kSettleDelay{20};
/// A silence that begins so long after a move at the most is the move's: the stream's own process has to answer first.
inline constexpr std::chrono::milliseconds kMoveDelay{5000};
/// Statistics of cycles come that late at the most.
inline constexpr std::chrono::milliseconds kStatisticsDelay{1200};
/// A stream that is linked and neither runs nor pauses for longer has an error.
inline constexpr std::chrono::milliseconds kStallDelay{1000};
/// So many incomplete cycles within a second are an error, told at most once in ten seconds.
inline constexpr std::size_t kIncompleteBurst = 5;

/// A device that a stream is linked with.
struct DeviceFacts {
    std::string name;
    NodeState state = NodeState::Creating;
    std::optional<Format> format;
    std::optional<Volume> volume;

    friend bool operator==(const DeviceFacts&, const DeviceFacts&) = default;
};

struct SessionPlan {
    SessionDescription description;
    bool isCapture = false;
    bool isDevice = false;      ///< which is always linked with itself, and rests when nobody plays
    bool hasStatistics = false; ///< whether there will be cycles
};

class StreamSession {
public:
    /// Creates the session. Both sinks outlive this object.
    StreamSession(SessionPlan plan, ReportSink& reports, StatisticsSink& statistics, const Moment& now);

    void setState(NodeState state, const std::string& error, const Moment& now);
    void setVolume(const Volume& volume, const Moment& now);
    void setFormat(const Format& format, const Moment& now);
    void setDevices(std::vector<DeviceFacts> devices, const Moment& now);
    /// A cycle that began at `signal`; without times it was not completed. Cycles outside the run do not count.
    void addCycle(std::chrono::nanoseconds signal, const std::optional<StatisticsSink::CycleTimes>& times);
    /// Whether a cycle that began then is of the run.
    bool covers(std::chrono::nanoseconds time) const;
    /// All cycles before `time` have been told.
    void statisticsReach(std::chrono::nanoseconds time);
    /// The node is no more.
    void remove(const Moment& now);
    /// The server is no more, and nothing will follow.
    void lose(const Moment& now);

    /// When onTime() is to be called.
    std::optional<std::chrono::nanoseconds> deadline() const;
    void onTime(const Moment& now);

    bool isRunning() const { return state_ == NodeState::Running && !isRemoved_; }
    bool isCapture() const { return plan_.isCapture; }
    /// Destroyed: this object has nothing left to do.
    bool isGone() const { return phase_ == Phase::Gone; }

private:
    enum class Phase : std::uint8_t { Waiting, Starting, Running, Gap, Ending, Gone };

    /// What the service was told.
    struct Conditions {
        std::optional<Volume> volume;
        std::optional<Format> format;
        std::vector<DeviceFacts> devices;
    };

    void comeUp(const Moment& now);
    void goDown(const Moment& now);
    void resume(const Moment& now);
    void startWhenKnown(const Moment& now);
    void startRun();
    void endRun(const Moment& end, std::string_view reason);
    void finishRun();
    void destroy();
    void changed(const Moment& now);
    void tellVolume(const Moment& at);
    void tellFormat(const Moment& at);
    void tellDevices(const Moment& at);
    void tellEverything(const Moment& at);
    void noteTransition(const Moment& at);
    void watchStall(const Moment& now);
    void tellError(const Moment& at, const std::string& what);
    void noteIncomplete(std::chrono::nanoseconds signal);
    void report(const Moment& at, std::uint32_t category, std::uint16_t type, std::vector<ReportField> fields);
    Moment momentAt(std::chrono::nanoseconds monotonic) const;
    std::string deviceNames() const;

    SessionPlan plan_;
    ReportSink& reports_;
    StatisticsSink& statistics_;
    const Moment created_;

    Phase phase_ = Phase::Waiting;
    NodeState state_ = NodeState::Creating;
    bool isRemoved_ = false;
    Conditions now_;  ///< of the node
    Conditions told_; ///< in this run

    std::int64_t runs_ = 0;
    Moment runStart_; ///< both clocks are read there; the times of the run are told from it
    Moment runEnd_;
    Moment gapStart_;
    std::optional<std::chrono::nanoseconds> gap_;   ///< length of the last one, until its cause is known
    std::optional<std::chrono::nanoseconds> moved_; ///< when the stream got other devices, until its silence is known
    std::optional<Moment> unsettled_;               ///< since when devices differ from what was told
    std::optional<std::chrono::nanoseconds> stalled_;
    bool isStallTold_ = false;
    CycleTotals totals_;
    std::deque<std::chrono::nanoseconds> incomplete_; ///< when the latest incomplete cycles of the run began
    std::optional<std::chrono::nanoseconds> burstTold_;
};

} // namespace vela::reporter
