// A call that waits for its answer: what the reply objects are made of. It is answered once; one that is destroyed
// unanswered answers for itself that no reply will come. May move between threads; one owner at a time.
#pragma once

#include "platform/Ipc.h"
#include "platform/dbus/ConnectionChannel.h"
#include "platform/dbus/MessageReader.h"

#include <cstdint>
#include <memory>
#include <string_view>
#include <utility>
#include <vector>

namespace vela::platform::dbus {

class PendingCall {
public:
    /// Counts as under way on the channel until it is answered or destroyed.
    PendingCall(std::shared_ptr<ConnectionChannel> channel, const MessageHeader& header)
        : channel_(std::move(channel)),
          serial_(header.serial),
          bytes_(static_cast<std::uint32_t>(header.body.size())),
          replyExpected_(header.replyExpected()) {
        channel_->callBegins(bytes_);
    }
    PendingCall(PendingCall&& other) noexcept = default;
    PendingCall& operator=(PendingCall&&) = delete;
    ~PendingCall() {
        if (channel_ != nullptr) {
            answerError(kNoReplyError, "The service will not answer this call");
        }
    }

    /// Sends a return whose arguments `write(writer)` appends. Nothing happens when the call was answered before.
    template <class Write>
    void answer(std::string_view signature, const Write& write) {
        end([&](MessageWriter& writer, std::uint32_t serial) {
            writer.beginReturn({.serial = serial, .replySerial = serial_, .signature = signature});
            write(writer);
            if (!writer.finish()) {
                writer.error(kLimitsExceededError, "The reply is larger than a message may be",
                             {.serial = serial, .replySerial = serial_});
            }
        });
    }
    void answerEmpty() {
        answer({}, [](MessageWriter&) {});
    }
    void answerError(std::string_view name, std::string_view text);
    void answerError(const IpcError& error);
    void answerError(const ProtocolError& error) { answerError(error.name, error.text); }
    /// Ends it without an answer: its connection is about to be closed.
    void drop() {
        const auto channel = std::exchange(channel_, nullptr);
        if (channel != nullptr && counted_) {
            channel->callEnds(bytes_);
        }
    }

    /// Leaves the counting to the token answered, until its last copy is gone.
    std::shared_ptr<void> countByToken();

private:
    /// Ends it with what `write(writer, serial)` appends, if an answer is wanted. Nothing happens when it was answered
    /// before.
    template <class Write>
    void end(const Write& write) {
        const auto channel = std::exchange(channel_, nullptr);
        if (channel == nullptr) {
            return;
        }
        if (replyExpected_ && counted_) {
            channel->callEnds(bytes_, write);
        } else if (replyExpected_) {
            channel->send(write);
        } else if (counted_) {
            channel->callEnds(bytes_);
        }
    }

    std::shared_ptr<ConnectionChannel> channel_; ///< none once answered
    std::uint32_t serial_;
    std::uint32_t bytes_; ///< of its arguments
    bool replyExpected_;
    bool counted_ = true;
};

// The replies of the operations, each of which answers `call`.
IpcReply<bool> booleanReply(PendingCall call);
IpcReply<std::uint16_t> uint16Reply(PendingCall call);
IpcReply<> emptyReply(PendingCall call);
IpcReply<Dictionary> reporterReply(PendingCall call);
IpcReply<std::vector<std::int64_t>> reporterIDsReply(PendingCall call);

} // namespace vela::platform::dbus
