// Names of the preferences, notifications and table entries that tell the state of a device's features.
#pragma once

#include "common/values/Key.h"

#include <string_view>

namespace vela {

// Domains of the preferences.
inline constexpr std::string_view kVelaDomain = "com.orvex.vela";
inline constexpr std::string_view kLobbyDomain = "com.orvex.lobby";

// Preferences, and what a state stands under.
inline constexpr std::string_view kSpatialAudioAccessoryFeature = "spatial-audio-accessory-feature";
inline constexpr std::string_view kDeviceName = "device_name";
inline constexpr std::string_view kRingerState = "ringerstate";

// Notifications of a change.
inline constexpr std::string_view kSpatialAudioChanged = "com.orvex.lobby.spatial-audio-accessory-feature.changed";
inline constexpr std::string_view kDeviceNameChanged = "com.orvex.vela.reporting";
inline constexpr std::string_view kRingerStateChanged = "com.orvex.lobby.ringerstate";

// Keys of an entry of the feature table.
/// The domain of the preference; absent where the notification's own state is the feature's.
inline const Key kFeatureDefaultsDomain("defaults_domain");
inline const Key kFeatureDomain("feature_domain");
inline const Key kFeatureNotification("notification");
/// Of the registration for the notification, an integer; absent before it.
inline const Key kFeatureNotifyToken("notify_token");

} // namespace vela
