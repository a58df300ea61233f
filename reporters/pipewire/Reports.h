// What the reporter has to say to the reporting service, and to whom it says it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

namespace vela::reporter {

using FieldValue = std::variant<bool, std::int64_t, double, std::string>;

struct ReportField {
    std::string key;
    FieldValue value;

    friend bool operator==(const ReportField&, const ReportField&) = default;
};

/// A message of a session.
struct Report {
    double epoch = 0; ///< when it happened, seconds since 1970
    std::uint32_t category = 0;
    std::uint16_t type = 0;
    /// Says under which conditions the stream plays. Such reports make the session's play times, and are repeated to a
    /// service that was started anew.
    bool isCondition = false;
    std::vector<ReportField> fields;
};

struct SessionDescription {
    std::int64_t reporterID = 0;
    std::uint16_t serviceType = 0;
    std::optional<std::string> application;
    std::vector<ReportField> details; ///< further configuration
};

/// Takes the calls of the reporter's model, which come in the order of each session's life: created, then any number of
/// times started, sent to, stopped, and destroyed once it is stopped.
class ReportSink {
public:
    virtual ~ReportSink() = default;

    virtual void createSession(const SessionDescription& session) = 0;
    virtual void startSession(std::int64_t reporterID) = 0;
    virtual void send(std::int64_t reporterID, Report report) = 0;
    virtual void stopSession(std::int64_t reporterID) = 0;
    virtual void destroySession(std::int64_t reporterID) = 0;
};

enum class Transition : std::uint8_t {
    Start,     ///< from the stream's coming up to its running
    Move,      ///< silence while the stream goes to another device
    RateChange ///< silence while the device takes another format
};

/// Takes what the reporter measures of the graph.
class StatisticsSink {
public:
    virtual ~StatisticsSink() = default;

    virtual void addSink(const std::string& name) = 0;
    virtual void removeSink(const std::string& name) = 0;
    virtual void sinkState(const std::string& name, std::uint8_t state) = 0;
    /// Times in microseconds; none of a cycle that was not completed.
    struct CycleTimes {
        std::int64_t wait = 0; ///< from being told to run to beginning
        std::int64_t busy = 0; ///< from beginning to being done
    };
    virtual void sinkCycle(const std::string& name, const std::optional<CycleTimes>& times) = 0;
    virtual void sinkXruns(const std::string& name, std::int64_t count) = 0;
    virtual void streamCycle(bool capture, std::int64_t frames, const std::optional<CycleTimes>& times) = 0;
    /// How many streams of that direction run.
    virtual void runningStreams(bool capture, std::size_t count) = 0;
    virtual void transition(Transition kind, std::int64_t milliseconds) = 0;
};

} // namespace vela::reporter
