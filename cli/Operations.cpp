#include "cli/Operations.h"

#include "common/SettingValues.h"
#include "common/VelaReportingUtility.h"
#include "common/values/Dictionary.h"
#include "common/values/Json.h"
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

struct NamedNumber {
    std::string name;
    std::int64_t number;
};

/// What names stand for numbers of a kind: those that the service prints for one number only, so neither the category
/// "Undefined" nor the type "Generic".
std::vector<NamedNumber> namedNumbers(ArgumentKind kind) {
    std::vector<NamedNumber> names;
    if (kind == ArgumentKind::ServiceType) {
        for (std::uint32_t type = AudioServiceTypeGeneric; type <= AudioServiceTypeSystemSounds; ++type) {
            names.push_back({std::string(VelaReportingUtilityGenerateServiceNameFromServiceType(type)), type});
        }
        names.push_back({"unknown", AudioServiceTypeUnknown});
    } else if (kind == ArgumentKind::Category) {
        for (std::uint32_t category = AudioEventCategoryGeneric; category <= AudioEventCategoryHearingHealth;
             ++category) {
            names.push_back({VelaReportingUtilityCategoryString(category), category});
        }
    } else if (kind == ArgumentKind::EventType) {
        for (std::uint32_t type = AudioEventTypeStart; type <= AudioEventTypeState; ++type) {
            names.push_back({std::string(VelaReportingUtilityTypeString(type)), type});
        }
        names.push_back({"Unknown", AudioEventTypeUnknown});
    }
    return names;
}

/// A text or number for a message, with a space behind it; nothing for a container, which may be of any size.
std::string shownWithSpace(ValueRef value) {
    if (value.isString()) {
        return shownValue(std::string(value.text())) + ' ';
    }
    return value.isArray() || value.isDictionary() ? "" : jsonText(value) + ' ';
}

platform::Result<std::int64_t> numberOf(const OperationArgument& argument, ValueRef value, std::int64_t least,
                                        std::int64_t most) {
    if (value.kind() == ValueKind::Integer && value.integer() >= least && value.integer() <= most) {
        return value.integer();
    }
    const std::vector<NamedNumber> names = namedNumbers(argument.kind);
    if (value.isString()) {
        if (const auto found = std::ranges::find(names, value.text(), &NamedNumber::name); found != names.end()) {
            return found->number;
        }
    }
    std::string reason =
        shownWithSpace(value) + "is no whole number from " + std::to_string(least) + " to " + std::to_string(most);
    for (const NamedNumber& named : names) {
        reason += (&named == &names.front() ? " and none of the names " : ", ") + named.name;
    }
    return wrong(argument, reason);
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
        return platform::Failure{0, "the arguments are too large for one call: a D-Bus message has at most " +
                                        byteSizeText(std::int64_t{dbus::kMaximumMessageBytes}) +
                                        ", an array or data in it " +
                                        byteSizeText(std::int64_t{dbus::kMaximumArrayBytes})};
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
