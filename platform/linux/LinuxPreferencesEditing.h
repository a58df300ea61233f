// Changes preferences, for the administrator's tool. Thread-safe, also towards other programs that use this: one change
// at a time, and readers see a file before or after it.
#pragma once

#include "platform/linux/LinuxPreferences.h"

#include <functional>
#include <string>
#include <string_view>

namespace vela::platform {

class LinuxPreferencesEditing {
public:
    /// `stateFolder` is `<state>`. What is referred to outlives this.
    LinuxPreferencesEditing(const std::string& stateFolder, FileSystem& fileSystem,
                            const PropertyListReading& propertyLists)
        : preferences_(stateFolder, fileSystem, propertyLists),
          fileSystem_(fileSystem),
          propertyLists_(propertyLists) {}

    /// Everything in the domain; nothing where it has no file.
    Result<Dictionary> readAll(std::string_view domain) const;

    /// Sets `key`. The folder is created where it is missing, and the file is an XML one of permissions 0644
    /// afterwards, whatever it was. A file that cannot be read is left as it is.
    Result<Done> write(std::string_view domain, std::string_view key, const Value& value);

    /// Takes `key` away; false when it is not there. A file that has nothing left stays, as an empty dictionary.
    Result<bool> remove(std::string_view domain, std::string_view key);

    /// Takes every key of the domain away, at once; false when it has none.
    Result<bool> removeAll(std::string_view domain);

private:
    /// Replaces the domain's file by what `rest` leaves of it; false when that is everything.
    Result<bool> removeFrom(std::string_view domain, const std::function<Dictionary(const Dictionary&)>& rest);
    Result<Done> replace(std::string_view domain, const Dictionary& content);

    const LinuxPreferences preferences_;
    FileSystem& fileSystem_;
    const PropertyListReading& propertyLists_;
};

} // namespace vela::platform
