#include "platform/dbus/AccessRule.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <grp.h>
#include <optional>
#include <pwd.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace vela::platform::dbus {

namespace {

std::optional<std::uint32_t> numberOf(const std::string& text) {
    std::uint32_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    const bool whole = error == std::errc() && end == text.data() + text.size();
    return whole ? std::optional(number) : std::nullopt;
}

/// Calls `look(entry, buffer, found)`, one of the getXnam_r functions, with a buffer that is large enough.
template <class Entry, class Look>
const Entry* lookUp(Entry& entry, std::vector<char>& buffer, const Look& look) {
    constexpr std::size_t kLargest = 1024 * 1024;
    Entry* found = nullptr;
    for (buffer.resize(4096); look(entry, buffer, &found) == ERANGE && buffer.size() < kLargest;) {
        buffer.resize(buffer.size() * 2);
    }
    return found;
}

std::optional<std::uint32_t> userOf(const std::string& name) {
    passwd entry{};
    std::vector<char> buffer;
    const passwd* found = lookUp(entry, buffer, [&name](passwd& into, std::vector<char>& bytes, passwd** result) {
        return getpwnam_r(name.c_str(), &into, bytes.data(), bytes.size(), result);
    });
    return found == nullptr ? numberOf(name) : std::optional<std::uint32_t>(found->pw_uid);
}

std::optional<std::uint32_t> groupOf(const std::string& name) {
    group entry{};
    std::vector<char> buffer;
    const group* found = lookUp(entry, buffer, [&name](group& into, std::vector<char>& bytes, group** result) {
        return getgrnam_r(name.c_str(), &into, bytes.data(), bytes.size(), result);
    });
    return found == nullptr ? numberOf(name) : std::optional<std::uint32_t>(found->gr_gid);
}

} // namespace

AccessRule AccessRule::ofNames(const std::vector<std::string>& users, const std::vector<std::string>& groups,
                               std::vector<std::string>& unknown) {
    AccessRule rule;
    for (const std::string& name : users) {
        if (const auto id = userOf(name)) {
            rule.users_.push_back(*id);
        } else {
            unknown.push_back("user " + name);
        }
    }
    for (const std::string& name : groups) {
        if (const auto id = groupOf(name)) {
            rule.groups_.push_back(*id);
        } else {
            unknown.push_back("group " + name);
        }
    }
    return rule;
}

bool AccessRule::isOwner(const PeerCredentials& peer) { return peer.user == 0 || peer.user == geteuid(); }

bool AccessRule::allows(const PeerCredentials& peer) const {
    return isOwner(peer) || std::find(users_.begin(), users_.end(), peer.user) != users_.end() ||
           std::any_of(groups_.begin(), groups_.end(), [&peer](std::uint32_t id) { return peer.isInGroup(id); });
}

} // namespace vela::platform::dbus
