#include "cli/TimeArgument.h"

#include "common/TextFormat.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <cmath>

namespace vela {

namespace {

using Seconds = std::chrono::duration<double>;

std::optional<double> readNumber(std::string_view text) {
    double number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    const bool whole = error == std::errc() && end == text.data() + text.size() && !text.empty();
    return whole && std::isfinite(number) ? std::optional(number) : std::nullopt;
}

std::optional<double> readAgo(std::string_view text) {
    constexpr std::string_view kUnits = "smhd";
    constexpr std::array<double, 4> kSeconds{1, 60, 3600, 86400};
    const std::size_t unit = text.empty() ? std::string_view::npos : kUnits.find(text.back());
    if (unit == std::string_view::npos) {
        return std::nullopt;
    }
    const std::optional<double> number = readNumber(text.substr(0, text.size() - 1));
    return number && *number >= 0 ? std::optional(*number * kSeconds[unit]) : std::nullopt;
}

/// Takes texts of digits and marks apart from the front; stays failed after the first that does not fit.
class DigitReader {
public:
    explicit DigitReader(std::string_view text) : rest_(text) {}

    /// The number that the next `digits` digits say.
    int number(std::size_t digits) {
        int number = 0;
        if (rest_.size() < digits || rest_.front() == '-') {
            failed_ = true;
            return 0;
        }
        const auto [end, error] = std::from_chars(rest_.data(), rest_.data() + digits, number);
        failed_ = failed_ || error != std::errc() || end != rest_.data() + digits;
        rest_.remove_prefix(digits);
        return number;
    }
    /// One of `marks`.
    void mark(std::string_view marks) {
        if (rest_.empty() || marks.find(rest_.front()) == std::string_view::npos) {
            failed_ = true;
            return;
        }
        rest_.remove_prefix(1);
    }
    bool atEnd() const { return rest_.empty(); }
    bool failed() const { return failed_; }

private:
    std::string_view rest_;
    bool failed_ = false;
};

std::chrono::seconds readTimeOfDay(DigitReader& reader, bool& valid) {
    reader.mark("T ");
    const int hour = reader.number(2);
    reader.mark(":");
    const int minute = reader.number(2);
    int second = 0;
    if (!reader.atEnd()) {
        reader.mark(":");
        second = reader.number(2);
    }
    constexpr int kLastHour = 23;
    constexpr int kLastMinute = 59;
    valid = hour <= kLastHour && minute <= kLastMinute && second <= kLastMinute + 1;
    return std::chrono::hours(hour) + std::chrono::minutes(minute) + std::chrono::seconds(second);
}

std::optional<double> readLocalTime(std::string_view text, const platform::Clock& clock) {
    DigitReader reader(text);
    const std::chrono::year year(reader.number(4));
    reader.mark("-");
    const std::chrono::month month(static_cast<unsigned>(reader.number(2)));
    reader.mark("-");
    const std::chrono::day day(static_cast<unsigned>(reader.number(2)));
    const std::chrono::year_month_day date(year, month, day);
    bool valid = true;
    std::chrono::seconds time{0};
    if (!reader.atEnd()) {
        time = readTimeOfDay(reader, valid);
    }
    if (reader.failed() || !reader.atEnd() || !valid || !date.ok()) {
        return std::nullopt;
    }
    const platform::WallTime local = std::chrono::sys_days(date) + time;
    return Seconds((local - clock.localOffset(local)).time_since_epoch()).count();
}

} // namespace

std::optional<double> readTime(std::string_view text, const platform::Clock& clock) {
    if (const auto ago = readAgo(text)) {
        return Seconds(clock.now().time_since_epoch()).count() - *ago;
    }
    const auto number = readNumber(text);
    return number ? number : readLocalTime(text, clock);
}

std::string localTimeText(double seconds, const platform::Clock& clock) {
    const platform::WallTime time(std::chrono::round<std::chrono::milliseconds>(Seconds(seconds)));
    const auto local = std::chrono::floor<std::chrono::milliseconds>(time + clock.localOffset(time));
    const auto day = std::chrono::floor<std::chrono::days>(local);
    const std::chrono::year_month_day date(day);
    const std::chrono::hh_mm_ss clockTime(local - day);
    std::string text = std::to_string(static_cast<int>(date.year()));
    const auto append = [&text](char mark, std::int64_t number, std::size_t digits) {
        const std::string shown = std::to_string(number);
        text += mark;
        text.append(digits - std::min(digits, shown.size()), '0').append(shown);
    };
    append('-', static_cast<unsigned>(date.month()), 2);
    append('-', static_cast<unsigned>(date.day()), 2);
    append(' ', clockTime.hours().count(), 2);
    append(':', clockTime.minutes().count(), 2);
    append(':', clockTime.seconds().count(), 2);
    append('.', clockTime.subseconds().count(), 3);
    return text;
}

} // namespace vela
