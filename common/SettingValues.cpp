#include "common/SettingValues.h"

#include "common/values/Utf8.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <limits>

namespace vela {

namespace {

constexpr std::size_t kShownBytes = 80;
constexpr std::size_t kShownTexts = 8;
constexpr std::size_t kEverything = std::numeric_limits<std::size_t>::max();

struct Unit {
    std::string_view name;
    std::int64_t bytes;
};
constexpr std::array<Unit, 5> kUnits{{{"B", 1},
                                      {"KiB", std::int64_t{1} << 10},
                                      {"MiB", std::int64_t{1} << 20},
                                      {"GiB", std::int64_t{1} << 30},
                                      {"TiB", std::int64_t{1} << 40}}};

platform::Failure badSize(std::string_view text, std::string_view reason) {
    return {0, shownValue(std::string(text)) + " " + std::string(reason)};
}

void appendEscaped(std::string& quoted, char32_t codePoint) {
    constexpr std::string_view kDigits = "0123456789abcdef";
    quoted += "\\u";
    for (const unsigned shift : {12U, 8U, 4U, 0U}) {
        quoted += kDigits[(codePoint >> shift) & 0xfU];
    }
}

/// Breaks a line, moves a terminal's cursor, or changes the direction in which other characters are shown.
bool isControl(char32_t codePoint) {
    return codePoint < 0x20 || (codePoint >= 0x7f && codePoint < 0xa0) ||
           (codePoint >= 0x200e && codePoint <= 0x200f) || (codePoint >= 0x2028 && codePoint <= 0x202e) ||
           (codePoint >= 0x2066 && codePoint <= 0x2069);
}

void appendCharacter(std::string& quoted, char32_t codePoint) {
    if (codePoint == U'\n') {
        quoted += "\\n";
    } else if (codePoint == U'\t') {
        quoted += "\\t";
    } else if (isControl(codePoint)) {
        appendEscaped(quoted, codePoint);
    } else {
        appendUtf8(quoted, codePoint);
    }
}

std::string quoted(std::string_view text, std::size_t limit) {
    std::string result = "\"";
    std::size_t taken = 0;
    while (taken < text.size() && taken < limit) {
        const Utf8Step step = utf8Step(text.substr(taken));
        if (step.valid && (step.codePoint == U'"' || step.codePoint == U'\\')) {
            result += '\\';
        }
        appendCharacter(result, step.valid ? step.codePoint : U'\uFFFD');
        taken += step.bytes;
    }
    return result + (taken < text.size() ? "...\"" : "\"");
}

std::string realText(double real) {
    std::array<char, 32> digits{};
    const auto end = std::to_chars(digits.data(), digits.data() + digits.size(), real).ptr;
    return {digits.data(), end};
}

std::string listText(const std::vector<std::string>& texts, std::size_t textLimit, std::size_t countLimit) {
    std::string result = "[";
    for (std::size_t index = 0; index < std::min(texts.size(), countLimit); ++index) {
        result += (index == 0 ? "" : ", ") + quoted(texts[index], textLimit);
    }
    return result + (texts.size() > countLimit ? ", ...]" : "]");
}

std::string anyText(const SettingValue& value, std::size_t textLimit, std::size_t countLimit) {
    if (const auto* boolean = std::get_if<bool>(&value)) {
        return *boolean ? "true" : "false";
    }
    if (const auto* integer = std::get_if<std::int64_t>(&value)) {
        return std::to_string(*integer);
    }
    if (const auto* real = std::get_if<double>(&value)) {
        return realText(*real);
    }
    if (const auto* text = std::get_if<std::string>(&value)) {
        return quoted(*text, textLimit);
    }
    if (const auto* texts = std::get_if<std::vector<std::string>>(&value)) {
        return listText(*texts, textLimit, countLimit);
    }
    return "nothing";
}

} // namespace

platform::Result<std::int64_t> parseByteSize(std::string_view text) {
    std::int64_t number = 0;
    const char* end = text.data() + text.size();
    const auto [rest, error] = std::from_chars(text.data(), end, number);
    if (error == std::errc::result_out_of_range) {
        return badSize(text, "is more bytes than can be counted");
    }
    if (error != std::errc() || text.front() == '-') {
        return badSize(text, "is no size such as \"256 MiB\"");
    }
    std::string_view name = text.substr(static_cast<std::size_t>(rest - text.data()));
    name.remove_prefix(std::min(name.find_first_not_of(' '), name.size()));
    if (name.empty() && text.back() == ' ') {
        return badSize(text, "is no size such as \"256 MiB\"");
    }
    const auto* unit = std::find_if(kUnits.begin(), kUnits.end(),
                                    [&](const Unit& known) { return known.name == (name.empty() ? "B" : name); });
    if (unit == kUnits.end()) {
        return badSize(text, "has no known unit (B, KiB, MiB, GiB, TiB)");
    }
    if (number == 0) {
        return badSize(text, "is no bytes at all");
    }
    if (number > std::numeric_limits<std::int64_t>::max() / unit->bytes) {
        return badSize(text, "is more bytes than can be counted");
    }
    return number * unit->bytes;
}

std::string byteSizeText(std::int64_t bytes) {
    const auto unit = std::find_if(kUnits.rbegin(), kUnits.rend(),
                                   [&](const Unit& known) { return known.bytes == 1 || bytes % known.bytes == 0; });
    return std::to_string(bytes / unit->bytes) + " " + std::string(unit->name);
}

std::string quotedText(std::string_view text) { return quoted(text, kEverything); }

std::string escapedText(std::string_view text) {
    std::string result;
    while (!text.empty()) {
        const Utf8Step step = utf8Step(text);
        appendCharacter(result, step.valid ? step.codePoint : U'\uFFFD');
        text.remove_prefix(step.bytes);
    }
    return result;
}

std::string shownValue(const SettingValue& value) { return anyText(value, kShownBytes, kShownTexts); }

std::string valueText(const SettingValue& value) { return anyText(value, kEverything, kEverything); }

} // namespace vela
