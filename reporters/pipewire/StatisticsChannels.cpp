#include "reporters/pipewire/StatisticsChannels.h"

#include "reporters/pipewire/CycleTotals.h"
#include "reporters/pipewire/Graph.h"

#include <utility>

namespace vela::reporter {

namespace {

using reporting::Channels;

constexpr std::array<std::int64_t, 13> kTransitionBounds{0, 1, 2, 5, 10, 20, 50, 100, 200, 500, 1000, 5000, 60000};

// Places of the channels in their definitions.
constexpr std::size_t kCycles = 0;
constexpr std::size_t kIncomplete = 1;
constexpr std::size_t kXrunsOrFrames = 2;
constexpr std::size_t kWait = 3;
constexpr std::size_t kBusy = 4;
constexpr std::size_t kState = 5;

/// In the order of NodeState.
constexpr std::array<const char*, 5> kNodeStates{"creating", "suspended", "idle", "running", "error"};
constexpr std::array<const char*, 2> kStreamStates{"none running", "running"};

void addCycle(const Channels& channels, const std::optional<StatisticsSink::CycleTimes>& times) {
    reporting::Counter(channels[kCycles]).add(1);
    if (!times) {
        reporting::Counter(channels[kIncomplete]).add(1);
        return;
    }
    reporting::Histogram(channels[kWait]).record(times->wait);
    reporting::Histogram(channels[kBusy]).record(times->busy);
}

} // namespace

StatisticsChannels::StatisticsChannels(std::string folder, std::function<void(const std::string&)> complain)
    : folder_(std::move(folder)),
      complain_(std::move(complain)) {
    transitions_ = makeTransitionChannels();
    check(*transitions_);
}

Channels StatisticsChannels::makeNodeChannels(const char* driver, const char* group) {
    const bool isSink = std::string_view(group) == "Speaker";
    return {{.driver = driver, .group = group, .folder = folder_.empty() ? nullptr : folder_.c_str()},
            {reporting::counter("cycles"), reporting::counter("incomplete"),
             reporting::counter(isSink ? "xruns" : "frames"), reporting::histogram("wait", "us", kTimeBounds),
             reporting::histogram("busy", "us", kTimeBounds),
             isSink ? reporting::states("node", kNodeStates) : reporting::states("streams", kStreamStates)}};
}

Channels StatisticsChannels::makeTransitionChannels() {
    return {{.driver = "Streams",
             .group = "StateTransitionTimes_ms",
             .folder = folder_.empty() ? nullptr : folder_.c_str()},
            {reporting::histogram("start", "ms", kTransitionBounds),
             reporting::histogram("move", "ms", kTransitionBounds),
             reporting::histogram("rate change", "ms", kTransitionBounds)}};
}

void StatisticsChannels::check(const Channels& channels) {
    if (!channels && !std::exchange(hasComplained_, true)) {
        complain_(channels.errorText());
    }
}

const Channels* StatisticsChannels::channelsOf(const std::string& sink) const {
    const auto found = sinks_.find(sink);
    return found == sinks_.end() || !found->second.channels ? nullptr : &*found->second.channels;
}

const Channels& StatisticsChannels::streams(bool capture) {
    std::optional<Channels>& channels = streams_[capture ? 1 : 0];
    if (!channels) {
        channels = makeNodeChannels("Streams", capture ? "Rx" : "Tx");
        check(*channels);
    }
    return *channels;
}

void StatisticsChannels::addSink(const std::string& name) {
    Sink& sink = sinks_[name];
    if (++sink.count == 1 && published_ < kMostSinks) {
        ++published_;
        sink.channels = makeNodeChannels(name.c_str(), "Speaker");
        check(*sink.channels);
    }
}

void StatisticsChannels::removeSink(const std::string& name) {
    const auto found = sinks_.find(name);
    if (found != sinks_.end() && --found->second.count == 0) {
        published_ -= found->second.channels ? 1U : 0U;
        sinks_.erase(found);
    }
}

void StatisticsChannels::sinkState(const std::string& name, std::uint8_t state) {
    if (const Channels* const channels = channelsOf(name)) {
        reporting::StateChannel((*channels)[kState]).enter(state);
    }
}

void StatisticsChannels::sinkCycle(const std::string& name, const std::optional<CycleTimes>& times) {
    if (const Channels* const channels = channelsOf(name)) {
        addCycle(*channels, times);
    }
}

void StatisticsChannels::sinkXruns(const std::string& name, std::int64_t count) {
    if (const Channels* const channels = channelsOf(name)) {
        reporting::Counter((*channels)[kXrunsOrFrames]).add(count);
    }
}

void StatisticsChannels::streamCycle(bool capture, std::int64_t frames, const std::optional<CycleTimes>& times) {
    const Channels& channels = streams(capture);
    addCycle(channels, times);
    reporting::Counter(channels[kXrunsOrFrames]).add(times ? frames : 0);
}

void StatisticsChannels::runningStreams(bool capture, std::size_t count) {
    if (count > 0 || streams_[capture ? 1 : 0]) {
        reporting::StateChannel(streams(capture)[kState]).enter(count > 0 ? 1 : 0);
    }
}

void StatisticsChannels::transition(Transition kind, std::int64_t milliseconds) {
    reporting::Histogram((*transitions_)[static_cast<std::size_t>(kind)]).record(milliseconds);
}

} // namespace vela::reporter
