#include "common/values/Numbers.h"

#include <cmath>

namespace vela::detail {

namespace {

constexpr double kScale = 1e6; // six decimals

// Writes a number of at most 15 digits, six of them behind the point, and answers the end; null for any other. Decimals
// of at most 15 digits and doubles go together one to one, so that what reads back as the number is its shortest text.
char* writeShortDecimal(char* at, double number) {
    const double scaled = std::abs(number) * kScale;
    if (!(scaled < 1e15)) {
        return nullptr;
    }
    // NOLINTNEXTLINE(bugprone-incorrect-roundings): a wrong one does not read back
    auto digits = static_cast<std::uint64_t>(scaled + 0.5);
    if (static_cast<double>(digits) / kScale != std::abs(number) || (digits < 10 && digits != 0)) {
        return nullptr; // below 0.00001 an exponent is shorter
    }
    if (std::signbit(number)) {
        *at++ = '-';
    }
    const auto scale = static_cast<std::uint64_t>(kScale);
    at = std::to_chars(at, at + kRealBytes - 1, digits / scale).ptr;
    digits %= scale;
    if (digits == 0) {
        return at;
    }
    *at++ = '.';
    for (std::uint64_t unit = scale / 10; digits != 0; unit /= 10) {
        *at++ = static_cast<char>('0' + digits / unit);
        digits %= unit;
    }
    return at;
}

template <class Number>
char* writeShortest(char* at, Number number) {
    const Number magnitude = std::abs(number);
    const bool plain = magnitude >= static_cast<Number>(1e-5) && magnitude < static_cast<Number>(1e16);
    return std::to_chars(at, at + kRealBytes, number, plain ? std::chars_format::fixed : std::chars_format::scientific)
        .ptr;
}

} // namespace

char* writeReal(char* at, double number, ValueKind kind) {
    if (!std::isfinite(number)) {
        return std::to_chars(at, at + kRealBytes, number).ptr;
    }
    if (kind == ValueKind::Real32) {
        return number == 0 ? writeShortDecimal(at, number) : writeShortest(at, static_cast<float>(number));
    }
    char* end = writeShortDecimal(at, number);
    return end != nullptr ? end : writeShortest(at, number);
}

void appendReal(std::string& text, double number, ValueKind kind) {
    char digits[kRealBytes];
    text.append(digits, writeReal(digits, number, kind));
}

} // namespace vela::detail
