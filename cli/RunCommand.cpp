// velactl run
#include "cli/MessageTimes.h"
#include "cli/Operations.h"
#include "cli/RunSteps.h"
#include "cli/ServiceConnection.h"
#include "cli/Subcommand.h"
#include "common/CommandOptions.h"
#include "common/SettingValues.h"
#include "common/values/Dictionary.h"
#include "common/values/Json.h"
#include "platform/dbus/Protocol.h"
#include "platform/linux/LinuxClock.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <deque>
#include <fstream>
#include <ostream>
#include <span>
#include <system_error>
#include <vector>

namespace vela {

namespace {

using platform::Done;
using platform::Failure;
using platform::Nanoseconds;
using platform::Result;

/// Sends the steps one after another without waiting for replies, which are printed in the order of the lines.
class StepRunner {
public:
    StepRunner(platform::dbus::BlockingConnection& connection, Console& console)
        : connection_(connection),
          console_(console) {}

    int run(std::span<const RunStep> steps) {
        while (!steps.empty()) {
            const RunStep& step = steps.front();
            steps = steps.subspan(1);
            if (const Result<Done> done = step.operation == nullptr ? pause(step.seconds) : send(step); !done) {
                const bool callsAreLeft =
                    std::ranges::any_of(steps, [](const RunStep& left) { return left.operation; });
                return endWith(done.failure(), callsAreLeft);
            }
            printWhatCame();
        }
        while (!pending_.empty()) {
            if (!connection_.hasReply(pending_.front().serial)) {
                console_.out.flush();
            }
            const auto reply = connection_.receive(pending_.front().serial, kReplyPatience);
            if (!reply) {
                return endWith(reply.failure(), false);
            }
            print(pending_.front(), *reply);
            pending_.pop_front();
        }
        return status_;
    }

private:
    struct Pending {
        std::size_t line;
        const Operation* operation;
        std::uint32_t serial;
    };

    Result<Done> send(const RunStep& step) {
        const std::uint32_t serial = connection_.nextSerial();
        std::string bytes;
        std::vector<Value> arguments = step.arguments;
        addMessageTimes(*step.operation, arguments, clock_, start_);
        if (const auto written = appendCall(bytes, serial, *step.operation, arguments); !written) {
            return written.failure();
        }
        pending_.push_back({step.line, step.operation, serial});
        return connection_.send(bytes, kReplyPatience);
    }

    /// Whoever watches sees the replies when they come, not when the pause is over.
    Result<Done> pause(double seconds) {
        const auto length = std::chrono::duration_cast<Nanoseconds>(std::chrono::duration<double>(seconds));
        const platform::MonotonicTime end = clock_.monotonicNow() + length;
        for (;;) {
            printWhatCame();
            console_.out.flush();
            const Result<bool> came = connection_.takeIn(end - clock_.monotonicNow());
            if (!came) {
                return came.failure();
            }
            if (!*came) {
                return Done();
            }
        }
    }

    void printWhatCame() {
        while (!pending_.empty() && connection_.hasReply(pending_.front().serial)) {
            printReply(pending_.front());
            pending_.pop_front();
        }
    }

    /// Prints every reply that came before the failure. A connection that ended because of a killService, which is
    /// never answered, is a failure only for the calls that were to be answered.
    int endWith(const Failure& failure, bool callsAreLeft) {
        takeInRest(failure);
        bool killed = false;
        bool unanswered = callsAreLeft;
        for (const Pending& call : pending_) {
            if (connection_.hasReply(call.serial)) {
                printReply(call);
            } else if (!killed && failure.code == ECONNRESET && call.operation->name == platform::dbus::kKillService) {
                killed = true;
                DictionaryBuilder line;
                beginLine(line, call);
                printLine(line);
            } else {
                unanswered = true;
            }
        }
        if (!killed || unanswered) {
            console_.out.flush();
            console_.error << "velactl: " << escapedText(failure.description) << '\n';
            status_ = statusOf(failure);
        }
        return status_;
    }

    /// What a service sent before it closed the connection may still be there when a sending has failed.
    void takeInRest(const Failure& failure) {
        bool more = failure.code == ECONNRESET;
        while (more) {
            const Result<bool> came = connection_.takeIn(Nanoseconds::zero());
            more = came && *came;
        }
    }

    /// Of a reply that has come.
    void printReply(const Pending& call) {
        if (const auto reply = connection_.receive(call.serial, Nanoseconds::zero())) {
            print(call, *reply);
        }
    }

    void print(const Pending& call, const platform::dbus::Reply& reply) {
        DictionaryBuilder line;
        beginLine(line, call);
        const Result<Value> value =
            reply.isError() ? Failure{0, reply.errorText()} : replyValue(*call.operation, reply.header);
        if (value && *value) {
            line.add("reply", *value);
        } else if (!value) {
            line.add("error", reply.header.errorName);
            line.add("text", std::string_view(value.failure().description));
            status_ = kFailed;
        }
        printLine(line);
    }

    static void beginLine(DictionaryBuilder& line, const Pending& call) {
        line.add("line", call.line);
        line.add("call", call.operation->name);
    }

    void printLine(DictionaryBuilder& line) { console_.out << jsonText(Value(line.build())) << '\n'; }

    platform::dbus::BlockingConnection& connection_;
    Console& console_;
    const platform::LinuxClock clock_;
    const platform::MonotonicTime start_ = clock_.monotonicNow();
    std::deque<Pending> pending_;
    int status_ = kDone;
};

} // namespace

int runRun(std::span<const std::string_view> arguments, Console& console) {
    const Result<CommandArguments> read = readArguments(arguments, {});
    if (!read || read->operands.size() != 1) {
        return refuseUsage("run", read ? "one file is needed" : read.failure().description, console);
    }
    const std::string& file = read->operands.front();
    std::ifstream opened;
    if (file != "-") {
        opened.open(file);
        if (!opened) {
            const std::error_code reason(errno, std::system_category());
            console.error << "velactl: " << escapedText(file) << " cannot be read: " << reason.message() << '\n';
            return kFailed;
        }
    }
    const auto steps = readRunSteps(file == "-" ? console.in : opened);
    if (!steps) {
        console.error << "velactl: " << escapedText(file) << escapedText(steps.failure().description) << '\n';
        return kFailed;
    }
    auto connection = connectToService(console);
    return connection ? StepRunner(*connection, console).run(*steps) : kNoService;
}

} // namespace vela
