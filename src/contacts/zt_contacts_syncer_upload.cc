// The write of the contacts file to the player, and what is remembered of it.
#include <filesystem>
#include <optional>
#include <span>
#include <variant>

#include "contacts/zt_contacts_syncer.h"
#include "platform/log.h"
#include "sync/sync_status.h"
#include "sync/zt_sync_manager.h"
#include "tessel/exception.h"

namespace zt::contacts {

using platform::Log;

bool ZTContactsSyncer::uploadChanges() {
  const std::optional<std::string>& folder = _syncManager.pathToZetoContactsFolder();
  const std::filesystem::path path = std::filesystem::path(folder.value_or("")) / kFileName;
  Log::debug("Uploading changes to %@ (%ul bytes)", path.string(), _allVCardData.size());

  const platform::FileSystem& files = _syncManager.services().files;
  const std::span<const std::uint8_t> bytes(
      reinterpret_cast<const std::uint8_t*>(_allVCardData.data()), _allVCardData.size());
  // A power loss or a pulled cable leaves the player with the old file or the new one,
  // never half of one. The accepted changes stay uncommitted when the write fails, so the
  // next run offers them again. Without a folder on the player there is nowhere to write.
  if (!folder || files.atomicWrite(path, bytes)) {
    Log::debug("Unabled to write file on Zeto");
    _syncManager.setLastStatus(sync::kStatusWriteFailed);
    return false;
  }
  Log::debug("Uploading done");

  std::variant<platform::FileAttributes, std::string> attributes = files.attributes(path);
  if (const std::string* reason = std::get_if<std::string>(&attributes)) {
    Log::debug("Can't get VCF attributes after push. Reason: %@", *reason);
    _syncManager.setLastStatus(sync::kStatusWriteFailed);
    return false;
  }
  // The date is the one the next run compares with the file's (the same full-precision
  // reading), so an untouched file is recognised.
  const std::optional<platform::CalendarDate>& date =
      std::get<platform::FileAttributes>(attributes).modificationDate;
  try {
    tessel::Client& client = *_syncManager.syncClient();
    if (date) {
      Log::debug("Storing last modification date of VCF file on Zeto");
      client.setSetting(kLastModDateForVCF, platform::Value(*date));
      const bool photos = _syncManager.shouldSyncContactImages();
      Log::debug("Storing the fact we %@ sync contact images", photos ? "did" : "did not");
      client.setSetting(kDidSyncContactImages, platform::Value::boolean(photos));
    } else {
      Log::debug("WARNING: Can't get back modification date after push...");
    }
  } catch (const tessel::Exception& exception) {
    Log::debug("Exception while storing the state of the VCF file:\n%@", exception);
    _syncManager.setLastStatusForException(exception);
    return false;
  }
  return _syncManager.commitAcceptedChanges();
}

}  // namespace zt::contacts
