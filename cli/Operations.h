// The protocol's operations as a person calls them: arguments and replies as property-list values. Pure.
#pragma once

#include "common/values/Value.h"
#include "platform/Result.h"
#include "platform/dbus/MessageReader.h"

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace vela {

/// What an argument may be; service types, categories and event types are numbers or their names.
enum class ArgumentKind : std::uint8_t { ReporterID, ServiceType, Category, EventType, Dictionary, ReporterIDs };

struct OperationArgument {
    std::string_view name;
    ArgumentKind kind;
};

struct Operation {
    std::string_view name;
    std::string_view signature; ///< of all arguments
    std::string_view replySignature;
    std::span<const OperationArgument> arguments;
};

/// In the protocol's order.
std::span<const Operation> operations();
/// Null for no such operation.
const Operation* findOperation(std::string_view name);
/// "sendMessage MESSAGE CATEGORY TYPE [REPORTER-IDS]"
std::string usageOf(const Operation& operation);

/// Appends the call to `bytes`. The last argument may be left out where it is a list of reporter IDs. The failure names
/// the argument.
platform::Result<platform::Done> appendCall(std::string& bytes, std::uint32_t serial, const Operation& operation,
                                            std::span<const Value> arguments);

/// The value of a reply, or none where the operation answers nothing.
platform::Result<Value> replyValue(const Operation& operation, const platform::dbus::MessageHeader& reply);

} // namespace vela
