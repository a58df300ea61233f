#include "platform/linux/LinuxPreferencesEditing.h"

#include "platform/linux/FolderLock.h"

#include <cerrno>
#include <system_error>

namespace vela::platform {

namespace {

constexpr std::uint32_t kFolderPermissions = 0755;
constexpr std::uint32_t kFilePermissions = 0644;

Failure notLocked(const std::string& folder) {
    const int error = errno;
    return {error, "lock " + folder + ": " + std::generic_category().message(error)};
}

} // namespace

Result<Dictionary> LinuxPreferencesEditing::readAll(std::string_view domain) const {
    Result<Dictionary> content = preferences_.readDomain(domain);
    if (!content && content.failure().code == ENOENT) {
        return Dictionary();
    }
    return content;
}

Result<Done> LinuxPreferencesEditing::write(std::string_view domain, std::string_view key, const Value& value) {
    if (!value) {
        return Failure{EINVAL, "a preference needs a value"};
    }
    // Before the folder is made for a name that cannot be used.
    if (const Result<std::string> path = preferences_.pathOf(domain); !path) {
        return path.failure();
    }
    if (Result<Done> made = fileSystem_.createDirectories(preferences_.folder(), kFolderPermissions); !made) {
        return made;
    }
    const FolderLock lock(preferences_.folder());
    if (!lock) {
        return notLocked(preferences_.folder());
    }
    const Result<Dictionary> content = readAll(domain);
    return content ? replace(domain, content->setting(Key(key), value)) : Result<Done>(content.failure());
}

Result<bool> LinuxPreferencesEditing::remove(std::string_view domain, std::string_view key) {
    return removeFrom(domain, [key](const Dictionary& content) {
        return content.contains(key) ? content.removing(Key(key)) : content;
    });
}

Result<bool> LinuxPreferencesEditing::removeAll(std::string_view domain) {
    return removeFrom(domain, [](const Dictionary&) { return Dictionary(); });
}

Result<bool> LinuxPreferencesEditing::removeFrom(std::string_view domain,
                                                 const std::function<Dictionary(const Dictionary&)>& rest) {
    const FolderLock lock(preferences_.folder());
    if (!lock && errno != ENOENT) {
        return notLocked(preferences_.folder());
    }
    const Result<Dictionary> content = readAll(domain);
    if (!content) {
        return content.failure();
    }
    const Dictionary left = rest(*content);
    if (left.size() == content->size()) {
        return false;
    }
    const Result<Done> replaced = replace(domain, left);
    return replaced ? Result<bool>(true) : Result<bool>(replaced.failure());
}

Result<Done> LinuxPreferencesEditing::replace(std::string_view domain, const Dictionary& content) {
    const Result<std::string> path = preferences_.pathOf(domain);
    if (!path) {
        return path.failure();
    }
    const Result<std::string> text = propertyLists_.write(Value(content), PropertyListFormat::Xml);
    if (!text) {
        return text.failure();
    }
    if (text->size() > kPreferencesFileBytes) {
        return Failure{EFBIG, *path + ": larger than its limit of " + std::to_string(kPreferencesFileBytes) + " bytes"};
    }
    return fileSystem_.writeFileAtomically(*path, *text, kFilePermissions);
}

} // namespace vela::platform
