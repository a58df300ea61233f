// The forms of D-Bus names and signatures, and texts about them. Pure functions.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace vela::platform::dbus {

/// What is wrong with a message. The name is a constant of Protocol.h; kInconsistentMessageError means that the bytes
/// are no message at all.
struct ProtocolError {
    std::string_view name;
    std::string text; ///< valid UTF-8, one line, of a few hundred bytes at most
};

/// Valid UTF-8 without NUL.
bool isValidText(std::string_view text);
bool isValidObjectPath(std::string_view path);
/// Also the form of an error's name.
bool isValidInterfaceName(std::string_view name);
bool isValidMemberName(std::string_view name);
/// Unique (":1.7") or well-known.
bool isValidBusName(std::string_view name);
/// Whether `code` is a type without parts: a number, a text or a descriptor.
constexpr bool isBasicType(char code) {
    // One bit for each of the letters.
    constexpr std::uint32_t kBasic = [] {
        std::uint32_t bits = 0;
        for (const char basic : std::string_view("ybnqiuxtdsogh")) {
            bits |= 1U << (static_cast<unsigned>(basic) - 'a');
        }
        return bits;
    }();
    const unsigned letter = static_cast<unsigned char>(code) - unsigned{'a'};
    return letter < 26 && (kBasic >> letter & 1U) != 0;
}
/// Any number of complete types within the protocol's limits of length and nesting.
bool isValidSignature(std::string_view signature);

/// Bytes of the first complete type of a signature that is valid and not empty.
std::size_t completeTypeBytes(std::string_view signature);
/// The alignment of values whose type begins with `code`, in bytes.
std::size_t alignmentOf(char code);

/// `text` in quotation marks for error texts: at most about 64 bytes, valid UTF-8 whatever `text` holds, without
/// control characters.
std::string quoted(std::string_view text);

} // namespace vela::platform::dbus
