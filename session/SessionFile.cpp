#include "session/SessionFile.h"

#include "common/TextFormat.h"
#include "common/values/Utf8.h"

#include <algorithm>
#include <cstdlib>

namespace vela {

namespace {

constexpr std::size_t kLongestNamePart = 128;

// How much of `text` fits into `limit` bytes without a part of a character at its end.
std::size_t wholeCharacters(std::string_view text, std::size_t limit) {
    std::size_t end = 0;
    while (end < text.size()) {
        const std::size_t next = end + utf8Step(text.substr(end)).bytes;
        if (next > limit) {
            break;
        }
        end = next;
    }
    return end;
}

} // namespace

std::string sessionFileDate(platform::WallTime time, std::chrono::seconds localOffset) {
    const auto local = std::chrono::floor<std::chrono::seconds>(time.time_since_epoch()) + localOffset;
    const auto days = std::chrono::floor<std::chrono::days>(local);
    const std::chrono::year_month_day date{std::chrono::sys_days(days)};
    const std::chrono::hh_mm_ss clock(local - days);
    const auto offsetMinutes = std::abs(std::chrono::duration_cast<std::chrono::minutes>(localOffset).count());
    return formatText("%04d%02u%02u-%02d%02d%02d%@%02d%02d", static_cast<int>(date.year()),
                      static_cast<unsigned>(date.month()), static_cast<unsigned>(date.day()), clock.hours().count(),
                      clock.minutes().count(), clock.seconds().count(), localOffset.count() < 0 ? "-" : "+",
                      offsetMinutes / 60, offsetMinutes % 60);
}

std::string safeFileNamePart(std::string_view text) {
    std::string safe(text.substr(0, wholeCharacters(text, kLongestNamePart)));
    std::replace_if(
        safe.begin(), safe.end(), [](char character) { return character == '/' || character == '\0'; }, '_');
    if (safe.starts_with('.')) {
        safe.front() = '_';
    }
    return safe;
}

} // namespace vela
