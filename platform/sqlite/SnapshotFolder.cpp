#include "platform/sqlite/SnapshotFolder.h"

#include <algorithm>
#include <charconv>
#include <chrono>
#include <compare>
#include <cstdint>
#include <ctime>
#include <filesystem>
#include <optional>
#include <system_error>
#include <utility>
#include <vector>

namespace vela::platform {

namespace {

constexpr std::string_view kExtension = ".json";
constexpr std::string_view kTimeForm = "00000000T000000Z"; // 20231114T221320Z

/// A file's name taken apart; ordered by age.
struct SnapshotName {
    std::string time;
    std::uint32_t number = 0;
    std::filesystem::path path;

    bool operator<(const SnapshotName& other) const {
        return std::pair(time, number) < std::pair(other.time, other.number);
    }
};

std::string timeText(WallTime time) {
    const std::time_t seconds =
        std::chrono::system_clock::to_time_t(std::chrono::time_point_cast<std::chrono::system_clock::duration>(
            std::chrono::floor<std::chrono::seconds>(time)));
    std::tm parts{};
    gmtime_r(&seconds, &parts);
    char text[32];
    return {text, std::strftime(text, sizeof(text), "%Y%m%dT%H%M%SZ", &parts)};
}

bool hasTimeForm(std::string_view text) {
    return text.size() == kTimeForm.size() &&
           std::equal(text.begin(), text.end(), kTimeForm.begin(),
                      [](char is, char form) { return form == '0' ? is >= '0' && is <= '9' : is == form; });
}

std::optional<SnapshotName> parse(const std::filesystem::path& path) {
    const std::string name = path.filename().string();
    std::string_view rest = name;
    if (!rest.ends_with(kExtension) || rest.size() <= kTimeForm.size() || rest[kTimeForm.size()] != '-' ||
        !hasTimeForm(rest.substr(0, kTimeForm.size()))) {
        return std::nullopt;
    }
    SnapshotName found{std::string(rest.substr(0, kTimeForm.size())), 0, path};
    rest.remove_prefix(kTimeForm.size() + 1);
    rest.remove_suffix(kExtension.size());
    const auto [end, error] = std::from_chars(rest.data(), rest.data() + rest.size(), found.number);
    return error == std::errc() && end == rest.data() + rest.size() ? std::optional(found) : std::nullopt;
}

} // namespace

SnapshotFolder::SnapshotFolder(std::string path, FileSystem& fileSystem)
    : path_(std::move(path)),
      fileSystem_(fileSystem) {}

Result<std::string> SnapshotFolder::write(WallTime time, std::string_view content) {
    if (Result<Done> made = fileSystem_.createDirectories(path_, 0755); !made) {
        return made.failure();
    }
    std::string name = freeName(time);
    if (Result<Done> written = fileSystem_.writeFileAtomically(name, content, 0644); !written) {
        return written.failure();
    }
    removeOldest();
    return name;
}

std::string SnapshotFolder::freeName(WallTime time) const {
    const std::string start = path_ + "/" + timeText(time) + "-";
    std::string name;
    std::error_code ignored;
    for (std::uint32_t number = 1; name.empty() || std::filesystem::exists(name, ignored); ++number) {
        name = start + std::to_string(number) + std::string(kExtension);
    }
    return name;
}

void SnapshotFolder::removeOldest() const {
    std::vector<SnapshotName> names;
    std::error_code error;
    for (std::filesystem::directory_iterator file(path_, error), end; !error && file != end; file.increment(error)) {
        if (std::optional<SnapshotName> name = parse(file->path())) {
            names.push_back(*std::move(name));
        }
    }
    std::ranges::sort(names, std::less<>());
    for (std::size_t index = 0; index + kMostFiles < names.size(); ++index) {
        std::filesystem::remove(names[index].path, error);
    }
}

} // namespace vela::platform
