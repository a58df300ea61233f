// Reads single values of the D-Bus wire format: alignment, byte order, bounds. Every read is checked; the first error
// stays and empties what is left, so that all later reads answer zero. Confined to its owner's thread.
#pragma once

#include "platform/dbus/Names.h"
#include "platform/dbus/Protocol.h"

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <optional>
#include <string>
#include <string_view>
#include <type_traits>

namespace vela::platform::dbus {

template <class Unsigned>
constexpr Unsigned reversedBytes(Unsigned number) {
    if constexpr (sizeof(Unsigned) == 2) {
        return __builtin_bswap16(number);
    } else if constexpr (sizeof(Unsigned) == 4) {
        return __builtin_bswap32(number);
    } else {
        return __builtin_bswap64(number);
    }
}

class WireReader {
public:
    /// `bytes` stands at a multiple of 8 in its message and outlives the reader.
    WireReader(std::string_view bytes, bool foreignOrder) : bytes_(bytes), foreignOrder_(foreignOrder) {}

    template <class Number>
    Number number() {
        using Bits = std::conditional_t<
            sizeof(Number) == 1, std::uint8_t,
            std::conditional_t<sizeof(Number) == 2, std::uint16_t,
                               std::conditional_t<sizeof(Number) == 4, std::uint32_t, std::uint64_t>>>;
        if (!align(sizeof(Number)) || remaining() < sizeof(Number)) [[unlikely]] {
            return failShort(), Number{};
        }
        Bits bits = 0;
        std::memcpy(&bits, bytes_.data() + position_, sizeof(bits));
        position_ += sizeof(bits);
        if constexpr (sizeof(Bits) > 1) {
            if (foreignOrder_) {
                bits = reversedBytes(bits);
            }
        }
        return std::bit_cast<Number>(bits);
    }
    std::uint8_t byte() { return number<std::uint8_t>(); }
    bool boolean();
    std::string_view string();
    std::string_view objectPath();
    std::string_view signature();
    /// A variant's signature: exactly one complete type.
    std::string_view variantSignature() {
        // Nearly all are one basic type: its length, its code, NUL.
        if (remaining() >= 3 && bytes_[position_] == 1 && bytes_[position_ + 2] == '\0' &&
            isBasicType(bytes_[position_ + 1])) [[likely]] {
            const std::string_view type = bytes_.substr(position_ + 1, 1);
            position_ += 3;
            return type;
        }
        return otherVariantSignature();
    }
    /// The bytes of an array's elements, which this passes over.
    std::string_view array(std::size_t elementAlignment);
    /// Begins an array: where its elements end, which the caller reads up to and then hands to `endArray`.
    std::size_t beginArray(std::size_t elementAlignment);
    /// Fails when the elements did not end there.
    void endArray(std::size_t end);
    /// Skips zeros up to a multiple of `alignment`.
    bool align(std::size_t alignment) {
        const std::size_t to = (position_ + alignment - 1) & ~(alignment - 1);
        if (to == position_) {
            return true;
        }
        // Padding has fewer than eight bytes, so that one load shows all of it.
        if (remaining() >= sizeof(std::uint64_t) && beginsWithZeros(to - position_)) [[likely]] {
            position_ = to;
            return true;
        }
        return alignSlowly(to);
    }
    /// Passes over one value of a complete type, which is checked as if it were read.
    void skip(std::string_view type, unsigned depth = 0);

    std::size_t position() const { return position_; }
    std::size_t remaining() const { return bytes_.size() - position_; }
    bool failed() const { return error_.has_value(); }
    const std::optional<ProtocolError>& error() const { return error_; }
    /// Keeps the first error.
    void fail(std::string_view name, std::string text);
    /// The bytes are no message.
    void failMalformed(const char* text) { fail(kInconsistentMessageError, text); }

private:
    /// Whether the next `count` bytes, 1 to 7 of the eight that are there, are zeros.
    bool beginsWithZeros(std::size_t count) const {
        std::uint64_t eight = 0;
        std::memcpy(&eight, bytes_.data() + position_, sizeof(eight));
        const std::size_t otherBits = 8 * (sizeof(eight) - count);
        return (std::endian::native == std::endian::little ? eight << otherBits : eight >> otherBits) == 0;
    }
    bool alignSlowly(std::size_t to);
    void failShort();
    std::string_view otherVariantSignature();
    std::string_view terminated(std::size_t length);

    std::string_view bytes_;
    std::size_t position_ = 0;
    bool foreignOrder_;
    std::optional<ProtocolError> error_;
};

} // namespace vela::platform::dbus
