// Numbers and dates in text, whatever the locale. Pure functions.
#pragma once

#include "common/values/Value.h"

#include <charconv>
#include <chrono>
#include <optional>
#include <string>

namespace vela::detail {

template <class Number>
void appendNumber(std::string& text, Number number) {
    char digits[32]; // the longest: a double's 17 digits, sign, point and exponent
    const std::to_chars_result result = std::to_chars(digits, digits + sizeof(digits), number);
    text.append(digits, result.ptr);
}

/// Longest text of `writeReal`.
constexpr std::size_t kRealBytes = 32;

/// Writes the fewest digits that name the number (as a 32-bit float where it is one) and answers the end: plain digits
/// from 0.00001 to below 10^16, an exponent beyond. An integral number has no point.
char* writeReal(char* at, double number, ValueKind kind);

void appendReal(std::string& text, double number, ValueKind kind);

/// A date taken apart, in UTC.
struct CivilTime {
    int year;
    unsigned month;
    unsigned day;
    unsigned hour;
    unsigned minute;
    unsigned second;
    unsigned millisecond;
};

/// None for what is not a number or outside the years 1 to 9999.
inline std::optional<CivilTime> civilTime(Date date) {
    constexpr double kFirst = -62135596800.0; // 0001-01-01 00:00:00
    constexpr double kEnd = 253402300800.0;   // 10000-01-01 00:00:00
    if (!(date.seconds >= kFirst && date.seconds < kEnd)) {
        return std::nullopt;
    }
    const auto milliseconds =
        std::chrono::floor<std::chrono::milliseconds>(std::chrono::duration<double>(date.seconds));
    const auto days = std::chrono::floor<std::chrono::days>(milliseconds);
    const std::chrono::year_month_day calendar{std::chrono::sys_days(days)};
    const std::chrono::hh_mm_ss clock(milliseconds - days);
    return CivilTime{static_cast<int>(calendar.year()),
                     static_cast<unsigned>(calendar.month()),
                     static_cast<unsigned>(calendar.day()),
                     static_cast<unsigned>(clock.hours().count()),
                     static_cast<unsigned>(clock.minutes().count()),
                     static_cast<unsigned>(clock.seconds().count()),
                     static_cast<unsigned>(clock.subseconds().count())};
}

/// `number` in at least `width` digits.
inline void appendPadded(std::string& text, unsigned number, std::size_t width) {
    std::string digits;
    appendNumber(digits, number);
    text.append(digits.size() < width ? width - digits.size() : 0, '0');
    text += digits;
}

/// "2026-11-21", `between`, "02:43:25".
inline void appendDayAndTime(std::string& text, const CivilTime& time, char between) {
    appendPadded(text, static_cast<unsigned>(time.year), 4);
    text += '-';
    appendPadded(text, time.month, 2);
    text += '-';
    appendPadded(text, time.day, 2);
    text += between;
    appendPadded(text, time.hour, 2);
    text += ':';
    appendPadded(text, time.minute, 2);
    text += ':';
    appendPadded(text, time.second, 2);
}

} // namespace vela::detail
