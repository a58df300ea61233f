#include "platform/dbus/PendingCall.h"

#include <string>

namespace vela::platform::dbus {

namespace {

/// A reply that answers an error, or its values by `write(writer, values...)`.
template <class Write, class... Types>
IpcReply<Types...> replyOf(PendingCall call, std::string_view signature, Write write) {
    return [call = std::move(call), signature, write](std::optional<IpcError> error, Types... values) mutable {
        if (error) {
            call.answerError(*error);
        } else {
            call.answer(signature, [&](MessageWriter& writer) { write(writer, values...); });
        }
    };
}

/// The reporter's description. Its keys have types of their own on the wire.
void writeReporter(MessageWriter& writer, const Dictionary& reporter) {
    const auto entries = writer.openDictionary();
    for (const auto& [key, value] : reporter) {
        writer.key(key.text());
        const bool isServiceType = key.text() == kServiceTypeKey && value.kind() == ValueKind::Integer &&
                                   value.integer() >= 0 && value.integer() <= 0xFFFF;
        if (isServiceType) {
            writer.variantUint16(static_cast<std::uint16_t>(value.integer()));
        } else {
            writer.variant(value);
        }
    }
    writer.closeArray(entries);
}

} // namespace

void PendingCall::answerError(std::string_view name, std::string_view text) {
    end([&](MessageWriter& writer, std::uint32_t serial) {
        writer.error(name, text, {.serial = serial, .replySerial = serial_});
    });
}

void PendingCall::answerError(const IpcError& error) {
    if (!error.limit.empty()) {
        return answerError(kLimitsExceededError, error.limit);
    }
    const std::string name = error.domain + ".Code" + std::to_string(error.code);
    answerError(isValidInterfaceName(name) ? std::string_view(name) : kFailedError,
                "Error " + std::to_string(error.code) + " of " + quoted(error.domain));
}

std::shared_ptr<void> PendingCall::countByToken() {
    counted_ = false;
    // The pointer keeps the channel for its deleter; what it points to means nothing.
    return std::shared_ptr<void>(channel_.get(),
                                 [channel = channel_, bytes = bytes_](void*) { channel->callEnds(bytes); });
}

IpcReply<bool> booleanReply(PendingCall call) {
    const auto write = [](MessageWriter& writer, bool value) { writer.boolean(value); };
    return replyOf<decltype(write), bool>(std::move(call), "b", write);
}

IpcReply<std::uint16_t> uint16Reply(PendingCall call) {
    const auto write = [](MessageWriter& writer, std::uint16_t value) { writer.uint16(value); };
    return replyOf<decltype(write), std::uint16_t>(std::move(call), "q", write);
}

IpcReply<> emptyReply(PendingCall call) {
    const auto write = [](MessageWriter&) {};
    return replyOf<decltype(write)>(std::move(call), {}, write);
}

IpcReply<Dictionary> reporterReply(PendingCall call) {
    return replyOf<decltype(&writeReporter), Dictionary>(std::move(call), "a{sv}", &writeReporter);
}

IpcReply<std::vector<std::int64_t>> reporterIDsReply(PendingCall call) {
    const auto write = [](MessageWriter& writer, const std::vector<std::int64_t>& ids) { writer.int64s(ids); };
    return replyOf<decltype(write), std::vector<std::int64_t>>(std::move(call), "ax", write);
}

} // namespace vela::platform::dbus
