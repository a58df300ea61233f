#include "app/ServiceCheck.h"

#include "common/SettingValues.h"
#include "common/values/Dictionary.h"

#include <algorithm>
#include <atomic>
#include <memory>

namespace vela {

namespace {

using platform::FolderState;
using platform::PropertyListFormat;

constexpr std::size_t kSubjectColumns = 20;
constexpr std::size_t kOutcomeColumns = 9;

std::string_view outcomeText(CheckOutcome outcome) {
    switch (outcome) {
    case CheckOutcome::Fine:
        return "ok";
    case CheckOutcome::Note:
        return "note";
    case CheckOutcome::Missing:
        return "missing";
    }
    return {};
}

CheckFinding found(std::string subject, std::string text) {
    return {std::move(subject), CheckOutcome::Fine, std::move(text)};
}
CheckFinding noted(std::string subject, std::string text) {
    return {std::move(subject), CheckOutcome::Note, std::move(text)};
}
CheckFinding missing(std::string subject, std::string text) {
    return {std::move(subject), CheckOutcome::Missing, std::move(text)};
}

CheckFinding checkSettingsFile(const CheckedFacts& facts) {
    std::string text = facts.settingsFile ? escapedText(*facts.settingsFile) : "built-in defaults, no settings file";
    if (facts.singleSettings > 0) {
        text += ", and " + std::to_string(facts.singleSettings) + " of --set";
    }
    return found("settings", std::move(text));
}

CheckFinding checkLog(const Settings& settings, const CheckedFacts& facts) {
    if (!facts.logFailure.empty()) {
        return noted("log", escapedText(facts.logFailure) + "; lines go to standard error");
    }
    return found("log", settings.log.target == LogTarget::Journal ? "the system journal takes the lines"
                                                                  : "lines go to standard error");
}

/// An item that outlives the wait for it when the queue is too slow.
struct Errand {
    explicit Errand(platform::WorkQueues& queues) : done(queues.makeSemaphore(0)) {}

