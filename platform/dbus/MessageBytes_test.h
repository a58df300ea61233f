// Messages spelt out byte by byte, for tests. `Bytes` appends numbers in either order.
#pragma once

#include "platform/dbus/WireReader.h"

#include <bit>
#include <cstdint>
#include <string>
#include <string_view>

namespace vela::platform::dbus {

enum class Order : char { Little = 'l', Big = 'B' };

class Bytes {
public:
    explicit Bytes(Order order = Order::Little) : order_(order) {}

    Bytes& u8(std::uint8_t value) { return put(value); }
    Bytes& u16(std::uint16_t value) { return put(value); }
    Bytes& u32(std::uint32_t value) { return put(value); }
    Bytes& u64(std::uint64_t value) { return put(value); }
    Bytes& f64(double value) { return put(std::bit_cast<std::uint64_t>(value)); }
    Bytes& raw(std::string_view bytes) {
        bytes_ += bytes;
        return *this;
    }
    Bytes& pad(std::size_t alignment, char filler = '\0') {
        while (bytes_.size() % alignment != 0) {
            bytes_.push_back(filler);
        }
        return *this;
    }
    /// s, o
    Bytes& text(std::string_view text) { return pad(4).u32(static_cast<std::uint32_t>(text.size())).raw(text).u8(0); }
    /// g
    Bytes& type(std::string_view text) { return u8(static_cast<std::uint8_t>(text.size())).raw(text).u8(0); }
    /// An array's length and elements, which begin at a multiple of `alignment`.
    Bytes& array(const Bytes& elements, std::size_t alignment) {
        return pad(4).u32(static_cast<std::uint32_t>(elements.bytes_.size())).pad(alignment).raw(elements.bytes_);
    }

    const std::string& bytes() const { return bytes_; }
    Order order() const { return order_; }
    operator std::string_view() const { return bytes_; }

private:
    template <class Number>
    Bytes& put(Number value) {
        for (std::size_t index = 0; index < sizeof(value); ++index) {
            const std::size_t place = order_ == Order::Little ? index : sizeof(value) - 1 - index;
            bytes_.push_back(static_cast<char>(static_cast<std::uint64_t>(value) >> (place * 8U) & 0xFFU));
        }
        return *this;
    }

    Order order_;
    std::string bytes_;
};

/// One header field in front of which eight bytes are aligned.
inline Bytes& textField(Bytes& fields, HeaderField code, std::string_view type, std::string_view text) {
    fields.pad(8).u8(static_cast<std::uint8_t>(code)).type(type);
    return type == "g" ? fields.type(text) : fields.text(text);
}

/// A whole message of these fields and this body.
inline std::string messageOf(MessageType type, const Bytes& fields, const Bytes& body, std::uint32_t serial = 7,
                             std::uint8_t flags = 0) {
    Bytes message(fields.order());
    message.u8(static_cast<std::uint8_t>(fields.order())).u8(static_cast<std::uint8_t>(type)).u8(flags).u8(1);
    message.u32(static_cast<std::uint32_t>(body.bytes().size())).u32(serial);
    return message.array(fields, 8).pad(8).raw(body).bytes();
}

/// A call of `member` with these arguments.
inline std::string callOf(std::string_view member, std::string_view signature, const Bytes& body,
                          std::uint32_t serial = 7, std::uint8_t flags = 0,
                          std::string_view interface = kReportingInterface, std::string_view path = kObjectPath) {
    Bytes fields(body.order());
    textField(fields, HeaderField::Path, "o", path);
    if (!interface.empty()) {
        textField(fields, HeaderField::Interface, "s", interface);
    }
    textField(fields, HeaderField::Member, "s", member);
    if (!signature.empty()) {
        textField(fields, HeaderField::Signature, "g", signature);
    }
    return messageOf(MessageType::MethodCall, fields, body, serial, flags);
}

} // namespace vela::platform::dbus
