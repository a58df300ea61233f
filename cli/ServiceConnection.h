// The service as velactl reaches it. One thread.
#pragma once

#include "cli/Subcommand.h"
#include "common/values/Dictionary.h"
#include "platform/Result.h"
#include "platform/dbus/BlockingConnection.h"

#include <chrono>
#include <optional>
#include <string>

namespace vela {

/// Longer than any reply that the service holds back: real-time reporting may wait 9 seconds for its back ends.
constexpr std::chrono::seconds kReplyPatience{30};

/// Connects to the service of $VELA_REPORTING_ADDRESS, else the user's, else the system's. Says on `console` why it
/// cannot.
std::optional<platform::dbus::BlockingConnection> connectToService(Console& console);

// What the service tells of itself.
platform::Result<std::string> readVersion(platform::dbus::BlockingConnection& connection);
platform::Result<Array> readSessions(platform::dbus::BlockingConnection& connection);
platform::Result<Dictionary> readLedger(platform::dbus::BlockingConnection& connection);

/// What a failed call leaves velactl with: kNoService where the service is gone, else kFailed.
int statusOf(const platform::Failure& failure);

} // namespace vela
