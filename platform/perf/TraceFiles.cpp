#include "platform/perf/TraceFiles.h"

#include "platform/linux/FolderWalk.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <ctime>
#include <dirent.h>
#include <fcntl.h>
#include <filesystem>
#include <memory>
#include <optional>
#include <sys/file.h>
#include <sys/stat.h>
#include <system_error>
#include <tuple>
#include <unistd.h>
#include <utility>
#include <vector>

namespace vela::platform::perf {

namespace {

constexpr std::string_view kPrefix = "probe-";
constexpr std::string_view kSuffix = ".data";
constexpr std::string_view kPartSuffix = ".data.part";
constexpr std::uint32_t kFolderPermissions = 0755;
/// A profile holds addresses of the kernel and names of everybody's programs.
constexpr mode_t kFilePermissions = 0600;
constexpr std::size_t kDigits = 6;

Failure failureOf(const std::string& operation, int code) {
    return {code, operation + ": " + std::generic_category().message(code)};
}

std::string timeText(WallTime time) {
    const std::time_t seconds =
        std::chrono::system_clock::to_time_t(std::chrono::time_point_cast<std::chrono::system_clock::duration>(
            std::chrono::floor<std::chrono::seconds>(time)));
    std::tm parts{};
    gmtime_r(&seconds, &parts);
    char text[32];
    return {text, std::strftime(text, sizeof(text), "%Y%m%dT%H%M%SZ", &parts)};
}

std::string numberText(std::uint32_t number) {
    std::string digits = std::to_string(number);
    return digits.size() < kDigits ? std::string(kDigits - digits.size(), '0') + digits : digits;
}

/// The last part of a path.
std::string nameIn(const std::string& path) { return path.substr(path.rfind('/') + 1); }

/// The number in a name "probe-<number>-...<suffix>".
std::optional<std::uint32_t> numberIn(std::string_view name, std::string_view suffix) {
    constexpr std::size_t kMostDigits = 9;
    if (!name.starts_with(kPrefix) || !name.ends_with(suffix)) {
        return std::nullopt;
    }
    name.remove_prefix(kPrefix.size());
    const std::string_view digits = name.substr(0, name.find('-'));
    std::uint32_t number = 0;
    const auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), number);
    const bool isNumber = error == std::errc() && end == digits.data() + digits.size();
    return isNumber && digits.size() >= kDigits && digits.size() <= kMostDigits && digits.size() < name.size()
               ? std::optional(number)
               : std::nullopt;
}

struct Numbered {
    std::uint32_t number;
    std::string name;
};

std::vector<Numbered> filesWith(const FileDescriptor& folder, std::string_view suffix) {
    std::vector<Numbered> files;
    FileDescriptor listed = openForListing(folder);
    const std::unique_ptr<DIR, int (*)(DIR*)> stream(listed ? fdopendir(listed.get()) : nullptr, &closedir);
    if (stream == nullptr) {
        return files;
    }
    listed.release();
    // A stream of its own: nobody else reads it meanwhile.
    while (const dirent* const entry = readdir(stream.get())) { // NOLINT(concurrency-mt-unsafe)
        std::string name(&entry->d_name[0]);
        if (const auto number = numberIn(name, suffix)) {
            files.push_back({*number, std::move(name)});
        }
    }
    std::ranges::sort(files, [](const Numbered& one, const Numbered& other) {
        return std::tie(one.number, one.name) < std::tie(other.number, other.name);
    });
    return files;
}

std::uint32_t highestNumber(const FileDescriptor& folder) {
    std::uint32_t highest = 0;
    for (const std::string_view suffix : {kSuffix, kPartSuffix}) {
        const std::vector<Numbered> files = filesWith(folder, suffix);
        highest = std::max(highest, files.empty() ? 0 : files.back().number);
    }
    return highest;
}

bool lock(const FileDescriptor& file) { return flock(file.get(), LOCK_EX | LOCK_NB) == 0; }

void removeWhenFree(const FileDescriptor& folder, const std::string& name) {
    const FileDescriptor file(
        openat(folder.get(), name.c_str(), O_RDWR | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY));
    if (file && lock(file)) {
        unlinkat(folder.get(), name.c_str(), 0);
    }
}

} // namespace

