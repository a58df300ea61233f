#include "common/values/TextualForm.h"

#include "common/values/Dictionary.h"
#include "common/values/Numbers.h"
#include "common/values/Utf8.h"

#include <algorithm>
#include <string_view>

namespace vela {

namespace {

constexpr char kHexDigits[] = "0123456789abcdef";

bool isUnquoted(char character) {
    return (character >= 'a' && character <= 'z') || (character >= 'A' && character <= 'Z') ||
           (character >= '0' && character <= '9') || character == '_' || character == '$' || character == '/' ||
           character == ':' || character == '.';
}

// A reader takes "//" for a comment. "-" could stand unquoted as well; quoted it is seen to be text.
bool needsQuotes(std::string_view text) {
    return text.empty() || !std::all_of(text.begin(), text.end(), isUnquoted) ||
           text.find("//") != std::string_view::npos;
}

void appendControl(std::string& text, unsigned char character) {
    constexpr std::string_view kNamed = "\a\b\t\n\v\f\r";
    constexpr std::string_view kNames = "abtnvfr";
    text += '\\';
    if (const std::size_t index = kNamed.find(static_cast<char>(character)); index != std::string_view::npos) {
        text += kNames[index];
        return;
    }
    for (const unsigned shift : {6U, 3U, 0U}) {
        text += static_cast<char>('0' + ((character >> shift) & 7U));
    }
}

void appendQuoted(std::string& text, std::string_view content) {
    text += '"';
    while (!content.empty()) {
        const Utf8Step step = utf8Step(content);
        const char first = content.front();
        if (!step.valid) {
            appendUtf8(text, 0xFFFD);
        } else if (first == '"' || first == '\\') {
            text += {'\\', first};
        } else if (step.codePoint < 0x20 || step.codePoint == 0x7F) {
            appendControl(text, static_cast<unsigned char>(first));
        } else {
            text += content.substr(0, step.bytes);
        }
        content.remove_prefix(step.bytes);
    }
    text += '"';
}

void appendLeafText(std::string& text, std::string_view content) {
    if (needsQuotes(content)) {
        appendQuoted(text, content);
    } else {
        text += content;
    }
}

void appendData(std::string& text, std::string_view bytes) {
    text += '<';
    for (const char byte : bytes) {
        text += kHexDigits[static_cast<unsigned char>(byte) >> 4U];
        text += kHexDigits[static_cast<unsigned char>(byte) & 0xFU];
    }
    text += '>';
}

void appendInside(std::string& text, ValueRef value);

void appendContainer(std::string& text, const Array& array) {
    text += '(';
    std::string_view separator;
    for (const ValueRef value : array) {
        text += separator;
        appendInside(text, value);
        separator = ", ";
    }
    text += ')';
}

void appendContainer(std::string& text, const Dictionary& dictionary) {
    text += '{';
    std::string_view separator;
    for (const auto& [key, value] : dictionary) {
        text += separator;
        appendLeafText(text, key.text());
        text += " = ";
        appendInside(text, value);
        text += ';';
        separator = " ";
    }
    text += '}';
}

void appendInside(std::string& text, ValueRef value) {
    switch (value.kind()) {
    case ValueKind::String:
        appendLeafText(text, value.text());
        return;
    case ValueKind::Data:
    case ValueKind::Array:
    case ValueKind::Dictionary:
        appendTextualForm(text, value);
        return;
    default:
        appendLeafText(text, textualForm(value));
        return;
    }
}

} // namespace

void appendDate(std::string& text, Date date) {
    const std::optional<detail::CivilTime> time = detail::civilTime(date);
    if (!time) {
        text += "(invalid date)";
        return;
    }
    detail::appendDayAndTime(text, *time, ' ');
    text += " +0000";
}

bool appendIso8601(std::string& text, Date date) {
    const std::optional<detail::CivilTime> time = detail::civilTime(date);
    if (!time) {
        return false;
    }
    detail::appendDayAndTime(text, *time, 'T');
    if (time->millisecond != 0) {
        text += '.';
        detail::appendPadded(text, time->millisecond, 3);
    }
    text += 'Z';
    return true;
}

void appendTextualForm(std::string& text, ValueRef value) {
    switch (value.kind()) {
    case ValueKind::None:
        text += "(null)";
        return;
    case ValueKind::Boolean:
        text += value.boolean() ? '1' : '0';
        return;
    case ValueKind::Integer:
        detail::appendNumber(text, value.integer());
        return;
    case ValueKind::Unsigned:
        detail::appendNumber(text, value.unsignedInteger());
        return;
    case ValueKind::Real:
    case ValueKind::Real32:
        detail::appendReal(text, value.real(), value.kind());
        return;
    case ValueKind::Date:
        appendDate(text, value.date());
        return;
    case ValueKind::String:
        text += value.text();
        return;
    case ValueKind::Data:
        appendData(text, value.bytes());
        return;
    case ValueKind::Array:
        appendContainer(text, value.array());
        return;
    case ValueKind::Dictionary:
        appendContainer(text, value.dictionary());
        return;
    }
}

std::string textualForm(ValueRef value) {
    std::string text;
    appendTextualForm(text, value);
    return text;
}

} // namespace vela
