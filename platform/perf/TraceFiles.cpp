#include "platform/perf/TraceFiles.h"

#include "platform/linux/LinuxFileSystem.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <ctime>
#include <fcntl.h>
#include <filesystem>
#include <optional>
#include <sys/file.h>
#include <sys/stat.h>
#include <system_error>
#include <tuple>
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
    std::string path;
};

std::vector<Numbered> filesWith(const std::string& folder, std::string_view suffix) {
    std::vector<Numbered> files;
    std::error_code error;
    for (std::filesystem::directory_iterator file(folder, error), end; !error && file != end; file.increment(error)) {
        if (const auto number = numberIn(file->path().filename().string(), suffix)) {
            files.push_back({*number, file->path().string()});
        }
    }
    std::ranges::sort(files, [](const Numbered& one, const Numbered& other) {
        return std::tie(one.number, one.path) < std::tie(other.number, other.path);
    });
    return files;
}

bool lock(const FileDescriptor& file) { return flock(file.get(), LOCK_EX | LOCK_NB) == 0; }

void removeWhenFree(const std::string& path) {
    const FileDescriptor file(open(path.c_str(), O_RDWR | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY));
    if (file && lock(file)) {
        unlink(path.c_str());
    }
}

} // namespace

TraceFile::~TraceFile() {
    if (held_) {
        unlink(partPath().c_str());
    }
}

std::string TraceFile::partPath() const {
    return path_.substr(0, path_.size() - kSuffix.size()) + std::string(kPartSuffix);
}

Result<std::string> TraceFile::publish() {
    struct stat written {};
    if (stat(partPath().c_str(), &written) != 0) {
        return failureOf("result of the trace, " + partPath(), errno);
    }
    if (written.st_size == 0) {
        return Failure{ENODATA, "result of the trace, " + partPath() + ": nothing was written"};
    }
    if (rename(partPath().c_str(), path_.c_str()) != 0) {
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
    if (Result<Done> made = LinuxFileSystem().createDirectories(folder_, kFolderPermissions); !made) {
        return made.failure();
    }
    for (const Numbered& part : filesWith(folder_, kPartSuffix)) {
        removeWhenFree(part.path);
    }
    constexpr int kMostTries = 100; // each lost to a service that cleans the same folder up
    std::uint32_t number = highestNumber();
    for (int tries = 0; tries < kMostTries; ++tries) {
        ++number;
        std::string path = folder_ + "/" + std::string(kPrefix) + numberText(number) + "-" + timeText(clock_.now());
        const std::string part = path + std::string(kPartSuffix);
        FileDescriptor file(open(part.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, kFilePermissions));
        struct stat made {};
        // Until it is locked it may be taken for one left behind.
        if (file && lock(file) && fstat(file.get(), &made) == 0 && made.st_nlink > 0) {
            return TraceFile(path + std::string(kSuffix), std::move(file));
        }
        if (errno != EEXIST && errno != EWOULDBLOCK) {
            break;
        }
    }
    return failureOf("file for a trace in " + folder_, errno);
}

std::uint32_t TraceFiles::highestNumber() const {
    std::uint32_t highest = 0;
    for (const std::string_view suffix : {kSuffix, kPartSuffix}) {
        const std::vector<Numbered> files = filesWith(folder_, suffix);
        highest = std::max(highest, files.empty() ? 0 : files.back().number);
    }
    return highest;
}

void TraceFiles::removeOldest() const {
    const std::vector<Numbered> files = filesWith(folder_, kSuffix);
    for (std::size_t index = 0; index + most_ < files.size(); ++index) {
        unlink(files[index].path.c_str());
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
