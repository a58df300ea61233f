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
        // The outer hash keeps a secret of known length from being continued by a chosen name.
        const std::string hash = sha256(secret_ + '\0' + sha256(secret_ + '\0' + application));
        return hash.empty() ? std::nullopt : std::optional("app-" + hash.substr(0, kDigits));
    }
    case NameTreatment::Omit:
        break;
    }
    return std::nullopt;
}

} // namespace vela::reporter
