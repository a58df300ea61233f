// The conversions of format texts: taken apart, and judged against the kinds of their arguments. Internal to
// TextFormat.h.
//
//     %  flags: - 0  width  .precision  length word: h hh l ll z q  letter: % @ s d i u x X f g c
//
// Pure functions that also run in the compiler.
#pragma once

#include <cstdint>
#include <initializer_list>
#include <optional>
#include <string_view>

namespace vela::detail {

/// What a conversion must know of its argument's type. Every kind suits "%@".
enum class ArgumentKind : std::uint8_t { Integer, Character, Real, Text, Object };

/// One conversion of a format text. Its letter is '\0' when the text is malformed.
struct Conversion {
    char letter = '\0';
    bool left = false;
    bool zeros = false;
    std::uint32_t width = 0;
    std::optional<std::uint32_t> precision;
};

constexpr std::uint32_t kLargestWidth = 999;
constexpr std::uint32_t kLargestPrecision = 99;

constexpr bool isDigit(char character) { return character >= '0' && character <= '9'; }

constexpr std::uint32_t takeNumber(std::string_view& format) {
    std::uint32_t number = 0;
    while (!format.empty() && isDigit(format.front()) && number <= kLargestWidth) {
        number = number * 10 + static_cast<std::uint32_t>(format.front() - '0');
        format.remove_prefix(1);
    }
    return number;
}

/// The length word at the start of `format`, none being empty.
constexpr std::string_view takeLength(std::string_view& format) {
    for (const std::string_view word : {"hh", "h", "ll", "l", "z", "q"}) {
        if (format.starts_with(word)) {
            format.remove_prefix(word.size());
            return word;
        }
    }
    return {};
}

constexpr bool isIntegerLetter(char letter) { return std::string_view("diuxX").find(letter) != std::string_view::npos; }
constexpr bool isRealLetter(char letter) { return letter == 'f' || letter == 'g'; }

constexpr bool makesSense(const Conversion& conversion, std::string_view length) {
    const char letter = conversion.letter;
    if (isIntegerLetter(letter)) {
        return true;
    }
    if (isRealLetter(letter)) {
        return length.empty() || length == "l";
    }
    const bool isText = letter == 's' || letter == '@';
    const bool isCharacter = letter == 'c' && !conversion.precision;
    return (isText || isCharacter) && length.empty() && !conversion.zeros;
}

constexpr Conversion takeConversion(std::string_view& format) {
    Conversion conversion;
    if (format.starts_with('%')) {
        format.remove_prefix(1);
        conversion.letter = '%';
        return conversion;
    }
    for (; format.starts_with('-') || format.starts_with('0'); format.remove_prefix(1)) {
        (format.front() == '-' ? conversion.left : conversion.zeros) = true;
    }
    conversion.width = takeNumber(format);
    if (format.starts_with('.')) {
        format.remove_prefix(1);
        conversion.precision = takeNumber(format);
    }
    const std::string_view length = takeLength(format);
    if (format.empty() || conversion.width > kLargestWidth || conversion.precision.value_or(0) > kLargestPrecision) {
        return {};
    }
    conversion.letter = format.front();
    format.remove_prefix(1);
    return makesSense(conversion, length) ? conversion : Conversion();
}

constexpr bool suits(char letter, ArgumentKind kind) {
    switch (kind) {
    case ArgumentKind::Integer:
        return letter == '@' || isIntegerLetter(letter);
    case ArgumentKind::Character:
        return letter == '@' || letter == 'c';
    case ArgumentKind::Real:
        return letter == '@' || isRealLetter(letter);
    case ArgumentKind::Text:
        return letter == '@' || letter == 's';
    case ArgumentKind::Object:
        return letter == '@';
    }
    return false;
}

enum class FormatVerdict : std::uint8_t { Fits, Malformed, TooFewArguments, TooManyArguments, Unsuitable };

constexpr FormatVerdict judgeFormat(std::string_view format, std::initializer_list<ArgumentKind> arguments) {
    const auto* argument = arguments.begin();
    for (auto percent = format.find('%'); percent != std::string_view::npos; percent = format.find('%')) {
        format.remove_prefix(percent + 1);
        const char letter = takeConversion(format).letter;
        if (letter == '%') {
            continue;
        }
        if (letter == '\0') {
            return FormatVerdict::Malformed;
        }
        if (argument == arguments.end()) {
            return FormatVerdict::TooFewArguments;
        }
        if (!suits(letter, *argument)) {
            return FormatVerdict::Unsuitable;
        }
        ++argument;
    }
    return argument == arguments.end() ? FormatVerdict::Fits : FormatVerdict::TooManyArguments;
}

// Not constexpr on purpose: a format text that is wrong does not compile, and the compiler's message names one of
// these.
void formatTextIsMalformed();
void formatTextHasTooFewArguments();
void formatTextHasTooManyArguments();
void formatTextHasAConversionThatDoesNotSuitItsArgument();

constexpr void refuseUnlessItFits(FormatVerdict verdict) {
    switch (verdict) {
    case FormatVerdict::Fits:
        return;
    case FormatVerdict::Malformed:
        return formatTextIsMalformed();
    case FormatVerdict::TooFewArguments:
        return formatTextHasTooFewArguments();
    case FormatVerdict::TooManyArguments:
        return formatTextHasTooManyArguments();
    case FormatVerdict::Unsuitable:
        return formatTextHasAConversionThatDoesNotSuitItsArgument();
    }
}

} // namespace vela::detail
