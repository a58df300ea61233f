// Notifications as files, one for each name:
//
//     <runtime>/notifications/com.orvex.lobby.ringerstate      the state as a decimal number: "1"
//
// A post replaces the file, also with the state that it had. A line end behind the number is allowed; with anything
// else a file has no state. Free functions, thread-safe, also towards other programs that use them.
#pragma once

#include "platform/Result.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace vela::platform {

/// The folder below `<runtime>`.
std::string notificationFolder(const std::string& runtimeFolder);

/// Whether `name` can be a file's: not empty, without "/" and NUL, without "." first, of at most 255 bytes.
bool isNotificationName(std::string_view name);

/// The state that `text` says, or none.
std::optional<std::uint64_t> readNotificationState(std::string_view text);

/// The state of the file `name` in `folder`, or none.
std::optional<std::uint64_t> notificationState(const std::string& folder, const std::string& name);

/// Posts `name`, for the administrator's tool. Without a `state` it stays as it is, 0 where there is none. Creates the
/// folder where it is missing.
Result<Done> postNotification(const std::string& runtimeFolder, const std::string& name,
                              std::optional<std::uint64_t> state);

} // namespace vela::platform
