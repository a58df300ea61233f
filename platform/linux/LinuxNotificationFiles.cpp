#include "platform/linux/LinuxNotificationFiles.h"

#include "platform/linux/FolderLock.h"
#include "platform/linux/LinuxFileSystem.h"

#include <cerrno>
#include <charconv>
#include <climits>
#include <system_error>

namespace vela::platform {

namespace {

constexpr std::uint32_t kFolderPermissions = 0755;
constexpr std::uint32_t kFilePermissions = 0644;
constexpr std::size_t kLongestState = 64; // bytes; a state has at most 20 digits

} // namespace

std::string notificationFolder(const std::string& runtimeFolder) { return runtimeFolder + "/notifications"; }

bool isNotificationName(std::string_view name) {
    constexpr std::string_view kRefused("/\0", 2);
    return !name.empty() && name.front() != '.' && name.find_first_of(kRefused) == std::string_view::npos &&
           name.size() <= NAME_MAX;
}

std::optional<std::uint64_t> readNotificationState(std::string_view text) {
    if (text.ends_with('\n')) {
        text.remove_suffix(1);
    }
    std::uint64_t state = 0;
    const char* const end = text.data() + text.size();
    const auto [read, error] = std::from_chars(text.data(), end, state);
    return error == std::errc() && read == end ? std::optional(state) : std::nullopt;
}

std::optional<std::uint64_t> notificationState(const std::string& folder, const std::string& name) {
    const Result<std::string> text = LinuxFileSystem().readFile(folder + "/" + name, kLongestState);
    return text ? readNotificationState(*text) : std::nullopt;
}

Result<Done> postNotification(const std::string& runtimeFolder, const std::string& name,
                              std::optional<std::uint64_t> state) {
    if (!isNotificationName(name)) {
        return Failure{EINVAL, "\"" + name + "\" cannot be the name of a notification"};
    }
    const std::string folder = notificationFolder(runtimeFolder);
    LinuxFileSystem files;
    if (Result<Done> made = files.createDirectories(folder, kFolderPermissions); !made) {
        return made;
    }
    // Between reading a state that stays and writing it again nobody else may post another one.
    const FolderLock lock(folder);
    if (!lock) {
        const int error = errno;
        return Failure{error, "lock " + folder + ": " + std::generic_category().message(error)};
    }
    const std::uint64_t posted = state ? *state : notificationState(folder, name).value_or(0);
    return files.writeFileAtomically(folder + "/" + name, std::to_string(posted), kFilePermissions);
}

} // namespace vela::platform
