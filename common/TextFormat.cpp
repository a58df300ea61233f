#include "common/TextFormat.h"

#include "common/values/Utf8.h"

#include <algorithm>
#include <cassert>
#include <charconv>
#include <cmath>
#include <iterator>

namespace vela {

namespace {

bool isPlainAscii(char character) { return character >= ' ' && character <= '~'; }

/// Whether a character may stand in a log line as it is.
bool isHarmless(char32_t codePoint) {
    const bool isControl = codePoint < 0x20 || (codePoint >= 0x7F && codePoint < 0xA0);
    const bool isSeparator = codePoint == 0x2028 || codePoint == 0x2029;
    const bool isBidirectional =
        (codePoint >= 0x202A && codePoint <= 0x202E) || (codePoint >= 0x2066 && codePoint <= 0x2069);
    return !isControl && !isSeparator && !isBidirectional;
}

void appendHexadecimal(std::string& text, char32_t number, int digits) {
    for (int shift = 4 * (digits - 1); shift >= 0; shift -= 4) {
        text += "0123456789abcdef"[(number >> static_cast<unsigned>(shift)) & 0xFU];
    }
}

void appendEscape(std::string& text, char32_t codePoint) {
    switch (codePoint) {
    case '\n':
        text += "\\n";
        return;
    case '\r':
        text += "\\r";
        return;
    case '\t':
        text += "\\t";
        return;
    default:
        break;
    }
    // Above ASCII the two forms differ: \x85 is a byte that is not UTF-8, \u0085 the character.
    text += codePoint < 0x80 ? "\\x" : "\\u";
    appendHexadecimal(text, codePoint, codePoint < 0x80 ? 2 : 4);
}

/// The bytes of the first `count` characters; a byte that begins none counts as one.
std::size_t bytesOfCharacters(std::string_view text, std::size_t count) {
    std::size_t bytes = 0;
    for (; count > 0 && bytes < text.size(); --count) {
        bytes += utf8Step(text.substr(bytes)).bytes;
    }
    return bytes;
}

std::size_t characters(std::string_view text) {
    std::size_t count = asciiPrefix(text);
    text.remove_prefix(count);
    for (; !text.empty(); ++count) {
        text.remove_prefix(utf8Step(text).bytes);
    }
    return count;
}

/// Escapes what was appended behind `start`.
void escapeFrom(std::string& text, std::size_t start) {
    if (!std::all_of(text.begin() + static_cast<std::ptrdiff_t>(start), text.end(), isPlainAscii)) {
        const std::string appended = text.substr(start);
        text.resize(start);
        appendEscaped(text, appended);
    }
}

/// Writes one argument behind a text as its conversion wants it.
class ArgumentWriter {
public:
    ArgumentWriter(std::string& text, const detail::Conversion& conversion, detail::ArgumentBytes bytes)
        : text_(text),
          conversion_(conversion),
          escaped_(bytes == detail::ArgumentBytes::Escaped) {}

    void operator()(std::monostate) const { writeText("(null)"); }
    void operator()(char character) const { writeText({&character, 1}); }
    void operator()(std::string_view string) const { writeText(string); }
    void operator()(float real) const { writeReal(real); }
    void operator()(double real) const { writeReal(real); }
    void operator()(std::uint64_t integer) const { writeInteger({}, integer); }
    void operator()(std::int64_t integer) const {
        const auto magnitude = static_cast<std::uint64_t>(integer);
        if (integer < 0) {
            writeInteger("-", 0 - magnitude);
        } else {
            writeInteger({}, magnitude);
        }
    }
    void operator()(const detail::Description& description) const {
        const std::size_t start = text_.size();
        description.append(text_, description.object);
        cutTo(start);
        if (escaped_) {
            escapeFrom(text_, start);
        }
        pad(start);
    }

private:
    void writeText(std::string_view string) const {
        const std::size_t start = text_.size();
        if (conversion_.precision) {
            string = string.substr(0, bytesOfCharacters(string, *conversion_.precision));
        }
        if (escaped_) {
            appendEscaped(text_, string);
        } else {
            text_ += string;
        }
        pad(start);
    }

