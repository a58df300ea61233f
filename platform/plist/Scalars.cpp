#include "platform/plist/Scalars.h"

#include <algorithm>
#include <charconv>
#include <chrono>
#include <cstdint>
#include <limits>

namespace vela::platform::plist {

namespace {

bool isDigit(char character) { return character >= '0' && character <= '9'; }

/// Takes a sign off the start; true for "-".
bool takeSign(std::string_view& text) {
    const bool negative = text.starts_with('-');
    if (negative || text.starts_with('+')) {
        text.remove_prefix(1);
    }
    return negative;
}

std::size_t takeDigits(std::string_view& text) {
    const auto end = std::find_if_not(text.begin(), text.end(), isDigit);
    const auto count = static_cast<std::size_t>(end - text.begin());
    text.remove_prefix(count);
    return count;
}

bool isDecimalReal(std::string_view text) {
    std::size_t digits = takeDigits(text);
    if (text.starts_with('.')) {
        text.remove_prefix(1);
        digits += takeDigits(text);
    }
    if (digits == 0) {
        return false;
    }
    if (text.starts_with('e') || text.starts_with('E')) {
        text.remove_prefix(1);
        takeSign(text);
        if (takeDigits(text) == 0) {
            return false;
        }
    }
    return text.empty();
}

bool equalsIgnoringCase(std::string_view text, std::string_view lowerCase) {
    return std::equal(text.begin(), text.end(), lowerCase.begin(), lowerCase.end(), [](char left, char right) {
        return (left >= 'A' && left <= 'Z' ? static_cast<char>(left - 'A' + 'a') : left) == right;
    });
}

/// The number that `text`, digits only, says.
std::optional<int> digitsAt(std::string_view text, std::size_t offset, std::size_t count) {
    const std::string_view digits = text.substr(offset, count);
    if (!std::all_of(digits.begin(), digits.end(), isDigit)) {
        return std::nullopt;
    }
    int number = 0;
    for (const char digit : digits) {
        number = number * 10 + (digit - '0');
    }
    return number;
}

bool isXmlSpace(char character) {
    return character == ' ' || character == '\t' || character == '\n' || character == '\r';
}

std::optional<std::uint32_t> base64Digit(char character) {
    constexpr std::string_view kDigits = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    const std::size_t index = kDigits.find(character);
    if (index == std::string_view::npos) {
        return std::nullopt;
    }
    return static_cast<std::uint32_t>(index);
}

/// The one to three bytes of a group of four digits of which `padding` are "=".
std::optional<std::uint32_t> base64Group(std::string_view group, std::size_t padding) {
    std::uint32_t bits = 0;
    for (std::size_t index = 0; index < 4; ++index) {
        const auto digit = index >= 4 - padding ? 0 : base64Digit(group[index]);
        if (!digit) {
            return std::nullopt;
        }
        bits = (bits << 6U) | *digit;
    }
    const std::uint32_t unused = padding == 0 ? 0 : (padding == 1 ? 0xFFU : 0xFFFFU);
    if ((bits & unused) != 0) {
        return std::nullopt;
    }
    return bits;
}

} // namespace

std::optional<Value> parseInteger(std::string_view text) {
    constexpr auto kLargest = static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max());
    const bool negative = takeSign(text);
    const bool hexadecimal = text.starts_with("0x") || text.starts_with("0X");
    if (hexadecimal) {
        text.remove_prefix(2);
    } else if (text.size() > 1 && text.starts_with('0')) {
        return std::nullopt;
    }
    std::uint64_t magnitude = 0;
    const char* const end = text.data() + text.size();
    const auto [stop, error] = std::from_chars(text.data(), end, magnitude, hexadecimal ? 16 : 10);
    if (error != std::errc() || stop != end || (negative && magnitude > kLargest + 1)) {
        return std::nullopt;
    }
    return negative ? Value(static_cast<std::int64_t>(0 - magnitude)) : Value(magnitude);
}

std::optional<double> parseReal(std::string_view text) {
    const bool negative = takeSign(text);
    double number = 0;
    if (equalsIgnoringCase(text, "nan")) {
        number = std::numeric_limits<double>::quiet_NaN();
    } else if (equalsIgnoringCase(text, "inf") || equalsIgnoringCase(text, "infinity")) {
        number = std::numeric_limits<double>::infinity();
    } else if (!isDecimalReal(text) ||
               std::from_chars(text.data(), text.data() + text.size(), number).ec != std::errc()) {
        return std::nullopt;
    }
    return negative ? -number : number;
}

std::optional<Date> parseDate(std::string_view text) {
    constexpr std::string_view kForm = "0000-00-00T00:00:00Z";
    if (text.size() != kForm.size()) {
        return std::nullopt;
    }
    for (const std::size_t index : {4U, 7U, 10U, 13U, 16U, 19U}) {
        if (text[index] != kForm[index]) {
            return std::nullopt;
        }
    }
    const auto year = digitsAt(text, 0, 4);
    const auto month = digitsAt(text, 5, 2);
    const auto day = digitsAt(text, 8, 2);
    const auto hour = digitsAt(text, 11, 2);
    const auto minute = digitsAt(text, 14, 2);
    const auto second = digitsAt(text, 17, 2);
    if (!year || !month || !day || !hour || !minute || !second) {
        return std::nullopt;
    }
    const std::chrono::year_month_day calendar{std::chrono::year(*year),
                                               std::chrono::month(static_cast<unsigned>(*month)),
                                               std::chrono::day(static_cast<unsigned>(*day))};
    if (*year == 0 || !calendar.ok() || *hour > 23 || *minute > 59 || *second > 59) {
        return std::nullopt;
    }
    const std::int64_t days = std::chrono::sys_days(calendar).time_since_epoch().count();
    return Date{static_cast<double>(((days * 24 + *hour) * 60 + *minute) * 60 + *second)};
}

std::optional<std::string> parseBase64(std::string_view text) {
    std::string digits;
    std::copy_if(text.begin(), text.end(), std::back_inserter(digits), [](char each) { return !isXmlSpace(each); });
    if (digits.size() % 4 != 0) {
        return std::nullopt;
    }
    std::string bytes;
    for (std::size_t offset = 0; offset < digits.size(); offset += 4) {
        const std::string_view group = std::string_view(digits).substr(offset, 4);
        const bool last = offset + 4 == digits.size();
        const std::size_t padding = !last || group[3] != '=' ? 0 : (group[2] != '=' ? 1 : 2);
        const auto bits = base64Group(group, padding);
        if (!bits) {
            return std::nullopt;
        }
        for (std::size_t index = 0; index < 3 - padding; ++index) {
            bytes += static_cast<char>(static_cast<unsigned char>((*bits >> (16 - 8 * index)) & 0xFFU));
        }
    }
    return bytes;
}

} // namespace vela::platform::plist
