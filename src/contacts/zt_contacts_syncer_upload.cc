// The write of the contacts file to the player, and what is remembered of it.
#include <filesystem>
#include <optional>
#include <span>
#include <string>
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
  Log::debug("Uploading changes to %@ (%ul bytes)", path.string(), _vcardSize);

  const platform::FolderHandle* contacts = _syncManager.zetoContactsFolder();
  const std::string fileName(kFileName);
  // A power loss or a pulled cable leaves the player with the old file or the new one,
  // never half of one. The accepted changes stay uncommitted when the write fails, so the
  // next run offers them again.
  std::optional<platform::AtomicFile> file = std::move(_vcardFile);
  _vcardFile.reset();
  if (!contacts || !file || !file->commit()) {
    Log::debug("Unabled to write file on Zeto");
    _syncManager.setLastStatus(sync::kStatusWriteFailed);
    return false;
  }
  Log::debug("Uploading done");

  platform::Result<platform::FileAttributes> attributes = contacts->attributes(fileName);
  if (!attributes) {
    Log::debug("Can't get VCF attributes after push. Reason: %@", attributes.error());
    _syncManager.setLastStatus(sync::kStatusWriteFailed);
    return false;
  }
  // The date is the one the next run compares with the file's (the same full-precision
  // reading), so an untouched file is recognised.
  const std::optional<platform::CalendarDate>& date = attributes->modificationDate;
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
