#include "platform/linux/LinuxPreferences.h"

#include <cerrno>
#include <climits>
#include <utility>

namespace vela::platform {

namespace {

constexpr std::string_view kExtension = ".plist";

} // namespace

Value LinuxPreferences::copyValue(std::string_view domain, std::string_view key) const {
    const Result<Dictionary> content = readDomain(domain);
    return content ? Value(content->find(key)) : Value();
}

Result<Dictionary> LinuxPreferences::readDomain(std::string_view domain) const {
    const Result<std::string> path = pathOf(domain);
    if (!path) {
        return path.failure();
    }
    const Result<std::string> bytes = fileSystem_.readFile(*path, kPreferencesFileBytes);
    if (!bytes) {
        return bytes.failure();
    }
    PropertyListLimits limits;
    limits.bytes = kPreferencesFileBytes;
    const Result<Value> value = propertyLists_.read(*bytes, limits);
    if (!value) {
        return Failure{0, *path + ": " + value.failure().description};
    }
    if (!value->ref().isDictionary()) {
        return Failure{0, *path + ": not a dictionary"};
    }
    return value->ref().dictionary();
}

Result<std::string> LinuxPreferences::pathOf(std::string_view domain) const {
    constexpr std::string_view kRefused("/\0", 2);
    if (domain.empty() || domain.front() == '.' || domain.find_first_of(kRefused) != std::string_view::npos ||
        domain.size() + kExtension.size() > NAME_MAX) {
        return Failure{EINVAL, "\"" + std::string(domain) + "\" cannot be the name of a preferences domain"};
    }
    return folder_ + "/" + std::string(domain) + std::string(kExtension);
}

} // namespace vela::platform
