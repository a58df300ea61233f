#include "platform/hwstats/ChannelFileNames.h"

#include "platform/linux/LinuxFileSystem.h"

#include <array>
#include <cerrno>
#include <charconv>
#include <cstdint>
#include <fcntl.h>
#include <unistd.h>

namespace vela::platform::hwstats {

namespace {

constexpr std::uint32_t kFolderPermissions = 0755;

/// Room for the number of a second publisher, the suffix and more below the system's 255.
constexpr std::size_t kLongestStem = 200;
constexpr std::size_t kHashDigits = 16;

void appendEscaped(std::string& name, std::string_view text) {
    for (const char character : text) {
        const auto byte = static_cast<unsigned char>(character);
        const bool isPlain = (byte >= 'a' && byte <= 'z') || (byte >= 'A' && byte <= 'Z') ||
                             (byte >= '0' && byte <= '9') || byte == '_' || (byte == '.' && !name.empty());
        if (isPlain) {
            name += character;
        } else {
            name += '%';
            name += "0123456789ABCDEF"[byte >> 4U];
            name += "0123456789ABCDEF"[byte & 0xFU];
        }
    }
}

std::string hashText(std::string_view text) {
    std::uint64_t hash = 0xCBF29CE484222325U;
    for (const char character : text) {
        hash = (hash ^ static_cast<unsigned char>(character)) * 0x100000001B3U;
    }
    std::string digits(kHashDigits, '0');
    for (char& digit : digits) {
        digit = "0123456789abcdef"[hash >> 60U];
        hash <<= 4U;
    }
    return digits;
}

struct flock wholeFile(int type) {
    struct flock lock {};
    lock.l_type = static_cast<short>(type);
    lock.l_whence = SEEK_SET;
    return lock;
}

/// The folder of the channel files below `runtime`, made where it is missing; empty with errno set.
std::string folderBelow(const std::string& runtime) {
    std::string folder = channelFolder(runtime);
    const Result<Done> made = LinuxFileSystem().createDirectories(folder, kFolderPermissions);
    if (!made) {
        errno = made.failure().code;
        return {};
    }
    return access(folder.c_str(), W_OK | X_OK) == 0 ? folder : std::string();
}

} // namespace

std::string channelFolder(std::string_view runtimeFolder) { return std::string(runtimeFolder) + "/hwstats"; }

std::string channelFileStem(std::string_view publisher, const ChannelTable& table) {
    std::string name;
    appendEscaped(name, publisher);
    for (const auto* part : {&table.driverName, &table.group, &table.subGroup}) {
        name += '-';
        appendEscaped(name, part->value_or(""));
    }
    if (name.size() > kLongestStem) {
        name = name.substr(0, kLongestStem - kHashDigits - 1) + "~" + hashText(name);
    }
    return name;
}

bool lockAsPublisher(int descriptor) {
    struct flock lock = wholeFile(F_WRLCK);
    return fcntl(descriptor, F_OFD_SETLK, &lock) == 0;
}

bool hasLivingPublisher(int descriptor) {
    // A lock for reading is in the way of nobody's but a publisher's.
    struct flock lock = wholeFile(F_RDLCK);
    return fcntl(descriptor, F_OFD_GETLK, &lock) == 0 && lock.l_type != F_UNLCK;
}

std::string makeChannelFolder(const PublisherEnvironment& environment) {
    if (!environment.velaRuntime.empty()) {
        return folderBelow(environment.velaRuntime);
    }
    const std::string own = environment.runtimeHome.empty() ? "" : environment.runtimeHome + "/vela";
    for (const std::string& runtime : {own, environment.systemRuntime}) {
        if (!runtime.empty() && access(runtime.c_str(), F_OK) == 0) {
            if (std::string folder = folderBelow(runtime); !folder.empty()) {
                return folder;
            }
        }
    }
    return folderBelow(own.empty() ? environment.systemRuntime : own);
}

} // namespace vela::platform::hwstats
