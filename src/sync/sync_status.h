#pragma once

#include <cstdint>

namespace zt::sync {

// The manager's outcome codes (`_lastStatus`).
inline constexpr std::int32_t kStatusSuccess = 0;
inline constexpr std::int32_t kStatusEngineFailure =
    -8863;  // engine exception, or calendar missing
inline constexpr std::int32_t kStatusCancelled = -8864;
inline constexpr std::int32_t kStatusWriteFailed = -8865;
inline constexpr std::int32_t kStatusDeviceUnavailable = -25176;
inline constexpr std::int32_t kStatusVolumeNotMounted = -25178;

// What the final notification reports for an outcome: 0 success, 1 cancelled, 2 error,
// 3 device unavailable.
constexpr std::int32_t reportedStatus(std::int32_t lastStatus) {
  switch (lastStatus) {
    case kStatusSuccess:
      return 0;
    case kStatusCancelled:
      return 1;
    case kStatusDeviceUnavailable:
    case kStatusVolumeNotMounted:
      return 3;
    default:
      return 2;
  }
}

}  // namespace zt::sync
