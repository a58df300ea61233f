// Appends D-Bus messages to a text, in this machine's byte order.
//
//     MessageWriter writer(buffer);
//     writer.beginCall({.serial = 7, .path = ..., .interface = ..., .member = ..., .signature = "a{sv}x"});
//     writer.dictionary(configuration);
//     writer.int64(reporterID);
//     if (!writer.finish()) { ... too large; `buffer` is as it was }
//
// Confined to its owner's thread; the text outlives it, and nobody else uses it between begin and finish.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/dbus/Protocol.h"

#include <cassert>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace vela::platform::dbus {

/// What a call's header says. Texts must have the form of D-Bus names (asserted); empty ones are left out.
struct CallHeader {
    std::uint32_t serial = 0; ///< not 0
    std::string_view path = {};
    std::string_view interface = {};
    std::string_view member = {};
    std::string_view destination = {};
    std::string_view signature = {};
    bool replyExpected = true;
};

struct ReplyHeader {
    std::uint32_t serial = 0;      ///< of this message; not 0
    std::uint32_t replySerial = 0; ///< of the call
    std::string_view sender = {};
    std::string_view signature = {};
};

class MessageWriter {
public:
    explicit MessageWriter(std::string& buffer) : buffer_(buffer) {}

    // Each begins one message; its arguments follow in the signature's order, then `finish`.
    void beginCall(const CallHeader& header);
    void beginReturn(const ReplyHeader& header);
    void beginError(std::string_view name, ReplyHeader header);
    void beginSignal(const CallHeader& header);
    /// Ends the message. False, and nothing of it is left, when it passes the protocol's limits.
    [[nodiscard]] bool finish();

    /// A whole error message with a text.
    void error(std::string_view name, std::string_view text, ReplyHeader header);

    void boolean(bool value) { number<std::uint32_t>(value ? 1 : 0); } ///< b
    void byte(std::uint8_t value) { number(value); }                   ///< y
    void int16(std::int16_t value) { number(value); }                  ///< n
    void uint16(std::uint16_t value) { number(value); }                ///< q
    void int32(std::int32_t value) { number(value); }                  ///< i
    void uint32(std::uint32_t value) { number(value); }                ///< u
    void int64(std::int64_t value) { number(value); }                  ///< x
    void uint64(std::uint64_t value) { number(value); }                ///< t
    void real(double value) { number(value); }                         ///< d
    /// s or o. Bytes that are no valid UTF-8, and NUL, become U+FFFD.
    void string(std::string_view text);
    /// g; at most 255 bytes.
    void signature(std::string_view text) {
        assert(text.size() <= kMaximumSignatureBytes);
        char* const place = take(text.size() + 2);
        *place = static_cast<char>(text.size());
        text.copy(place + 1, text.size());
    }
    /// ay
    void data(std::string_view bytes);
    /// ax
    void int64s(std::span<const std::int64_t> numbers);
    /// aax: no element for none, else one.
    void optionalInt64s(const std::optional<std::vector<std::int64_t>>& numbers);
    /// a{sv}
    void dictionary(const Dictionary& dictionary);
    /// v: booleans b, integers x (t above its range), reals of either width d, strings s, data ay, dates (sd), arrays
    /// av, dictionaries a{sv}. `value` is not none.
    void variant(ValueRef value);
    // v of a fixed type, where readers expect one.
    void variantUint16(std::uint16_t value); ///< q
    void variantInt64(std::int64_t value);   ///< x

    /// How many bytes it takes as an argument.
    static std::size_t bytesOf(const Dictionary& dictionary);

    // Arrays piece by piece.
    struct OpenArray {
        std::size_t lengthAt = 0;   ///< where its length stands, from the start of the message
        std::size_t elementsAt = 0; ///< where its elements begin
    };
    OpenArray openArray(std::size_t elementAlignment);
    void closeArray(OpenArray array);
    /// a{sv}, followed by `key` and a variant each, and `closeArray`.
    OpenArray openDictionary() { return openArray(8); }
    void key(std::string_view text) {
        align(8);
        string(text);
    }

private:
    /// Room for a message of the usual size, made at once.
    static constexpr std::size_t kFirstRoom = 256;

    template <class Number>
    void number(Number value) {
        align(sizeof(value));
        std::memcpy(take(sizeof(value)), &value, sizeof(value));
    }
    void align(std::size_t alignment) { end_ += (alignment - position()) & (alignment - 1); }
    /// The place of the next so many bytes, which are 0.
    char* take(std::size_t bytes) {
        const std::size_t place = end_;
        end_ += bytes;
        if (end_ > buffer_.size()) [[unlikely]] {
            makeRoom();
        }
        return buffer_.data() + place;
    }
    void append(std::string_view bytes) { bytes.copy(take(bytes.size()), bytes.size()); }
    void makeRoom();
    void begin(MessageType type, std::uint8_t flags, std::uint32_t serial);
    void field(HeaderField code, std::string_view text, char type = 's');
    void replySerialField(std::uint32_t serial);
    void endFields(std::string_view signature);
    void array(const Array& array);
    void validString(std::string_view text);
    void put32(std::size_t at, std::uint32_t value) { std::memcpy(&buffer_[start_ + at], &value, sizeof(value)); }
    std::size_t position() const { return end_ - start_; }

    std::string& buffer_;
    std::size_t start_ = 0; ///< of the message in `buffer_`
    /// Of what was written. Behind it is room, all 0: padding and ends of strings are there already.
    std::size_t end_ = 0;
    std::size_t bodyAt_ = 0; ///< from the start of the message
    OpenArray fields_;
    bool tooLarge_ = false;
};

} // namespace vela::platform::dbus
