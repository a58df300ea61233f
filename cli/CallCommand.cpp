// velactl call
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

#include <array>
#include <cerrno>
#include <ostream>
#include <vector>

namespace vela {

namespace {

constexpr std::array<CommandOption, 1> kCallOptions{{{"--json"}}};

void printJson(const Operation& operation, std::ostream& out) {
    ArrayBuilder arguments;
    for (const OperationArgument& argument : operation.arguments) {
        arguments.add(argument.name);
    }
    out << jsonText(Value(Dictionary{{"operation", operation.name},
                                     {"arguments", arguments.build()},
                                     {"signature", operation.signature},
                                     {"reply_signature", operation.replySignature}}))
        << '\n';
}

void listOperations(bool json, Console& console) {
    if (json) {
        for (const Operation& operation : operations()) {
            printJson(operation, console.out);
        }
        return;
    }
    console.out << "Operations; arguments are JSON, SERVICE-TYPE, CATEGORY and TYPE may be names:\n\n";
    for (const Operation& operation : operations()) {
        console.out << "  " << usageOf(operation) << '\n';
    }
}

/// Names of service types, categories and types may stand without the quotation marks that JSON asks for.
platform::Result<Value> readArgument(const OperationArgument* argument, std::string_view text) {
    const bool named =
        argument != nullptr && (argument->kind == ArgumentKind::ServiceType ||
                                argument->kind == ArgumentKind::Category || argument->kind == ArgumentKind::EventType);
    if (named && !text.empty() &&
        ((text.front() >= 'a' && text.front() <= 'z') || (text.front() >= 'A' && text.front() <= 'Z'))) {
        return Value(text);
    }
    return readJson(text);
}

int printReply(const Operation& operation, const platform::dbus::Reply& reply, Console& console) {
    if (reply.isError()) {
        console.error << "velactl: " << escapedText(std::string(reply.header.errorName)) << ": "
                      << escapedText(reply.errorText()) << '\n';
        return kFailed;
    }
    const platform::Result<Value> value = replyValue(operation, reply.header);
    if (!value) {
        console.error << "velactl: " << escapedText(value.failure().description) << '\n';
        return kFailed;
    }
    console.out << jsonText(*value) << '\n';
    return kDone;
}

int call(const Operation& operation, std::span<const Value> arguments, platform::dbus::BlockingConnection& connection,
         Console& console) {
    using platform::dbus::Reply;
    const std::uint32_t serial = connection.nextSerial();
    std::string bytes;
    platform::Result<platform::Done> done = appendCall(bytes, serial, operation, arguments);
    if (done) {
        done = connection.send(bytes);
    }
    const auto reply = done ? connection.receive(serial, kReplyPatience) : platform::Result<Reply>(done.failure());
    if (reply) {
        return printReply(operation, *reply, console);
    }
    // It never replies: the end of the connection tells that it worked.
    if (operation.name == platform::dbus::kKillService && reply.failure().code == ECONNRESET) {
        return kDone;
    }
    console.error << "velactl: " << escapedText(reply.failure().description) << '\n';
    return statusOf(reply.failure());
}

} // namespace

int runCall(std::span<const std::string_view> arguments, Console& console) {
    const platform::Result<CommandArguments> given = readArguments(arguments, kCallOptions);
    if (!given) {
        return refuseUsage("call", given.failure().description, console);
    }
    const std::span<const std::string> words(given->operands);
    if (words.empty()) {
        listOperations(given->has("--json"), console);
        return kDone;
    }
    const Operation* operation = findOperation(words.front());
    if (operation == nullptr) {
        return refuseUsage("call", "there is no operation " + quotedText(words.front()), console);
    }
    std::vector<Value> values;
    for (const std::string& text : words.subspan(1)) {
        const OperationArgument* argument =
            values.size() < operation->arguments.size() ? &operation->arguments[values.size()] : nullptr;
        platform::Result<Value> value = readArgument(argument, text);
        if (!value) {
            return refuseUsage(
                "call", "argument " + std::to_string(values.size() + 1) + ": " + value.failure().description, console);
        }
        values.push_back(*std::move(value));
    }
    const platform::LinuxClock clock;
    addMessageTimes(*operation, values, clock, clock.monotonicNow());
    // Tried before there is a connection: a wrong argument needs no service.
    std::string tried;
    if (const auto written = appendCall(tried, 1, *operation, values); !written) {
        return refuseUsage("call", written.failure().description, console);
    }
    auto connection = connectToService(console);
    return connection ? call(*operation, values, *connection, console) : kNoService;
}

} // namespace vela
