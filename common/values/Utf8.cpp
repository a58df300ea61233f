#include "common/values/Utf8.h"

#include <cstring>

namespace vela {

namespace {

struct Lead {
    std::uint32_t bytes; // of the whole character; 0 for a byte that begins none
    char32_t bits;       // that the lead byte gives
    char32_t smallest;   // code point that needs this many bytes
};

Lead leadOf(unsigned char byte) {
    if (byte < 0x80) {
        return {1, byte, 0};
    }
    if (byte >= 0xC2 && byte < 0xE0) {
        return {2, byte & 0x1FU, 0x80};
    }
    if (byte >= 0xE0 && byte < 0xF0) {
        return {3, byte & 0x0FU, 0x800};
    }
    if (byte >= 0xF0 && byte < 0xF5) {
        return {4, byte & 0x07U, 0x10000};
    }
    return {0, 0, 0};
}

} // namespace

Utf8Step utf8Step(std::string_view text) {
    const Lead lead = leadOf(static_cast<unsigned char>(text.front()));
    if (lead.bytes == 0 || lead.bytes > text.size()) {
        return {0, 1, false};
    }
    char32_t codePoint = lead.bits;
    for (std::uint32_t index = 1; index < lead.bytes; ++index) {
        const auto byte = static_cast<unsigned char>(text[index]);
        if ((byte & 0xC0U) != 0x80U) {
            return {0, 1, false};
        }
        codePoint = (codePoint << 6U) | (byte & 0x3FU);
    }
    const bool surrogate = codePoint >= 0xD800 && codePoint < 0xE000;
    if (codePoint < lead.smallest || surrogate || codePoint > 0x10FFFF) {
        return {0, 1, false};
    }
    return {codePoint, lead.bytes, true};
}

std::size_t asciiPrefix(std::string_view text) {
    std::size_t index = 0;
    while (index + sizeof(std::uint64_t) <= text.size()) {
        std::uint64_t eight = 0;
        std::memcpy(&eight, text.data() + index, sizeof(eight));
        if ((eight & 0x8080808080808080U) != 0) {
            break;
        }
        index += sizeof(eight);
    }
    while (index < text.size() && static_cast<unsigned char>(text[index]) < 0x80) {
        ++index;
    }
    return index;
}

bool isValidUtf8(std::string_view text) {
    while (true) {
        text.remove_prefix(asciiPrefix(text));
        if (text.empty()) {
            return true;
        }
        const Utf8Step step = utf8Step(text);
        if (!step.valid) {
            return false;
        }
        text.remove_prefix(step.bytes);
    }
}

void appendUtf8(std::string& text, char32_t codePoint) {
    const auto byte = [](char32_t value) { return static_cast<char>(static_cast<unsigned char>(value)); };
    if (codePoint < 0x80) {
        text += byte(codePoint);
    } else if (codePoint < 0x800) {
        text += {byte(0xC0U | (codePoint >> 6U)), byte(0x80U | (codePoint & 0x3FU))};
    } else if (codePoint < 0x10000) {
        text += {byte(0xE0U | (codePoint >> 12U)), byte(0x80U | ((codePoint >> 6U) & 0x3FU)),
                 byte(0x80U | (codePoint & 0x3FU))};
    } else {
        text += {byte(0xF0U | (codePoint >> 18U)), byte(0x80U | ((codePoint >> 12U) & 0x3FU)),
                 byte(0x80U | ((codePoint >> 6U) & 0x3FU)), byte(0x80U | (codePoint & 0x3FU))};
    }
}

} // namespace vela
