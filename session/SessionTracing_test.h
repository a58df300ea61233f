// A session of type "test" on fakes, with the feature on and everything that traces stand on.
#pragma once

#include "session/Session_test.h"
#include "session/TraceKeys.h"
#include "testing/FakeMetricsheet.h"
#include "testing/FakeProbe.h"
#include "testing/FakeProcessControl.h"
#include "testing/FakePropertyListReading.h"

namespace vela {

/// Lines of the session's traces.
inline CapturedLine traceLine(LogLevel level, std::string message) {
    return {level, "velart", "VelaReportingSession", std::move(message)};
}

class SessionTracingTest : public SessionTest {
protected:
    SessionTracingTest() {
        platform_.tracing = &tracePlatform_;
        client_ = platform::Identity{1000, 1000, {29}};
        setFeature(true);
        fileSystem_.addFile(kPath, "{ Children = ({ Name = T; Children = ({ Name = open; Type = Interval;"
                                   " SpoorCodeBegin = 21040010; SpoorCodeEnd = 21040014; }); }); }");
    }

    void setFeature(bool enabled) { device_.setFeature("AudioAnalytics", "Tracing", enabled); }
    /// Of type "test"; made at the first use, what that logged being forgotten.
    VelaReportingSession& testSession(const Dictionary& configuration = {}) {
        session().setServiceType(11);
        session().setConfiguration(configuration);
        log_.clear();
        return session();
    }
    /// As it would be with a parameters file, and no type.
    VelaReportingSession& kernelSession() { return testSession({{"VelaReportingKilnPlistFilePath", kPath}}); }
    VelaReportingSessionTracing& tracing() { return *session().tracing(); }

    bool probeWasUsed() const { return !probe_.calls().empty(); }
    bool kernelTraceRan() const {
        const auto calls = spoor_.calls();
        return std::find(calls.begin(), calls.end(), "create") != calls.end();
    }
    /// The platform tells the end of its trace.
    void complete(const std::string& url = "file:///traces/a.data",
                  const std::optional<platform::Failure>& error = std::nullopt) {
        tracing().performanceTraceDidComplete(url, "token", error);
    }
    /// Every trace of the platform ends when it is told to.
    void completeWhenStopped() { probe_.completeWhenStopped("file:///traces/a.data"); }
    std::vector<CapturedLine> linesOfTraces() const { return log_.linesOf("velart"); }

    static constexpr const char* kPath = "/srv/traces.plist";

    testing::FakeProbe probe_;
    testing::FakeMetricsheet metricsheet_;
    testing::FakeProcessControl processControl_;
    testing::FakePropertyListReading propertyLists_;
    VelaReportingTracePlatform tracePlatform_{
        device_, probe_, propertyLists_, {fileSystem_, metricsheet_, processControl_, spoor_, queues_, ""}};
};

} // namespace vela
