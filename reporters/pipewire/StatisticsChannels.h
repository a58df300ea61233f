// Publishes what the reporter measures as channel files, which the service samples when a session starts and when it
// stops. Queue-confined: the thread of the graph.
//
// | group | driver | channels |
// | --- | --- | --- |
// | Speaker | the sink's name | cycles, incomplete, xruns; wait, busy (us); node |
// | Tx, Rx | Streams | cycles, incomplete, frames; wait, busy (us); streams |
// | StateTransitionTimes_ms | Streams | start, move, rate change (ms) |
#pragma once

#include "reporters/pipewire/Reports.h"

#include <array>
#include <cstddef>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vela/channels.hpp>

namespace vela::reporter {

class StatisticsChannels final : public StatisticsSink {
public:
    /// `folder` is empty for the library's own choice. `complain` is told once why channels cannot be published.
    StatisticsChannels(std::string folder, std::function<void(const std::string&)> complain);

    /// Sinks of one name share their channels, which end with the last of them.
    void addSink(const std::string& name) override;
    void removeSink(const std::string& name) override;
    void sinkState(const std::string& name, std::uint8_t state) override;
    void sinkCycle(const std::string& name, const std::optional<CycleTimes>& times) override;
    void sinkXruns(const std::string& name, std::int64_t count) override;
    void streamCycle(bool capture, std::int64_t frames, const std::optional<CycleTimes>& times) override;
    void runningStreams(bool capture, std::size_t count) override;
    void transition(Transition kind, std::int64_t milliseconds) override;

    /// Sinks beyond these have no channels: the service reads a limited number of files.
    static constexpr std::size_t kMostSinks = 64;

private:
    struct Sink {
        std::size_t count = 0;
        std::optional<reporting::Channels> channels;
    };

    reporting::Channels makeNodeChannels(const char* driver, const char* group);
    reporting::Channels makeTransitionChannels();
    void check(const reporting::Channels& channels);
    const reporting::Channels* channelsOf(const std::string& sink) const;
    const reporting::Channels& streams(bool capture);

    const std::string folder_;
    const std::function<void(const std::string&)> complain_;
    bool hasComplained_ = false;
    std::map<std::string, Sink, std::less<>> sinks_;
    std::size_t published_ = 0;                                 ///< names of sinks that have channels
    std::array<std::optional<reporting::Channels>, 2> streams_; ///< playback, capture
    std::optional<reporting::Channels> transitions_;
};

/// Takes everything and does nothing.
class NoStatistics final : public StatisticsSink {
public:
    void addSink(const std::string& /*name*/) override {}
    void removeSink(const std::string& /*name*/) override {}
    void sinkState(const std::string& /*name*/, std::uint8_t /*state*/) override {}
    void sinkCycle(const std::string& /*name*/, const std::optional<CycleTimes>& /*times*/) override {}
    void sinkXruns(const std::string& /*name*/, std::int64_t /*count*/) override {}
    void streamCycle(bool /*capture*/, std::int64_t /*frames*/, const std::optional<CycleTimes>& /*times*/) override {}
    void runningStreams(bool /*capture*/, std::size_t /*count*/) override {}
    void transition(Transition /*kind*/, std::int64_t /*milliseconds*/) override {}
};

} // namespace vela::reporter
