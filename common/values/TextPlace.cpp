#include "common/values/TextPlace.h"

#include "common/values/Utf8.h"

#include <algorithm>

namespace vela {

TextPlace textPlaceAt(std::string_view text, std::size_t offset) {
    TextPlace place;
    const std::size_t end = std::min(offset, text.size());
    for (std::size_t index = 0; index < end; ++index) {
        const char character = text[index];
        const bool firstOfTwo = character == '\r' && index + 1 < text.size() && text[index + 1] == '\n';
        if (character == '\n' || (character == '\r' && !firstOfTwo)) {
            ++place.line;
            place.column = 1;
        } else if ((static_cast<unsigned char>(character) & 0xC0U) != 0x80U && !firstOfTwo) {
            ++place.column;
        }
    }
    return place;
}

std::optional<std::size_t> firstInvalidUtf8(std::string_view text) {
    std::size_t offset = 0;
    while (true) {
        offset += asciiPrefix(text.substr(offset));
        if (offset == text.size()) {
            return std::nullopt;
        }
        const Utf8Step step = utf8Step(text.substr(offset));
        if (!step.valid) {
            return offset;
        }
        offset += step.bytes;
    }
}

} // namespace vela