    void writeInteger(std::string_view sign, std::uint64_t magnitude) const {
        char digits[20];
        const bool isHexadecimal = conversion_.letter == 'x' || conversion_.letter == 'X';
        char* const end = std::to_chars(digits, std::end(digits), magnitude, isHexadecimal ? 16 : 10).ptr;
        if (conversion_.letter == 'X') {
            std::transform(digits, end, digits,
                           [](char digit) { return digit >= 'a' ? static_cast<char>(digit - 32) : digit; });
        }
        writeNumber(sign, {digits, end}, conversion_.precision.value_or(1), !conversion_.precision);
    }

    template <class Real>
    void writeReal(Real real) const {
        if (conversion_.letter == '@') {
            const std::size_t start = text_.size();
            appendTextualForm(text_, Value(real));
            cutTo(start);
            pad(start);
            return;
        }
        // The longest: a sign, 309 digits, a point and kLargestPrecision decimals.
        char digits[448];
        const auto form = conversion_.letter == 'f' ? std::chars_format::fixed : std::chars_format::general;
        const int precision = static_cast<int>(conversion_.precision.value_or(6));
        const auto written = std::to_chars(digits, std::end(digits), static_cast<double>(real), form, precision);
        assert(written.ec == std::errc());
        const bool isNegative = digits[0] == '-';
        const char* const first = digits + (isNegative ? 1 : 0);
        writeNumber(isNegative ? "-" : "", {first, written.ptr}, 1, std::isfinite(real));
    }

    /// A number of at least `leastDigits` digits, filled up to the width with zeros where these are wanted and
    /// `mayFill`.
    void writeNumber(std::string_view sign, std::string_view digits, std::size_t leastDigits, bool mayFill) const {
        const std::size_t start = text_.size();
        if (conversion_.zeros && !conversion_.left && mayFill && conversion_.width > sign.size()) {
            leastDigits = std::max(leastDigits, conversion_.width - sign.size());
        }
        text_ += sign;
        text_.append(leastDigits > digits.size() ? leastDigits - digits.size() : 0, '0');
        text_ += digits;
        pad(start);
    }

    void cutTo(std::size_t start) const {
        if (conversion_.precision) {
            text_.resize(start + bytesOfCharacters(std::string_view(text_).substr(start), *conversion_.precision));
        }
    }

    void pad(std::size_t start) const {
        if (conversion_.width == 0) {
            return;
        }
        const std::size_t length = characters(std::string_view(text_).substr(start));
        if (length < conversion_.width) {
            text_.insert(conversion_.left ? text_.size() : start, conversion_.width - length, ' ');
        }
    }

    std::string& text_;
    const detail::Conversion& conversion_;
    const bool escaped_;
};

} // namespace

void appendEscaped(std::string& text, std::string_view untrusted) {
    while (true) {
        const auto* const plainEnd = std::find_if_not(untrusted.begin(), untrusted.end(), isPlainAscii);
        const auto plain = static_cast<std::size_t>(plainEnd - untrusted.begin());
        text += untrusted.substr(0, plain);
        untrusted.remove_prefix(plain);
        if (untrusted.empty()) {
            return;
        }
        const Utf8Step step = utf8Step(untrusted);
        if (!step.valid) {
            text += "\\x";
            appendHexadecimal(text, static_cast<unsigned char>(untrusted.front()), 2);
        } else if (isHarmless(step.codePoint)) {
            text += untrusted.substr(0, step.bytes);
        } else {
            appendEscape(text, step.codePoint);
        }
        untrusted.remove_prefix(step.bytes);
    }
}

namespace detail {

void appendFormattedArguments(std::string& text, std::string_view format, std::span<const FormatArgument> arguments,
                              ArgumentBytes bytes) {
    std::size_t next = 0;
    for (auto percent = format.find('%'); percent != std::string_view::npos; percent = format.find('%')) {
        text += format.substr(0, percent);
        format.remove_prefix(percent + 1);
        const Conversion conversion = takeConversion(format);
        if (conversion.letter == '%') {
            text += '%';
            continue;
        }
        assert(conversion.letter != '\0' && next < arguments.size());
        std::visit(ArgumentWriter(text, conversion, bytes), arguments[next]);
        ++next;
    }
    text += format;
}

} // namespace detail

} // namespace vela
