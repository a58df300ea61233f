// Where channel files stand, how they are named, and how their publishers are told to live. Free functions; thread-safe
// as long as nobody changes the environment.
#pragma once

#include "platform/hwstats/ChannelTable.h"

#include <string>
#include <string_view>

namespace vela::platform::hwstats {

/// The folder of the channel files of a service whose runtime folder is `runtimeFolder`.
std::string channelFolder(std::string_view runtimeFolder);

/// What the name of a file begins with: "player-Speaker%20Driver-Speaker-" of a publisher, driver, group and subgroup.
/// Letters, digits, "_" and "." stand for themselves, other bytes are "%" and two digits; long names end in a hash.
std::string channelFileStem(std::string_view publisher, const ChannelTable& table);

/// Locks a file that is open for writing until its last descriptor is closed. False when a publisher has it.
bool lockAsPublisher(int descriptor);

/// Whether a publisher has locked the file.
bool hasLivingPublisher(int descriptor);

/// What publishers find in their environment.
struct PublisherEnvironment {
    std::string velaRuntime; ///< $VELA_RUNTIME: a service's runtime folder
    std::string runtimeHome; ///< $XDG_RUNTIME_DIR
    std::string systemRuntime = "/run/vela";
};

/// The folder to publish in, made where it is missing; empty with errno set where there can be none. $VELA_RUNTIME
/// alone when it is set; else the first of the user's and the system's runtime folder that is there and can be written
/// to, and at last a new one of the user's.
std::string makeChannelFolder(const PublisherEnvironment& environment);

} // namespace vela::platform::hwstats
