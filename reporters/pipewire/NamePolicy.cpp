#include "reporters/pipewire/NamePolicy.h"

#include "reporters/pipewire/Sha256.h"

#include <cstddef>
#include <utility>

namespace vela::reporter {

namespace {

/// Few enough digits to read, enough that the names of one device differ.
constexpr std::size_t kDigits = 16;

} // namespace

NamePolicy::NamePolicy(NameTreatment treatment, std::string secret)
    : treatment_(treatment),
      secret_(std::move(secret)) {}

std::optional<std::string> NamePolicy::apply(const std::string& application) const {
    switch (treatment_) {
    case NameTreatment::Report:
        return application;
    case NameTreatment::Hash: {
        if (secret_.empty()) {
            return std::nullopt;
        }
        // The outer hash keeps a secret of known length from being continued by a chosen name.
        const std::string hash = sha256(secret_ + '\0' + sha256(secret_ + '\0' + application));
        return hash.empty() ? std::nullopt : std::optional("app-" + hash.substr(0, kDigits));
    }
    case NameTreatment::Omit:
        break;
    }
    return std::nullopt;
}

std::string deviceSecretOf(std::string_view machineID) {
    constexpr std::size_t kIDDigits = 32;
    const std::string_view digits = machineID.substr(0, machineID.find('\n'));
    const bool isID = digits.size() == kIDDigits && machineID.size() <= kIDDigits + 1 &&
                      digits.find_first_not_of("0123456789abcdefABCDEF") == std::string_view::npos &&
                      digits.find_first_not_of('0') != std::string_view::npos;
    return isID ? std::string(machineID) : std::string();
}

} // namespace vela::reporter
