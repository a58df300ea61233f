// On whose behalf something is done: a user and its groups, by the operating system's word. Plain data.
#pragma once

#include <algorithm>
#include <cstdint>
#include <vector>

namespace vela::platform {

struct Identity {
    /// The user and the group of nobody.
    static constexpr std::uint32_t kNobody = 65534;

    std::uint32_t user = kNobody;
    std::uint32_t group = kNobody;
    std::vector<std::uint32_t> groups{}; ///< supplementary ones

    bool isInGroup(std::uint32_t id) const {
        return group == id || std::find(groups.begin(), groups.end(), id) != groups.end();
    }
    friend bool operator==(const Identity&, const Identity&) = default;
};

} // namespace vela::platform
