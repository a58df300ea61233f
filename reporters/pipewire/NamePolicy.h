// What becomes of an application's name. Immutable.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace vela::reporter {

enum class NameTreatment : std::uint8_t { Report, Hash, Omit };

class NamePolicy {
public:
    /// `secret` makes the hashes of this device differ from those of others, so that no table made in advance tells
    /// the names.
    NamePolicy(NameTreatment treatment, std::string secret);

    /// The name as it is reported: itself, "app-" and 16 hexadecimal digits, or none.
    std::optional<std::string> apply(const std::string& application) const;

private:
    NameTreatment treatment_;
    std::string secret_;
};

} // namespace vela::reporter
