// velactl run
#include "cli/JsonReading.h"
#include "cli/MessageTimes.h"
#include "cli/Operations.h"
#include "cli/ServiceConnection.h"
#include "cli/Subcommand.h"
#include "common/CommandOptions.h"
#include "common/SettingValues.h"
#include "common/values/Dictionary.h"
#include "common/values/Json.h"
#include "platform/dbus/Protocol.h"
#include "platform/linux/LinuxClock.h"

#include <cerrno>
#include <deque>
#include <fstream>
#include <istream>
#include <ostream>
#include <thread>
#include <vector>

namespace vela {

namespace {

/// One line of the file.
struct Step {
    std::size_t line = 0;
    const Operation* operation = nullptr; ///< null for a pause
    std::vector<Value> arguments;
    double seconds = 0; ///< of a pause
};

platform::Result<Step> readStep(std::string_view text) {
    const platform::Result<Value> value = readJson(text);
    if (!value) {
        return value.failure();
    }
    if (!value->ref().isDictionary()) {
        return platform::Failure{0, R"(a line is {"call":"OPERATION","args":[...]} or {"sleep":SECONDS})"};
    }
    const Dictionary line = value->ref().dictionary();
    Step step;
    if (const ValueRef seconds = line.find("sleep"); line.size() == 1 && seconds.isNumber()) {
        constexpr double kLongest = 86400;
        step.seconds = seconds.doubleValue();
        if (!(step.seconds >= 0 && step.seconds <= kLongest)) {
            return platform::Failure{0, "a pause has 0 to 86400 seconds"};
        }
        return step;
    }
    const ValueRef call = line.find("call");
    const ValueRef arguments = line.find("args");
    step.operation = call.isString() ? findOperation(call.text()) : nullptr;
    if (step.operation == nullptr || (arguments && !arguments.isArray()) || line.size() != (arguments ? 2U : 1U)) {
        return platform::Failure{0, R"(a line is {"call":"OPERATION","args":[...]} or {"sleep":SECONDS})"};
    }
    if (arguments) {
        const Array array = arguments.array();
        for (const ValueRef argument : array) {
            step.arguments.emplace_back(argument);
        }
    }
    return step;
}

/// All steps, each tried out: nothing is sent of a file that has a fault. A failure's text goes behind the file's name.
platform::Result<std::vector<Step>> readSteps(std::istream& in) {
    std::vector<Step> steps;
    std::string text;
    for (std::size_t line = 1; std::getline(in, text); ++line) {
        const std::size_t first = text.find_first_not_of(" \t\r");
        if (first == std::string::npos || text[first] == '#') {
            continue;
        }
        platform::Result<Step> step = readStep(text);
        std::string ignored;
        if (step && step->operation != nullptr) {
            if (const auto fault = appendCall(ignored, 1, *step->operation, step->arguments); !fault) {
                step = fault.failure();
            }
        }
        if (!step) {
            return platform::Failure{0, ":" + std::to_string(line) + ": " + step.failure().description};
        }
        steps.push_back(*std::move(step));
        steps.back().line = line;
    }
    if (in.bad()) {
        return platform::Failure{0, " cannot be read to its end"};
    }
    return steps;
}

/// Sends the steps one after another without waiting for replies, which are printed in the order of the lines.
class StepRunner {
public:
    StepRunner(platform::dbus::BlockingConnection& connection, Console& console)
        : connection_(connection),
          console_(console) {}

    int run(const std::vector<Step>& steps) {
        for (const Step& step : steps) {
            if (step.operation == nullptr) {
                console_.out.flush();
                std::this_thread::sleep_for(std::chrono::duration<double>(step.seconds));
            } else if (!send(step)) {
                return status_;
            }
            printWhatCame();
        }
        while (!pending_.empty()) {
            if (!printNext()) {
                return status_;
            }
        }
        return status_;
    }

private:
    struct Pending {
        std::size_t line;
        const Operation* operation;
        std::uint32_t serial;
    };

    bool send(const Step& step) {
        const std::uint32_t serial = connection_.nextSerial();
        std::string bytes;
        std::vector<Value> arguments = step.arguments;
        addMessageTimes(*step.operation, arguments, clock_, start_);
        if (const auto written = appendCall(bytes, serial, *step.operation, arguments); !written) {
            return fail(written.failure());
        }
        pending_.push_back({step.line, step.operation, serial});
        const auto sent = connection_.send(bytes);
        return sent ? true : fail(sent.failure());
    }

    void printWhatCame() {
        while (!pending_.empty() && connection_.hasReply(pending_.front().serial) && printNext()) {
        }
    }

    bool printNext() {
        const Pending next = pending_.front();
        auto reply = connection_.receive(next.serial, kReplyPatience);
        if (!reply && next.operation->name == platform::dbus::kKillService && reply.failure().code == ECONNRESET) {
            pending_.clear();
            return false; // it never replies
        }
        if (!reply) {
            return fail(reply.failure());
        }
        pending_.pop_front();
        print(next, *reply);
        return true;
    }

    void print(const Pending& call, const platform::dbus::Reply& reply) {
        DictionaryBuilder line;
        line.add("line", call.line);
        line.add("call", call.operation->name);
        const platform::Result<Value> value =
            reply.isError() ? platform::Failure{0, reply.errorText()} : replyValue(*call.operation, reply.header);
        if (value && *value) {
            line.add("reply", *value);
        } else if (!value) {
            line.add("error", reply.header.errorName);
            line.add("text", std::string_view(value.failure().description));
            status_ = kFailed;
        }
        console_.out << jsonText(Value(line.build())) << '\n';
    }

    bool fail(const platform::Failure& failure) {
        console_.error << "velactl: " << escapedText(failure.description) << '\n';
        status_ = statusOf(failure);
        return false;
    }

    platform::dbus::BlockingConnection& connection_;
    Console& console_;
    const platform::LinuxClock clock_;
    const platform::MonotonicTime start_ = clock_.monotonicNow();
    std::deque<Pending> pending_;
    int status_ = kDone;
};

} // namespace

int runRun(std::span<const std::string_view> arguments, Console& console) {
    const platform::Result<CommandArguments> read = readArguments(arguments, {});
    if (!read || read->operands.size() != 1) {
        return refuseUsage("run", read ? "one file is needed" : read.failure().description, console);
    }
    const std::string& file = read->operands.front();
    std::ifstream opened;
    if (file != "-") {
        opened.open(file);
        if (!opened) {
            console.error << "velactl: " << escapedText(file) << " cannot be read\n";
            return kFailed;
        }
    }
    const auto steps = readSteps(file == "-" ? console.in : opened);
    if (!steps) {
        console.error << "velactl: " << escapedText(file) << escapedText(steps.failure().description) << '\n';
        return kFailed;
    }
    auto connection = connectToService(console);
    return connection ? StepRunner(*connection, console).run(*steps) : kNoService;
}

} // namespace vela
