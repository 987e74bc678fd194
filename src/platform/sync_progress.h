#pragma once

#include <string>

// The names of the progress notifications a sync posts, shared by the tool that posts them
// and the command that watches them. Listeners outside this project match them by text, so
// the texts never change.
namespace zt::platform::sync_progress {

// The notification's name; its sender is the sync client's identifier.
inline const std::string kNotificationName = "TesselClientSyncNotification";

// The phases of a run, in order.
inline const std::string kConnectingPhase = "TesselClientConnectingPhase";
inline const std::string kMinglingPhase = "TesselClientMinglingPhase";
inline const std::string kUploadingPhase = "TesselClientUploadingPhase";
inline const std::string kDisconnectingPhase = "TesselClientDisconnectingPhase";

// The keys of the notification's payload.
inline const std::string kCurrentPhaseKey = "TesselClientCurrentPhase";
inline const std::string kStatusKey = "TesselClientStatus";
inline const std::string kDataClassSyncingKey = "TesselClientDataClassSyncing";
inline const std::string kDataClassKey = "TesselClientDataClassProgressionPhase";
inline const std::string kPercentKey = "TesselClientPercentProgressionPhase";

}  // namespace zt::platform::sync_progress
