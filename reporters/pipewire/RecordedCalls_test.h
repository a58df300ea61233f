// Sinks of the reporter's model that keep what they are given as lines of text, and times for tests.
#pragma once

#include "common/VelaReportingUtility.h"
#include "reporters/pipewire/Graph.h"
#include "reporters/pipewire/Reports.h"

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <string>
#include <utility>
#include <vector>

namespace vela::reporter {

/// Milliseconds of a test's time; 1970-01-01 00:16:40 UTC is 0.
inline Moment at(double milliseconds) {
    return {std::chrono::nanoseconds(static_cast<std::int64_t>(milliseconds * 1e6)), 1000 + milliseconds / 1000};
}

inline std::string numberText(double number) {
    char text[32];
    std::snprintf(text, sizeof(text), "%.6g", number);
    return text;
}

inline std::string fieldsText(const std::vector<ReportField>& fields) {
    std::string text;
    for (const ReportField& field : fields) {
        text += " " + field.key + "=";
        if (const auto* const flag = std::get_if<bool>(&field.value)) {
            text += *flag ? "true" : "false";
        } else if (const auto* const integer = std::get_if<std::int64_t>(&field.value)) {
            text += std::to_string(*integer);
        } else if (const auto* const real = std::get_if<double>(&field.value)) {
            text += numberText(*real);
        } else {
            text += "\"" + std::get<std::string>(field.value) + "\"";
        }
    }
    return text;
}

/// `send 7 Playback/Start @1000.02 start_count=1`.
class RecordedReports final : public ReportSink {
public:
    void createSession(const SessionDescription& session) override {
        add("create " + std::to_string(session.reporterID) + " " +
            std::string(VelaReportingUtilityGenerateServiceNameFromServiceType(session.serviceType)) + " " +
            session.application.value_or("-") + fieldsText(session.details));
    }
    void startSession(std::int64_t reporterID) override { add("start " + std::to_string(reporterID)); }
    void send(std::int64_t reporterID, Report report) override {
        char time[32];
        std::snprintf(time, sizeof(time), "%.3f", report.epoch);
        add("send " + std::to_string(reporterID) + " " +
            std::string(VelaReportingUtilityCategoryString(report.category)) + "/" +
            std::string(VelaReportingUtilityTypeString(report.type)) + " @" + time + fieldsText(report.fields));
    }
    void stopSession(std::int64_t reporterID) override { add("stop " + std::to_string(reporterID)); }
    void destroySession(std::int64_t reporterID) override { add("destroy " + std::to_string(reporterID)); }

    /// What came since the last time.
    std::vector<std::string> take() { return std::exchange(lines_, {}); }
    /// Those of them that hold `text`.
    std::vector<std::string> takeWith(const std::string& text) {
        std::vector<std::string> lines = take();
        std::erase_if(lines, [&](const std::string& line) { return line.find(text) == std::string::npos; });
        return lines;
    }

private:
    void add(std::string line) { lines_.push_back(std::move(line)); }

    std::vector<std::string> lines_;
};

class RecordedStatistics final : public StatisticsSink {
public:
    void addSink(const std::string& name) override { lines.push_back("add " + name); }
    void removeSink(const std::string& name) override { lines.push_back("remove " + name); }
    void sinkState(const std::string& name, std::uint8_t state) override {
        lines.push_back("state " + name + " " + textOf(static_cast<NodeState>(state)));
    }
    void sinkCycle(const std::string& name, const std::optional<CycleTimes>& times) override {
        lines.push_back("cycle " + name + timesText(times));
    }
    void sinkXruns(const std::string& name, std::int64_t count) override {
        lines.push_back("xruns " + name + " " + std::to_string(count));
    }
    void streamCycle(bool capture, std::int64_t frames, const std::optional<CycleTimes>& times) override {
        lines.push_back(std::string(capture ? "Rx " : "Tx ") + std::to_string(frames) + timesText(times));
    }
    void runningStreams(bool capture, std::size_t count) override { running[capture ? 1 : 0] = count; }
    void transition(Transition kind, std::int64_t milliseconds) override {
        const char* const names[] = {"start ", "move ", "rate "};
        lines.push_back(names[static_cast<std::size_t>(kind)] + std::to_string(milliseconds));
    }

    std::vector<std::string> take() { return std::exchange(lines, {}); }

    std::vector<std::string> lines;
    std::size_t running[2]{};

private:
    static std::string timesText(const std::optional<CycleTimes>& times) {
        return times ? " " + std::to_string(times->wait) + "+" + std::to_string(times->busy) : " incomplete";
    }
};

} // namespace vela::reporter
