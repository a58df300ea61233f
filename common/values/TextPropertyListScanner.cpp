#include "common/values/TextPropertyListScanner.h"

#include "common/values/NextStepCharacters.h"
#include "common/values/Utf8.h"

#include <algorithm>
#include <utility>

namespace vela::detail {

namespace {

bool isSpace(char character) { return character == ' ' || (character >= '\t' && character <= '\r'); }

bool isUnquoted(char character) {
    return (character >= 'A' && character <= 'Z') || (character >= 'a' && character <= 'z') ||
           (character >= '0' && character <= '9') ||
           std::string_view("_$/:.-").find(character) != std::string_view::npos;
}

std::optional<unsigned> hexDigit(char character) {
    if (character >= '0' && character <= '9') {
        return static_cast<unsigned>(character - '0');
    }
    if (character >= 'a' && character <= 'f') {
        return static_cast<unsigned>(character - 'a') + 10;
    }
    if (character >= 'A' && character <= 'F') {
        return static_cast<unsigned>(character - 'A') + 10;
    }
    return std::nullopt;
}

std::optional<char> simpleEscape(char character) {
    switch (character) {
    case 'a':
        return '\a';
    case 'b':
        return '\b';
    case 'f':
        return '\f';
    case 'n':
        return '\n';
    case 'r':
        return '\r';
    case 't':
        return '\t';
    case 'v':
        return '\v';
    case '\\':
    case '"':
    case '\'':
    case '\n':
        return character;
    default:
        return std::nullopt;
    }
}

bool isHighSurrogate(char32_t unit) { return unit >= 0xD800 && unit < 0xDC00; }
bool isLowSurrogate(char32_t unit) { return unit >= 0xDC00 && unit < 0xE000; }

bool isQuote(char character) { return character == '"' || character == '\''; }

} // namespace

bool TextPropertyListScanner::atString() const {
    return !atEnd() && (isQuote(text_[position_]) || isUnquoted(text_[position_]));
}

/// Skips white space and comments; false for a comment without an end.
bool TextPropertyListScanner::skipSpace() {
    while (!atEnd()) {
        if (isSpace(text_[position_])) {
            ++position_;
        } else if (startsWith("//")) {
            position_ = std::min(text_.find_first_of("\r\n", position_), text_.size());
        } else if (startsWith("/*")) {
            const std::size_t end = text_.find("*/", position_ + 2);
            if (end == std::string_view::npos) {
                return failHere("this comment has no end");
            }
            position_ = end + 2;
        } else {
            break;
        }
    }
    return true;
}

std::optional<std::string> TextPropertyListScanner::readString() {
    if (isQuote(text_[position_])) {
        return readQuoted();
    }
    const std::size_t start = position_;
    while (!atEnd() && isUnquoted(text_[position_])) {
        ++position_;
    }
    return std::string(text_.substr(start, position_ - start));
}

std::optional<std::string> TextPropertyListScanner::readQuoted() {
    const std::size_t start = position_;
    const char quote = text_[position_++];
    std::string string;
    while (!atEnd()) {
        const char character = text_[position_];
        if (character == quote) {
            ++position_;
            return string;
        }
        if (character != '\\') {
            string += character;
            ++position_;
        } else if (!readEscape(string)) {
            return std::nullopt;
        }
    }
    failAt(start, "this string has no end");
    return std::nullopt;
}

bool TextPropertyListScanner::readEscape(std::string& string) {
    const std::size_t start = position_++;
    if (atEnd()) {
        return failAt(start, "this escape has no end");
    }
    const char character = text_[position_];
    if (character >= '0' && character <= '7') {
        return readOctal(string);
    }
    if (character == 'U') {
        return readUnicode(string);
    }
    const auto simple = simpleEscape(character);
    if (!simple) {
        return failAt(start, "unknown escape");
    }
    string += *simple;
    ++position_;
    return true;
}

/// One to three octal digits: a character of the NextStep set.
bool TextPropertyListScanner::readOctal(std::string& string) {
    const std::size_t start = position_ - 1;
    unsigned number = 0;
    for (int digits = 0; digits < 3 && !atEnd() && text_[position_] >= '0' && text_[position_] <= '7'; ++digits) {
        number = number * 8 + static_cast<unsigned>(text_[position_++] - '0');
    }
    if (number > 0xFF) {
        return failAt(start, "an octal escape is at most \\377");
    }
    const char32_t character = number < 0x80 ? number : kNextStepUpperHalf[number - 0x80];
    if (number >= 0x80 && character == 0) {
        return failAt(start, "this octal escape names no character");
    }
    appendUtf8(string, character);
    return true;
}

/// A UTF-16 code unit, or two that make one character.
bool TextPropertyListScanner::readUnicode(std::string& string) {
    const std::size_t start = position_ - 1;
    auto unit = readUnicodeUnit();
    if (!unit) {
        return false;
    }
    if (isHighSurrogate(*unit) && startsWith("\\U")) {
        ++position_;
        const auto low = readUnicodeUnit();
        if (!low) {
            return false;
        }
        if (!isLowSurrogate(*low)) {
            return failAt(start, "this surrogate stands alone");
        }
        unit = 0x10000 + ((*unit - 0xD800) << 10U) + (*low - 0xDC00);
    } else if (isHighSurrogate(*unit) || isLowSurrogate(*unit)) {
        return failAt(start, "this surrogate stands alone");
    }
    appendUtf8(string, *unit);
    return true;
}

/// "U" and one to four hexadecimal digits.
std::optional<char32_t> TextPropertyListScanner::readUnicodeUnit() {
    ++position_;
    char32_t unit = 0;
    int digits = 0;
    for (; digits < 4 && !atEnd(); ++digits) {
        const auto digit = hexDigit(text_[position_]);
        if (!digit) {
            break;
        }
        unit = unit * 16 + *digit;
        ++position_;
    }
    if (digits == 0) {
        failExpecting("one to four hexadecimal digits after \\U");
        return std::nullopt;
    }
    return unit;
}

std::optional<std::string> TextPropertyListScanner::readData() {
    std::string bytes;
    for (++position_; !at('>'); position_ += 2) {
        while (!atEnd() && isSpace(text_[position_])) {
            ++position_;
        }
        if (at('>')) {
            break;
        }
        const auto high = atEnd() ? std::nullopt : hexDigit(text_[position_]);
        if (!high) {
            failExpecting("two hexadecimal digits or \">\"");
            return std::nullopt;
        }
        const auto low = position_ + 1 == text_.size() ? std::nullopt : hexDigit(text_[position_ + 1]);
        if (!low) {
            ++position_;
            failExpecting("the byte's second hexadecimal digit");
            return std::nullopt;
        }
        bytes += static_cast<char>(static_cast<unsigned char>((*high << 4U) | *low));
    }
    ++position_;
    return bytes;
}

bool TextPropertyListScanner::failAt(std::size_t offset, std::string reason) {
    errorOffset_ = offset;
    errorReason_ = std::move(reason);
    return false;
}

bool TextPropertyListScanner::failExpecting(const std::string& what) {
    return failHere(atEnd() ? "the text ends where " + what + " is expected" : what + " is expected here");
}

} // namespace vela::detail
