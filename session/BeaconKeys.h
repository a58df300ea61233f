// Keys of what real-time reporting is told of a session, and the service's own values. A configuration that holds one
// of the user information's keys wins over the service's value.
#pragma once

#include "common/values/Dictionary.h"

#include <cstdint>

namespace vela {

// Session information.
inline const Key kBeaconClientType("client_type");       ///< integer
inline const Key kBeaconClientVersion("client_version"); ///< 32-bit float
inline const Key kBeaconSessionID("session_id");         ///< integer: the reporter ID, or -1 for a single message
inline const Key kBeaconBatchEvents("batch_events");     ///< boolean
inline const Key kBeaconHierarchyToken("hierarchy_token");
inline const Key kBeaconContainsRealTimeEvents("contains_real_time_events"); ///< boolean
inline const Key kBeaconClientBundleID("client_bundle_id");                  ///< the configuration's application name

// User information.
inline const Key kBeaconClientName("client_name");
inline const Key kBeaconServiceName("service_name");

inline constexpr std::int64_t kBeaconClientTypeValue = 19;
inline constexpr float kBeaconClientVersionValue = 2.1F;
inline constexpr const char* kBeaconClientNameValue = "com.orvex.vela";
inline constexpr const char* kBeaconServiceNameSuffix = "_session";
inline constexpr std::int64_t kBeaconSingleMessageSessionID = -1;
inline constexpr std::int64_t kBeaconBackendTimeoutSeconds = 9;

} // namespace vela
