#include "cli/Operations.h"

#include "common/VelaReportingUtility.h"
#include "common/values/Dictionary.h"
#include "platform/dbus/MessageWriter.h"
#include "platform/dbus/Protocol.h"

#include <algorithm>
#include <array>
#include <limits>
#include <optional>
#include <vector>

namespace vela {

namespace dbus = platform::dbus;

namespace {

constexpr std::array<OperationArgument, 1> kReporter{{{"REPORTER-ID", ArgumentKind::ReporterID}}};
constexpr std::array<OperationArgument, 2> kTypeOfReporter{
    {{"SERVICE-TYPE", ArgumentKind::ServiceType}, {"REPORTER-ID", ArgumentKind::ReporterID}}};
constexpr std::array<OperationArgument, 2> kConfigurationOfReporter{
    {{"CONFIGURATION", ArgumentKind::Dictionary}, {"REPORTER-ID", ArgumentKind::ReporterID}}};
constexpr std::array<OperationArgument, 4> kMessage{{{"MESSAGE", ArgumentKind::Dictionary},
                                                     {"CATEGORY", ArgumentKind::Category},
                                                     {"TYPE", ArgumentKind::EventType},
                                                     {"REPORTER-IDS", ArgumentKind::ReporterIDs}}};

constexpr std::array<Operation, 11> kOperations{{
    {dbus::kCreateReportingSession, "x", "b", kReporter},
    {dbus::kSetServiceType, "qx", "b", kTypeOfReporter},
    {dbus::kGetServiceNameForReporterID, "x", "q", kReporter},
    {dbus::kSetConfiguration, "a{sv}x", "b", kConfigurationOfReporter},
    {dbus::kStartReportingSessionForID, "x", "b", kReporter},
    {dbus::kSendMessage, "a{sv}uqaax", "", kMessage},
    {dbus::kStopReportingSessionForID, "x", "b", kReporter},
    {dbus::kDestroyReportingSession, "x", "b", kReporter},
    {dbus::kReporterID, "x", "a{sv}", kReporter},
    {dbus::kGetAllReporters, "", "ax", {}},
    {dbus::kKillService, "", "b", {}},
}};

platform::Failure wrong(const OperationArgument& argument, const std::string& reason) {
    return {0, std::string(argument.name) + " " + reason};
}

/// The number of `name` among those that `nameOf` names; the highest is `last`.
template <class NameOf>
std::optional<std::int64_t> numberOfName(std::string_view name, std::uint32_t last, NameOf nameOf) {
    for (std::uint32_t number = 1; number <= last; ++number) {
        if (nameOf(number) == name) {
            return number;
        }
    }
    return std::nullopt;
}

std::optional<std::int64_t> numberOfName(ArgumentKind kind, std::string_view name) {
    constexpr std::uint32_t kLastCategory = AudioEventCategoryHearingHealth;
    constexpr std::uint32_t kLastType = AudioEventTypeState;
    switch (kind) {
    case ArgumentKind::ServiceType: {
        const AudioServiceType type = VelaReportingUtilityGenerateServiceTypeFromServiceName(name);
        return type != AudioServiceTypeUnknown || name == "unknown" ? std::optional<std::int64_t>(type) : std::nullopt;
    }
    case ArgumentKind::Category:
        return numberOfName(name, kLastCategory, VelaReportingUtilityCategoryString);
    case ArgumentKind::EventType:
        return numberOfName(name, kLastType, VelaReportingUtilityTypeString);
    default:
        return std::nullopt;
    }
}

platform::Result<std::int64_t> numberOf(const OperationArgument& argument, ValueRef value, std::int64_t least,
                                        std::int64_t most) {
    if (value.isString()) {
        const std::optional<std::int64_t> number = numberOfName(argument.kind, value.text());
        return number ? platform::Result(*number) : wrong(argument, "is no known name");
    }
    if (value.kind() != ValueKind::Integer || value.integer() < least || value.integer() > most) {
        return wrong(argument, "is no whole number from " + std::to_string(least) + " to " + std::to_string(most));
    }
    return value.integer();
}

platform::Result<std::vector<std::int64_t>> reporterIDs(const OperationArgument& argument, ValueRef value) {
    std::vector<std::int64_t> numbers;
    if (!value.isArray()) {
        return wrong(argument, "is no list of whole numbers");
    }
    const Array array = value.array();
    for (const ValueRef element : array) {
        if (element.kind() != ValueKind::Integer) {
            return wrong(argument, "is no list of whole numbers");
        }
        numbers.push_back(element.integer());
    }
    return numbers;
}

template <class Number>
platform::Result<Number> numberAs(const OperationArgument& argument, ValueRef value) {
    using Limits = std::numeric_limits<Number>;
    const auto number =
        numberOf(argument, value, static_cast<std::int64_t>(Limits::min()), static_cast<std::int64_t>(Limits::max()));
    if (!number) {
        return number.failure();
    }
    return static_cast<Number>(*number);
}

/// Writes a number by `write`, or answers why it is none.
template <class Number>
std::optional<platform::Failure> writeNumber(dbus::MessageWriter& writer, void (dbus::MessageWriter::*write)(Number),
                                             const OperationArgument& argument, ValueRef value) {
    const platform::Result<Number> number = numberAs<Number>(argument, value);
    if (!number) {
        return number.failure();
    }
    (writer.*write)(*number);
    return std::nullopt;
}

std::optional<platform::Failure> write(dbus::MessageWriter& writer, const OperationArgument& argument, ValueRef value) {
    using Writer = dbus::MessageWriter;
    switch (argument.kind) {
    case ArgumentKind::ReporterID:
        return writeNumber<std::int64_t>(writer, &Writer::int64, argument, value);
    case ArgumentKind::Category:
        return writeNumber<std::uint32_t>(writer, &Writer::uint32, argument, value);
    case ArgumentKind::ServiceType:
    case ArgumentKind::EventType:
        return writeNumber<std::uint16_t>(writer, &Writer::uint16, argument, value);
    case ArgumentKind::Dictionary:
        if (!value.isDictionary()) {
            return wrong(argument, "is no dictionary");
        }
        writer.dictionary(value.dictionary());
        return std::nullopt;
    case ArgumentKind::ReporterIDs: {
        const auto numbers = reporterIDs(argument, value);
        if (!numbers) {
            return numbers.failure();
        }
        writer.optionalInt64s(*numbers);
        return std::nullopt;
    }
    }
    return std::nullopt;
}

bool isOptional(const OperationArgument& argument) { return argument.kind == ArgumentKind::ReporterIDs; }

std::optional<platform::Failure> writeArguments(dbus::MessageWriter& writer, const Operation& operation,
                                                std::span<const Value> arguments) {
    for (std::size_t number = 0; number < operation.arguments.size(); ++number) {
        const OperationArgument& argument = operation.arguments[number];
        if (number == arguments.size()) {
            writer.optionalInt64s(std::nullopt);
        } else if (auto fault = write(writer, argument, arguments[number])) {
            return fault;
        }
    }
    return std::nullopt;
}

} // namespace

std::span<const Operation> operations() { return kOperations; }

const Operation* findOperation(std::string_view name) {
    const auto* found = std::ranges::find(kOperations, name, &Operation::name);
    return found == kOperations.end() ? nullptr : found;
}

std::string usageOf(const Operation& operation) {
    std::string usage(operation.name);
    for (const OperationArgument& argument : operation.arguments) {
        const std::string name(argument.name);
        usage += isOptional(argument) ? " [" + name + "]" : " " + name;
    }
    return usage;
}

platform::Result<platform::Done> appendCall(std::string& bytes, std::uint32_t serial, const Operation& operation,
                                            std::span<const Value> arguments) {
    const std::size_t most = operation.arguments.size();
    const std::size_t least = most > 0 && isOptional(operation.arguments.back()) ? most - 1 : most;
    if (arguments.size() < least || arguments.size() > most) {
        return platform::Failure{0, "the operation is called as: " + usageOf(operation)};
    }
    const std::size_t before = bytes.size();
    dbus::MessageWriter writer(bytes);
    writer.beginCall({.serial = serial,
                      .path = dbus::kObjectPath,
                      .interface = dbus::kReportingInterface,
                      .member = operation.name,
                      .destination = dbus::kServiceName,
                      .signature = operation.signature,
                      .replyExpected = true});
    if (auto fault = writeArguments(writer, operation, arguments)) {
        bytes.resize(before);
        return *fault;
    }
    if (!writer.finish()) {
        return platform::Failure{0, "the arguments are too large for one call"};
    }
    return platform::Done();
}

platform::Result<Value> replyValue(const Operation& operation, const dbus::MessageHeader& reply) {
    if (reply.signature != operation.replySignature) {
        return platform::Failure{0, "the reply is of another kind than " + std::string(operation.name) + " answers"};
    }
    dbus::BodyReader body(reply);
    Value value;
    if (operation.replySignature == "b") {
        value = body.boolean();
    } else if (operation.replySignature == "q") {
        value = body.uint16();
    } else if (operation.replySignature == "a{sv}") {
        value = body.dictionary();
    } else if (operation.replySignature == "ax") {
        ArrayBuilder numbers;
        for (const std::int64_t number : body.int64s()) {
            numbers.add(number);
        }
        value = numbers.build();
    }
    body.finish();
    if (body.error()) {
        return platform::Failure{0, body.error()->text};
    }
    return value;
}

} // namespace vela
