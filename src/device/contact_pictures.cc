#include "device/contact_pictures.h"

#include <optional>

#include "device/checkpoint_data.h"
#include "device/driver_entry_lookup.h"
#include "platform/log.h"
#include "platform/property_list.h"

namespace zt::device {

using platform::Log;

namespace {

constexpr std::string_view kPicturesKey = "vCardWithJPEGSupported";

// Ends the run of low-level lines however the probe ends.
class CrypticLogs {
 public:
  CrypticLogs() {
    Log::debug("Start of process to get info on Zeto. Logs might become a little bit cryptic");
  }
  ~CrypticLogs() { Log::debug("End of cryptic logs"); }
  CrypticLogs(const CrypticLogs&) = delete;
  CrypticLogs& operator=(const CrypticLogs&) = delete;
};

}  // namespace

bool checkpointSupportsContactPictures(std::span<const std::uint8_t> document) {
  platform::Result<platform::Value> parsed = platform::parsePropertyList(document);
  if (!parsed) {
    Log::debug("Can't parse XML checkpoint data: %@", parsed.error());
    return false;
  }
  const platform::Value& root = *parsed;
  const platform::Dictionary* dictionary = root.asDictionary();
  if (!dictionary) {
    Log::debug("Checkpoint data was not a dictionary property list. It is a %@", root.typeName());
    return false;
  }
  const platform::Value* value = dictionary->find(kPicturesKey);
  if (!value) {
    Log::debug(
        "Checkpoint dict does not have vCardWithJPEGSupported key - likely this Zeto does not "
        "support Contact pictures");
    return false;
  }
  if (const platform::Number* number = value->asNumber()) {
    Log::debug("Value for vCardWithJPEGSupported is %@", *value);
    return number->boolValue();
  }
  Log::debug("Error: Value for vCardWithJPEGSupported key is not a boolean. This is a %@",
             value->typeName());
  return false;
}

bool deviceSupportsContactPictures(const std::string& volumePath,
                                   platform::HardwareRegistry& registry,
                                   platform::ScsiPassThrough& passThrough) {
  CrypticLogs logs;
  if (volumePath.empty()) {
    Log::debug("Invalid volume");
    return false;
  }
  std::optional<std::string> deviceFile = registry.mountedFromDevice(volumePath);
  if (!deviceFile) {
    Log::debug("Errror getting volume stats");
    return false;
  }
  std::optional<platform::RegistryEntry> driver;
  if (!findDriverEntry(registry, *deviceFile, kZetoDriverClassNames, &driver)) return false;

  Log::debug("Trying to get Checkpoint data from Hwtree object");
  std::optional<CheckpointData> data = readCheckpointData(passThrough, *driver);
  driver.reset();
  if (!data) {
    Log::debug(
        "Error getting Checkpoint data - Can't determine Zeto features - Considering Zeto does "
        "not support Contact pictures");
    return false;
  }
  return checkpointSupportsContactPictures(*data);
}

bool deviceSupportsContactPictures(const std::string& volumePath) {
  std::unique_ptr<platform::HardwareRegistry> registry = platform::makeHardwareRegistry();
  std::unique_ptr<platform::ScsiPassThrough> passThrough = platform::makeScsiPassThrough();
  return deviceSupportsContactPictures(volumePath, *registry, *passThrough);
}

}  // namespace zt::device