    std::unique_ptr<platform::Semaphore> done;
    std::atomic<bool> onItsQueue{false};
};

CheckFinding checkQueue(const std::string& subject, platform::WorkQueues& queues, platform::WorkQueue& queue,
                        platform::Nanoseconds patience) {
    const auto errand = std::make_shared<Errand>(queues);
    queue.post([errand, &queue] {
        errand->onItsQueue = queue.isCurrent();
        errand->done->signal();
    });
    if (!errand->done->wait(patience)) {
        return missing(subject, "an item that was posted did not run");
    }
    if (!errand->onItsQueue) {
        return missing(subject, "an item ran, but not as one of the queue");
    }
    return found(subject, "an item was posted and ran");
}

CheckFinding checkPriorities(const CheckedFacts& facts) {
    if (facts.threadPriorities) {
        return found("thread priorities", "applied");
    }
    return noted("thread priorities", "not applied: this process may not raise a thread's priority again "
                                      "(CAP_SYS_NICE or RLIMIT_NICE would allow it)");
}

CheckFinding checkProcesses(const platform::ProcessInformation& processes) {
    const std::string name = processes.ownName();
    platform::ProcessRecord own;
    if (name.empty() || !processes.read(processes.ownPid(), own)) {
        return missing("processes", "this process's own record cannot be read");
    }
    std::string text = "this is " + escapedText(name) + " (" + std::to_string(own.pid) + "), started by ";
    platform::ProcessRecord parent;
    if (!processes.read(own.parent, parent)) {
        return noted("processes", text + "a process that cannot be seen (" + std::to_string(own.parent) + ")");
    }
    return found("processes", text + escapedText(parent.commandName) + " (" + std::to_string(parent.pid) + ")");
}

CheckFinding checkFolder(const std::string& subject, const std::string& path, FolderState state) {
    const std::string shown = escapedText(path);
    switch (state) {
    case FolderState::Writable:
        return found(subject, shown + " is there and writable");
    case FolderState::CanBeCreated:
        return found(subject, shown + " can be created");
    case FolderState::NotWritable:
        return missing(subject, shown + " is not writable by this user");
    case FolderState::CannotBeCreated:
        return missing(subject, shown + " cannot be created by this user");
    case FolderState::NoFolder:
        return missing(subject, shown + " is no folder");
    }
    return missing(subject, shown);
}

/// A dictionary with every kind of value that a format keeps; the text form keeps texts only.
Value sample(PropertyListFormat format) {
    if (format == PropertyListFormat::Text) {
        return Dictionary{{"text", "one, \"two\""}, {"list", Array{"1", "2"}}, {"inner", Dictionary{{"key", "value"}}}};
    }
    return Dictionary{{"text", "one <two>"},
                      {"integer", -42},
                      {"real", 0.5},
                      {"boolean", true},
                      {"date", Date{1700000000}},
                      {"data", Data("\x01\x02")},
                      {"list", Array{1, "two"}},
                      {"inner", Dictionary{{"key", "value"}}}};
}

CheckFinding checkPropertyLists(const platform::PropertyListReading& propertyLists) {
    struct Named {
        PropertyListFormat format;
        const char* name;
    };
    for (const Named& named : {Named{PropertyListFormat::Xml, "XML"}, Named{PropertyListFormat::Binary, "binary"},
                               Named{PropertyListFormat::Text, "text"}}) {
        const Value written = sample(named.format);
        const platform::Result<std::string> bytes = propertyLists.write(written, named.format);
        if (!bytes) {
            return missing("property lists", std::string(named.name) + ": " + escapedText(bytes.failure().description));
        }
        const platform::Result<Value> read = propertyLists.read(*bytes);
        if (!read || !(*read == written)) {
            return missing("property lists", std::string(named.name) + ": what was written was not read back");
        }
    }
    return found("property lists", "XML, binary and text written and read back");
}

CheckFinding checkJson(const platform::JsonWriting& json) {
    const Value value = Dictionary{{"check", Array{true, 1, "two"}}};
    const platform::Result<std::string> text = json.write(value, JsonLayout::Compact);
    if (!text || *text != R"({"check":[true,1,"two"]})") {
        return missing("JSON", "a small object was not written as it should be");
    }
    return found("JSON", "written");
}

CheckFinding checkTrace(const CheckedFacts& facts) {
    if (!facts.traceFolder) {
        return noted("kernel trace", "no trace file system that this process can see");
    }
    return facts.traceInstances ? found("kernel trace", *facts.traceFolder + " takes trace instances")
                                : noted("kernel trace", *facts.traceFolder + " is there, not writable by this process");
}

CheckFinding checkPerformanceTool(const CheckedFacts& facts) {
    return facts.performanceTool ? found("performance trace", escapedText(*facts.performanceTool))
                                 : noted("performance trace", "there is no program named perf");
}

std::string padded(std::string_view text, std::size_t columns) {
    std::string result(text);
    result.resize(std::max(columns, text.size() + 1), ' ');
    return result;
}

} // namespace

std::vector<CheckFinding> checkService(const Settings& settings, const CheckedParts& parts, const CheckedFacts& facts,
                                       platform::Nanoseconds patience) {
    std::vector<CheckFinding> findings;
    findings.push_back(checkSettingsFile(facts));
    findings.push_back(checkLog(settings, facts));
    const auto serial = parts.queues.makeSerialQueue("com.orvex.vela.check", platform::QualityOfService::Default);
    findings.push_back(checkQueue("serial queue", parts.queues, *serial, patience));
    findings.push_back(checkQueue("background queue", parts.queues, parts.queues.background(), patience));
    findings.push_back(checkPriorities(facts));
    findings.push_back(checkProcesses(parts.processes));
    findings.push_back(checkFolder("state folder", settings.paths.state, facts.state));
    findings.push_back(checkFolder("runtime folder", settings.paths.runtime, facts.runtime));
    findings.push_back(checkPropertyLists(parts.propertyLists));
    findings.push_back(checkJson(parts.json));
    findings.push_back(checkTrace(facts));
    findings.push_back(checkPerformanceTool(facts));
    return findings;
}

bool isSomethingMissing(std::span<const CheckFinding> findings) {
    return std::ranges::any_of(findings,
                               [](const CheckFinding& finding) { return finding.outcome == CheckOutcome::Missing; });
}

std::string findingsAsText(std::span<const CheckFinding> findings) {
    std::string text;
    for (const CheckFinding& finding : findings) {
        text += padded(finding.subject, kSubjectColumns) + padded(outcomeText(finding.outcome), kOutcomeColumns) +
                finding.text + "\n";
    }
    return text;
}

std::string findingsAsJson(std::span<const CheckFinding> findings) {
    std::string lines;
    for (const CheckFinding& finding : findings) {
        const Value object = Dictionary{{"subject", std::string_view(finding.subject)},
                                        {"outcome", outcomeText(finding.outcome)},
                                        {"text", std::string_view(finding.text)}};
        appendJson(lines, object);
        lines += '\n';
    }
    return lines;
}

} // namespace vela