TraceFile::~TraceFile() {
    if (held_ && checkPlace() == 0) {
        unlinkat(folder_.get(), partName().c_str(), 0);
    }
}

std::string TraceFile::partPath() const {
    return path_.substr(0, path_.size() - kSuffix.size()) + std::string(kPartSuffix);
}

std::string TraceFile::partName() const { return nameIn(partPath()); }

int TraceFile::checkPlace() const {
    struct stat held {};
    struct stat named {};
    if (fstat(held_.get(), &held) != 0 ||
        fstatat(folder_.get(), partName().c_str(), &named, AT_SYMLINK_NOFOLLOW) != 0) {
        return errno;
    }
    return held.st_dev == named.st_dev && held.st_ino == named.st_ino ? 0 : ESTALE;
}

Result<std::string> TraceFile::publish() {
    const int misplaced = checkPlace();
    if (misplaced == ESTALE) {
        return Failure{ESTALE, "result of the trace, " + partPath() + ": something else has taken its place"};
    }
    struct stat written {};
    if (misplaced != 0 || fstat(held_.get(), &written) != 0) {
        return failureOf("result of the trace, " + partPath(), misplaced != 0 ? misplaced : errno);
    }
    if (written.st_size == 0) {
        return Failure{ENODATA, "result of the trace, " + partPath() + ": nothing was written"};
    }
    if (renameat(folder_.get(), partName().c_str(), folder_.get(), nameIn(path_).c_str()) != 0) {
        return failureOf("result of the trace, " + path_, errno);
    }
    held_ = FileDescriptor();
    return path_;
}

TraceFiles::TraceFiles(const std::string& folder, std::size_t most, const Clock& clock)
    : folder_([&folder] {
          std::error_code ignored;
          const std::filesystem::path path = std::filesystem::absolute(folder, ignored);
          return ignored ? folder : path.lexically_normal().string();
      }()),
      most_(most),
      clock_(clock) {}

Result<TraceFile> TraceFiles::reserve() const {
    Result<FileDescriptor> made = makeFolders(folder_, kFolderPermissions);
    if (!made) {
        return made.failure();
    }
    FileDescriptor folder = *std::move(made);
    for (const Numbered& part : filesWith(folder, kPartSuffix)) {
        removeWhenFree(folder, part.name);
    }
    constexpr int kMostTries = 100; // each lost to a trace that cleans the same folder up
    std::uint32_t number = highestNumber(folder);
    for (int tries = 0; tries < kMostTries; ++tries) {
        ++number;
        const std::string name = std::string(kPrefix) + numberText(number) + "-" + timeText(clock_.now());
        const std::string part = name + std::string(kPartSuffix);
        FileDescriptor file(
            openat(folder.get(), part.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, kFilePermissions));
        if (!file && errno != EEXIST) {
            return failureOf("file for a trace in " + folder_, errno);
        }
        // Until it is locked it may be taken for one left behind, by a trace that begins at the same time.
        struct stat status {};
        if (file && lock(file) && fstat(file.get(), &status) == 0 && status.st_nlink > 0) {
            return TraceFile(folder_ + "/" + name + std::string(kSuffix), std::move(folder), std::move(file));
        }
    }
    return failureOf("file for a trace in " + folder_, EAGAIN);
}

void TraceFiles::removeOldest() const {
    const Result<FileDescriptor> folder = openFolder(folder_);
    if (!folder) {
        return;
    }
    const std::vector<Numbered> files = filesWith(*folder, kSuffix);
    for (std::size_t index = 0; index + most_ < files.size(); ++index) {
        unlinkat(folder->get(), files[index].name.c_str(), 0);
    }
}

std::string fileUrl(std::string_view path) {
    constexpr std::string_view kPlain = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-._~/";
    constexpr std::string_view kHexadecimal = "0123456789ABCDEF";
    std::string url = "file://";
    for (const char letter : path) {
        if (kPlain.find(letter) != std::string_view::npos) {
            url += letter;
        } else {
            const auto byte = static_cast<unsigned char>(letter);
            url.append(1, '%').append(1, kHexadecimal[byte / 16]).append(1, kHexadecimal[byte % 16]);
        }
    }
    return url;
}

} // namespace vela::platform::perf
