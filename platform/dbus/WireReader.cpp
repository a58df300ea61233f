#include "platform/dbus/WireReader.h"

#include <algorithm>
#include <utility>

namespace vela::platform::dbus {

void WireReader::fail(std::string_view name, std::string text) {
    if (!error_) {
        error_ = ProtocolError{name, std::move(text)};
    }
    position_ = bytes_.size();
}

void WireReader::failShort() {
    if (!error_) {
        failMalformed("a value reaches behind the end");
    }
}

bool WireReader::alignSlowly(std::size_t to) {
    if (to > bytes_.size()) {
        return failShort(), false;
    }
    for (; position_ < to; ++position_) {
        if (bytes_[position_] != '\0') {
            return failMalformed("padding is not zero"), false;
        }
    }
    return true;
}

bool WireReader::boolean() {
    const auto bits = number<std::uint32_t>();
    if (bits > 1) [[unlikely]] {
        failMalformed("a boolean is neither 0 nor 1");
    }
    return bits == 1;
}

std::string_view WireReader::terminated(std::size_t length) {
    if (remaining() <= length) [[unlikely]] {
        return failShort(), std::string_view();
    }
    const std::string_view text = bytes_.substr(position_, length);
    if (bytes_[position_ + length] != '\0') [[unlikely]] {
        return failMalformed("a text does not end in NUL"), std::string_view();
    }
    position_ += length + 1;
    return text;
}

std::string_view WireReader::string() {
    const std::string_view text = terminated(number<std::uint32_t>());
    if (!isValidText(text)) [[unlikely]] {
        return failMalformed("a string is not valid UTF-8 or holds NUL"), std::string_view();
    }
    return text;
}

std::string_view WireReader::objectPath() {
    const std::string_view path = terminated(number<std::uint32_t>());
    if (!failed() && !isValidObjectPath(path)) [[unlikely]] {
        return failMalformed("an object path has not the form of one"), std::string_view();
    }
    return path;
}

std::string_view WireReader::signature() {
    const std::string_view signature = terminated(byte());
    if (!isValidSignature(signature)) [[unlikely]] {
        return failMalformed("a signature has not the form of one"), std::string_view();
    }
    return signature;
}

std::string_view WireReader::otherVariantSignature() {
    const std::string_view type = signature();
    if (type.empty() || (type.size() > 1 && completeTypeBytes(type) != type.size())) [[unlikely]] {
        if (!failed()) {
            failMalformed("a variant's signature is not one complete type");
        }
        return {};
    }
    return type;
}

std::size_t WireReader::beginArray(std::size_t elementAlignment) {
    const auto length = number<std::uint32_t>();
    if (length > kMaximumArrayBytes) [[unlikely]] {
        failMalformed("an array is longer than 64 MiB");
    } else if (align(elementAlignment) && remaining() < length) [[unlikely]] {
        failShort();
    }
    return failed() ? position_ : position_ + length;
}

void WireReader::endArray(std::size_t end) {
    if (position_ != end && !failed()) {
        failMalformed("an array's last element reaches behind the array's end");
    }
}

std::string_view WireReader::array(std::size_t elementAlignment) {
    const std::size_t end = beginArray(elementAlignment);
    const std::string_view elements = bytes_.substr(position_, end - position_);
    position_ = end;
    return elements;
}

void WireReader::skip(std::string_view type, unsigned depth) {
    constexpr unsigned kDeepest = 64;
    if (depth > kDeepest) {
        return failMalformed("values are nested too deeply");
    }
    const char code = type.front();
    if (code == 'v') {
        const std::string_view inner = variantSignature();
        return failed() ? void() : skip(inner, depth + 1);
    }
    if (code == 'a') {
        const std::string_view element = type.substr(1);
        const std::size_t end = beginArray(alignmentOf(element.front()));
        while (position_ < end) {
            skip(element, depth + 1);
        }
        return endArray(end);
    }
    if (code == '(' || code == '{') {
        align(8);
        for (std::string_view rest = type.substr(1); rest.size() > 1 && !failed();) {
            const std::size_t bytes = completeTypeBytes(rest);
            skip(rest.substr(0, bytes), depth + 1);
            rest.remove_prefix(bytes);
        }
        return;
    }
    switch (code) {
    case 'b':
        return static_cast<void>(boolean());
    case 's':
        return static_cast<void>(string());
    case 'o':
        return static_cast<void>(objectPath());
    case 'g':
        return static_cast<void>(signature());
    case 'y':
        return static_cast<void>(byte());
    case 'n':
    case 'q':
        return static_cast<void>(number<std::uint16_t>());
    case 'i':
    case 'u':
    case 'h':
        return static_cast<void>(number<std::uint32_t>());
    default:
        return static_cast<void>(number<std::uint64_t>()); // x, t, d
    }
}

} // namespace vela::platform::dbus
