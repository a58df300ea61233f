#include "platform/hwstats/SystemReading.h"

#include "platform/linux/FileDescriptor.h"

#include <algorithm>
#include <charconv>
#include <dirent.h>
#include <fcntl.h>
#include <memory>
#include <system_error>

namespace vela::platform::hwstats {

namespace {

bool isDigit(char character) { return character >= '0' && character <= '9'; }

/// The digits at the start of `text`, taken off it, without zeros in front.
std::string_view takeDigits(std::string_view& text) {
    const auto end = std::ranges::find_if_not(text, isDigit);
    std::string_view digits = text.substr(0, static_cast<std::size_t>(end - text.begin()));
    text.remove_prefix(digits.size());
    digits.remove_prefix(std::min(digits.find_first_not_of('0'), digits.size()));
    return digits;
}

/// Numbers in names count as numbers.
bool isBefore(std::string_view one, std::string_view other) {
    const std::string_view first = one;
    const std::string_view second = other;
    while (!one.empty() && !other.empty()) {
        if (isDigit(one.front()) && isDigit(other.front())) {
            const std::string_view left = takeDigits(one);
            const std::string_view right = takeDigits(other);
            if (left != right) {
                return left.size() != right.size() ? left.size() < right.size() : left < right;
            }
        } else if (one.front() != other.front()) {
            return one.front() < other.front();
        } else {
            one.remove_prefix(1);
            other.remove_prefix(1);
        }
    }
    return one.empty() && other.empty() ? first < second : one.empty();
}

} // namespace

std::string_view trimmed(std::string_view text) {
    constexpr std::string_view kSpaces = " \t\r\n";
    const std::size_t begin = text.find_first_not_of(kSpaces);
    return begin == std::string_view::npos ? std::string_view()
                                           : text.substr(begin, text.find_last_not_of(kSpaces) - begin + 1);
}

std::optional<std::uint64_t> numberOf(std::string_view text) {
    std::uint64_t number = 0;
    const char* const end = text.data() + text.size();
    const auto [read, error] = std::from_chars(text.data(), end, number);
    return error == std::errc() && read == end ? std::optional(number) : std::nullopt;
}

bool SystemReading::spend() {
    spent_ = spent_ || files_ == kMostFiles || clock_.monotonicNow() > deadline_;
    files_ += spent_ ? 0 : 1;
    return !spent_;
}

std::optional<std::string> SystemReading::read(const std::string& path) {
    if (!spend()) {
        return std::nullopt;
    }
    const FileDescriptor file(open((root_ + path).c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    std::string text;
    if (!file || !readToEnd(file, text, kMostFileBytes) || text.size() > kMostFileBytes) {
        return std::nullopt;
    }
    return std::string(trimmed(text));
}

std::optional<std::uint64_t> SystemReading::number(const std::string& path) {
    const std::optional<std::string> text = read(path);
    return text ? numberOf(*text) : std::nullopt;
}

std::vector<std::string> SystemReading::list(const std::string& path, std::string_view prefix) {
    return names(path, prefix, false);
}

std::vector<std::string> SystemReading::folders(const std::string& path) { return names(path, {}, true); }

std::vector<std::string> SystemReading::names(const std::string& path, std::string_view prefix, bool foldersOnly) {
    std::vector<std::string> found;
    if (!spend()) {
        return found;
    }
    const std::unique_ptr<DIR, int (*)(DIR*)> folder(opendir((root_ + path).c_str()), &closedir);
    if (folder == nullptr) {
        return found;
    }
    while (const dirent* const entry = readdir(folder.get())) { // NOLINT(concurrency-mt-unsafe): a stream of its own
        const std::string_view name = &entry->d_name[0];
        if (name.starts_with('.') || !name.starts_with(prefix) || (foldersOnly && entry->d_type != DT_DIR)) {
            continue;
        }
        if (found.size() == kMostNames) {
            spent_ = true;
            break;
        }
        found.emplace_back(name);
    }
    std::ranges::sort(found, isBefore);
    return found;
}

} // namespace vela::platform::hwstats
