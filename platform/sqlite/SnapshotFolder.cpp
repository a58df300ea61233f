#include "platform/sqlite/SnapshotFolder.h"

#include <algorithm>
#include <charconv>
#include <chrono>
#include <cstdint>
#include <ctime>
#include <filesystem>
#include <optional>
#include <system_error>
#include <tuple>
#include <utility>
#include <vector>

namespace vela::platform {

namespace {

constexpr std::string_view kExtension = ".json";
constexpr std::string_view kTimeForm = "00000000T000000Z"; // 20231114T221320Z

/// A file's name taken apart.
struct SnapshotName {
    std::string time;
    std::uint32_t number = 0;
    std::filesystem::path path;
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

std::vector<SnapshotName> namesIn(const std::string& folder) {
    std::vector<SnapshotName> names;
    std::error_code error;
    for (std::filesystem::directory_iterator file(folder, error), end; !error && file != end; file.increment(error)) {
        if (std::optional<SnapshotName> name = parse(file->path())) {
            names.push_back(*std::move(name));
        }
    }
    return names;
}

// The next number of that second, not one that is free again: its record's path would lead to this file.
std::string newName(const std::string& folder, const std::string& time, const std::vector<SnapshotName>& names) {
    std::uint32_t number = 0;
    for (const SnapshotName& name : names) {
        number = name.time == time ? std::max(number, name.number) : number;
    }
    const auto next = [&] { return folder + "/" + time + "-" + std::to_string(++number) + std::string(kExtension); };
    std::string path = next();
    std::error_code ignored;
    while (std::filesystem::exists(path, ignored)) {
        path = next();
    }
    return path;
}

// Makes room for the file of `time`, which is not among the names.
void removeOldest(const std::string& time, std::vector<SnapshotName> names) {
    const auto age = [&time](const SnapshotName& name) {
        return std::tuple(name.time <= time, std::string_view(name.time), name.number);
    };
    std::ranges::sort(names, {}, age);
    std::error_code ignored;
    for (std::size_t index = 0; index + SnapshotFolder::kMostFiles < names.size() + 1; ++index) {
        std::filesystem::remove(names[index].path, ignored);
    }
}

} // namespace

SnapshotFolder::SnapshotFolder(std::string path, FileSystem& fileSystem)
    : path_(std::move(path)),
      fileSystem_(fileSystem) {}

Result<std::string> SnapshotFolder::write(WallTime time, std::string_view content) {
    if (Result<Done> made = fileSystem_.createDirectories(path_, 0755); !made) {
        return made.failure();
    }
    const std::string text = timeText(time);
    std::vector<SnapshotName> others = namesIn(path_);
    std::string path = newName(path_, text, others);
    if (Result<Done> written = fileSystem_.writeFileAtomically(path, content, 0644); !written) {
        return written.failure();
    }
    removeOldest(text, std::move(others));
    return path;
}

} // namespace vela::platform
