#include "cli/RunSteps.h"

#include "cli/JsonReading.h"
#include "common/SettingValues.h"
#include "common/values/Dictionary.h"

#include <istream>
#include <string>
#include <string_view>

namespace vela {

namespace {

constexpr std::string_view kForm = R"(a line is {"call":"OPERATION","args":[...]} or {"sleep":SECONDS})";

platform::Failure wrong(std::string reason) { return {0, std::move(reason)}; }

platform::Failure unknownMember(const Key& key) {
    return wrong("there is no member " + shownValue(std::string(key.text())) + ": " + std::string(kForm));
}

platform::Result<RunStep> readPause(const Dictionary& line) {
    constexpr double kLongest = 86400;
    const ValueRef seconds = line.find("sleep");
    if (line.size() > 1) {
        return wrong(R"(a line with "sleep" has no other member)");
    }
    if (!seconds.isNumber()) {
        return wrong(R"("sleep" is no number of seconds)");
    }
    RunStep step;
    step.seconds = seconds.doubleValue();
    if (!(step.seconds >= 0 && step.seconds <= kLongest)) {
        return wrong("a pause has 0 to 86400 seconds");
    }
    return step;
}

platform::Result<RunStep> readCall(const Dictionary& line) {
    const ValueRef call = line.find("call");
    const ValueRef arguments = line.find("args");
    if (!call.isString()) {
        return wrong(R"("call" is no text)");
    }
    RunStep step;
    step.operation = findOperation(call.text());
    if (step.operation == nullptr) {
        return wrong("there is no operation " + shownValue(std::string(call.text())));
    }
    if (arguments && !arguments.isArray()) {
        return wrong(R"("args" is no array)");
    }
    if (arguments) {
        const Array array = arguments.array();
        for (const ValueRef argument : array) {
            step.arguments.emplace_back(argument);
        }
    }
    return step;
}

platform::Result<RunStep> readStep(std::string_view text) {
    const platform::Result<Value> value = readJson(text);
    if (!value) {
        return value.failure();
    }
    if (!value->ref().isDictionary()) {
        return wrong(std::string(kForm));
    }
    const Dictionary line = value->ref().dictionary();
    for (const auto& [key, ignored] : line) {
        if (key != "call" && key != "args" && key != "sleep") {
            return unknownMember(key);
        }
    }
    if (line.find("sleep")) {
        return readPause(line);
    }
    return line.find("call") ? readCall(line) : wrong(std::string(kForm));
}

/// Why the call cannot be sent, or nothing.
platform::Result<platform::Done> tryOut(const RunStep& step) {
    std::string ignored;
    return appendCall(ignored, 1, *step.operation, step.arguments);
}

} // namespace

platform::Result<std::vector<RunStep>> readRunSteps(std::istream& in) {
    std::vector<RunStep> steps;
    std::string text;
    for (std::size_t line = 1; std::getline(in, text); ++line) {
        const std::size_t first = text.find_first_not_of(" \t\r");
        if (first == std::string::npos || text[first] == '#') {
            continue;
        }
        platform::Result<RunStep> step = readStep(text);
        if (step && step->operation != nullptr) {
            if (const auto tried = tryOut(*step); !tried) {
                step = tried.failure();
            }
        }
        if (!step) {
            return wrong(":" + std::to_string(line) + ": " + step.failure().description);
        }
        steps.push_back(*std::move(step));
        steps.back().line = line;
    }
    if (in.bad()) {
        return wrong(" cannot be read to its end");
    }
    return steps;
}

} // namespace vela
