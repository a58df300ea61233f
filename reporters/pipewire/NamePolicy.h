// What becomes of an application's name. Immutable.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace vela::reporter {

enum class NameTreatment : std::uint8_t { Report, Hash, Omit };

class NamePolicy {
public:
    /// `secret` makes the hashes of this device differ from those of others, so that no table made in advance tells
    /// the names. Without one, names that would be hashed are left out.
    NamePolicy(NameTreatment treatment, std::string secret);

    /// The name as it is reported: itself, "app-" and 16 hexadecimal digits, or none.
    std::optional<std::string> apply(const std::string& application) const;

private:
    NameTreatment treatment_;
    std::string secret_;
};

/// What differs between devices and is the same on one: the text of its /etc/machine-id. Empty where this is no ID, as
/// on a device that has yet to get one.
std::string deviceSecretOf(std::string_view machineID);

} // namespace vela::reporter
