// Preferences in property-list files, one for each domain:
//
//     <state>/preferences/com.orvex.audio.plist      a dictionary from key to value, in any of the three formats
//
// Thread-safe. Every read opens the file anew, so that it needs no word of a change.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/FileSystem.h"
#include "platform/Preferences.h"
#include "platform/PropertyListReading.h"
#include "platform/Result.h"

#include <cstddef>
#include <string>
#include <string_view>

namespace vela::platform {

/// Bytes of a domain's file; a larger one is refused.
inline constexpr std::size_t kPreferencesFileBytes = std::size_t{1} << 20U;

class LinuxPreferences final : public Preferences {
public:
    /// `stateFolder` is `<state>`. What is referred to outlives this.
    LinuxPreferences(const std::string& stateFolder, const FileSystem& fileSystem,
                     const PropertyListReading& propertyLists)
        : folder_(stateFolder + "/preferences"),
          fileSystem_(fileSystem),
          propertyLists_(propertyLists) {}

    /// None also where the domain has no file, one that cannot be read, or a name that cannot be a file's.
    Value copyValue(std::string_view domain, std::string_view key) const override;

    /// The domain's whole file. Failures: EINVAL for a name that cannot be a file's, ENOENT where there is none, and
    /// what is wrong with it.
    Result<Dictionary> readDomain(std::string_view domain) const;

    /// The file of `domain`, or a failure for a name that cannot be one: empty, with "/" or NUL, with "." first, or too
    /// long.
    Result<std::string> pathOf(std::string_view domain) const;

    const std::string& folder() const { return folder_; }

private:
    const std::string folder_;
    const FileSystem& fileSystem_;
    const PropertyListReading& propertyLists_;
};

} // namespace vela::platform
