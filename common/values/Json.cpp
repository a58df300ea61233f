#include "common/values/Json.h"

#include "common/values/Dictionary.h"
#include "common/values/Numbers.h"
#include "common/values/TextualForm.h"
#include "common/values/Utf8.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstring>
#include <string_view>

namespace vela {

namespace {

constexpr char kHexDigits[] = "0123456789abcdef";
constexpr char kBase64Digits[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

// Bytes that a JSON string holds as they are: ASCII but control characters, quotation mark and backslash.
constexpr std::array<bool, 256> kPlain = [] {
    std::array<bool, 256> plain{};
    for (std::size_t byte = 0x20; byte < 0x80; ++byte) {
        plain[byte] = byte != '"' && byte != '\\' && byte != 0x7F;
    }
    return plain;
}();

constexpr std::uint64_t kEachByte = 0x0101010101010101;
constexpr std::uint64_t kHighBits = 0x8080808080808080;

// High bit set in every byte below `limit`; exact while no byte has its own high bit set.
constexpr std::uint64_t bytesBelow(std::uint64_t eight, std::uint64_t limit) {
    return (eight - kEachByte * limit) & ~eight;
}

bool eightArePlain(std::uint64_t eight) {
    const std::uint64_t special = bytesBelow(eight, 0x20) | bytesBelow(eight ^ (kEachByte * '"'), 1) |
                                  bytesBelow(eight ^ (kEachByte * '\\'), 1) | bytesBelow(eight ^ (kEachByte * 0x7F), 1);
    return ((special | eight) & kHighBits) == 0;
}

// The growing text: room is made before a piece is written, so that each byte is written without a test of its own.
class Sink {
public:
    explicit Sink(std::string& text) : text_(text), start_(text.size()), used_(text.size()) {}
    Sink(const Sink&) = delete;
    Sink& operator=(const Sink&) = delete;
    ~Sink() { text_.resize(used_); }

    /// A place for up to `bytes` bytes; `wrote` tells where they end.
    char* room(std::size_t bytes) {
        if (text_.size() - used_ < bytes) [[unlikely]] {
            grow(bytes);
        }
        return text_.data() + used_;
    }
    void wrote(const char* end) { used_ = static_cast<std::size_t>(end - text_.data()); }

    void add(char character) {
        *room(1) = character;
        ++used_;
    }
    void add(std::string_view piece) {
        std::memcpy(room(piece.size()), piece.data(), piece.size());
        used_ += piece.size();
    }
    /// As `add`, for a piece that may be read in blocks of 16 bytes.
    void addBlocks(std::string_view piece) {
        char* at = room(piece.size() + 16);
        for (std::size_t index = 0; index < piece.size(); index += 16) {
            std::memcpy(at + index, piece.data() + index, 16);
        }
        used_ += piece.size();
    }
    void add(std::size_t count, char character) {
        std::memset(room(count), character, count);
        used_ += count;
    }

private:
    void grow(std::size_t bytes) {
        // In proportion to what was written here, not to a long text that it is appended to.
        constexpr std::size_t kFirst = 480;
        text_.resize(used_ + std::max({kFirst, used_ - start_, bytes}));
    }

    std::string& text_;
    const std::size_t start_;
    std::size_t used_;
};

void addEscaped(Sink& json, char32_t codePoint) {
    constexpr std::string_view kNamed = "\b\t\n\f\r\"\\";
    constexpr std::string_view kNames = "btnfr\"\\";
    json.add('\\');
    if (const std::size_t index = kNamed.find(static_cast<char>(codePoint)); index != std::string_view::npos) {
        json.add(kNames[index]);
        return;
    }
    json.add("u00");
    json.add(kHexDigits[codePoint >> 4U]);
    json.add(kHexDigits[codePoint & 0xFU]);
}

// What stands where no plain byte does; takes it off `text`.
void addSpecial(Sink& json, std::string_view& text) {
    const Utf8Step step = utf8Step(text);
    if (!step.valid) {
        json.add("\xEF\xBF\xBD");
    } else if (step.codePoint < 0xA0) { // also what moves a terminal's cursor
        addEscaped(json, step.codePoint);
    } else {
        json.add(text.substr(0, step.bytes));
    }
    text.remove_prefix(step.bytes);
}

// Copies the plain bytes at the start of `text`, eight at a time while there are eight, and answers how many.
std::size_t addPlain(Sink& json, std::string_view text) {
    char* at = json.room(text.size());
    std::size_t index = 0;
    for (; index + sizeof(std::uint64_t) <= text.size(); index += sizeof(std::uint64_t)) {
        std::uint64_t eight = 0;
        std::memcpy(&eight, text.data() + index, sizeof(eight));
        if (!eightArePlain(eight)) {
            break;
        }
        std::memcpy(at + index, &eight, sizeof(eight));
    }
    while (index < text.size() && kPlain[static_cast<unsigned char>(text[index])]) {
        at[index] = text[index];
        ++index;
    }
    json.wrote(at + index);
    return index;
}

void addString(Sink& json, std::string_view text) {
    json.add('"');
    while (true) {
        text.remove_prefix(addPlain(json, text));
        if (text.empty()) {
            break;
        }
        addSpecial(json, text);
    }
    json.add('"');
}

void addBase64(Sink& json, std::string_view bytes) {
    json.add('"');
    for (std::size_t index = 0; index < bytes.size(); index += 3) {
        const std::size_t left = std::min<std::size_t>(3, bytes.size() - index);
        std::uint32_t group = 0;
        for (std::size_t offset = 0; offset < 3; ++offset) {
            group = (group << 8U) | (offset < left ? static_cast<unsigned char>(bytes[index + offset]) : 0U);
        }
        for (std::size_t digit = 0; digit < 4; ++digit) {
            json.add(digit <= left ? kBase64Digits[(group >> (18U - 6U * digit)) & 0x3FU] : '=');
        }
    }
    json.add('"');
}

void addReal(Sink& json, double number, ValueKind kind) {
    if (!std::isfinite(number)) {
        json.add("null");
        return;
    }
    char* begin = json.room(detail::kRealBytes + 2);
    char* end = detail::writeReal(begin, number, kind);
    const bool integral = std::none_of(begin, end, [](char character) { return character == '.' || character == 'e'; });
    if (integral) {
        *end++ = '.';
        *end++ = '0';
    }
    json.wrote(end);
}

template <class Integer>
void addInteger(Sink& json, Integer number) {
    constexpr std::size_t kDigits = 20;
    char* at = json.room(kDigits);
    json.wrote(std::to_chars(at, at + kDigits, number).ptr);
}

void addDate(Sink& json, Date date) {
    std::string text;
    if (!appendIso8601(text, date)) {
        json.add("null");
        return;
    }
    json.add('"');
    json.add(text);
    json.add('"');
}

class Writer {
public:
    Writer(std::string& json, JsonLayout layout, std::size_t depth)
        : json_(json),
          pretty_(layout == JsonLayout::Pretty),
          depth_(depth) {}

    void add(ValueRef value) {
        switch (value.kind()) {
        case ValueKind::None:
            json_.add("null");
            return;
        case ValueKind::Boolean:
            json_.add(value.boolean() ? std::string_view("true") : std::string_view("false"));
            return;
        case ValueKind::Integer:
            addInteger(json_, value.integer());
            return;
        case ValueKind::Unsigned:
            addInteger(json_, value.unsignedInteger());
            return;
        case ValueKind::Real:
        case ValueKind::Real32:
            addReal(json_, value.real(), value.kind());
            return;
        case ValueKind::String:
            addString(json_, value.text());
            return;
        case ValueKind::Data:
            addBase64(json_, value.bytes());
            return;
        case ValueKind::Date:
            addDate(json_, value.date());
            return;
        case ValueKind::Array:
            addArray(value.array());
            return;
        case ValueKind::Dictionary:
            addDictionary(value.dictionary());
            return;
        }
    }

    void addValues(const Dictionary& dictionary) {
        char before = '[';
        for (const auto& [key, value] : dictionary) {
            json_.add(std::exchange(before, ','));
            add(value);
        }
        json_.add(dictionary.empty() ? std::string_view("[]") : std::string_view("]"));
    }

private:
    void addArray(const Array& array) {
        if (array.empty()) {
            json_.add("[]");
            return;
        }
        char before = '[';
        ++depth_;
        for (const ValueRef value : array) {
            json_.add(std::exchange(before, ','));
            newLine();
            add(value);
        }
        --depth_;
        newLine();
        json_.add(']');
    }

    void addDictionary(const Dictionary& dictionary) {
        if (dictionary.empty()) {
            json_.add("{}");
            return;
        }
        char before = '{';
        ++depth_;
        for (const auto& [key, value] : dictionary) {
            json_.add(std::exchange(before, ','));
            newLine();
            addKey(key);
            add(value);
        }
        --depth_;
        newLine();
        json_.add('}');
    }

    void addKey(const Key& key) {
        if (key.object()->plain) {
            json_.addBlocks(key.object()->quoted());
        } else {
            addString(json_, key.text());
            json_.add(':');
        }
        if (pretty_) {
            json_.add(' ');
        }
    }

    void newLine() {
        if (pretty_) {
            json_.add('\n');
            json_.add(2 * depth_, ' ');
        }
    }

    Sink json_;
    const bool pretty_;
    std::size_t depth_;
};

} // namespace

void appendJsonValues(std::string& text, const Dictionary& dictionary) {
    Writer(text, JsonLayout::Compact, 0).addValues(dictionary);
}

void appendJsonString(std::string& json, std::string_view text) {
    Sink sink(json);
    addString(sink, text);
}

void appendJson(std::string& text, ValueRef value, JsonLayout layout, std::size_t depth) {
    Writer(text, layout, depth).add(value);
}

std::string jsonText(ValueRef value, JsonLayout layout) {
    std::string text;
    appendJson(text, value, layout);
    return text;
}

} // namespace vela
