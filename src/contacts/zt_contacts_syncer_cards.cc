// The file image of the contacts: one card per selected contact of truth.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "contacts/vcard_writer.h"
#include "contacts/zt_contacts_syncer.h"
#include "platform/identity.h"
#include "platform/log.h"
#include "platform/utf16.h"
#include "sync/sync_status.h"
#include "sync/zt_sync_manager.h"
#include "tessel/exception.h"
#include "tessel/schema.h"

namespace zt::contacts {

using platform::Log;

bool ZTContactsSyncer::isSelected(const platform::Dictionary& contact) {
  if (!_contactFilter || _contactFilter->useAllContacts()) return true;
  const platform::Value* parents =
      contact.find(tessel::TesselRelationship_Contacts_Contact_ParentGroups);
  if (!parents || !parents->asArray()) return false;
  const std::set<std::string>& selected = expandedFilteredGroupsIDs();
  for (const std::string& identifier : platform::stringsIn(parents)) {
    if (selected.contains(identifier)) return true;
  }
  return false;
}

namespace {

// How many cards have their pictures converted together.
constexpr std::size_t kPhotoBatch = 512;

}  // namespace

void ZTContactsSyncer::appendToFile(std::string_view utf8, Flush flush) {
  // Enough to keep the writes few; little beside a card's photo.
  constexpr std::size_t kWriteSize = std::size_t{1} << 20;
  const std::size_t before = _vcardPending.size();
  platform::utf16::appendBigEndian(_vcardPending, utf8);
  _vcardSize += _vcardPending.size() - before;
  if (_vcardPending.size() < kWriteSize && flush == Flush::WhenFull) return;
  if (_vcardFile) {
    const std::span<const std::uint8_t> bytes(
        reinterpret_cast<const std::uint8_t*>(_vcardPending.data()), _vcardPending.size());
    // A failed write removes the temporary file; the upload then reports the failure.
    if (!_vcardFile->write(bytes)) _vcardFile.reset();
  }
  _vcardPending.clear();
}

bool ZTContactsSyncer::disassembleData() {
  Log::debug("Disassembling data");
  _vcardFile.reset();
  _vcardPending.clear();
  _vcardSize = 0;
  // A run that was killed, or a player pulled, between the write of the temporary file and
  // its rename left a full-size hidden copy behind. The device lock keeps any other sync from
  // writing meanwhile, so every such copy is stale; one that cannot be removed is no reason
  // not to write. Without a folder on the player there is nowhere to write, which the upload
  // reports.
  if (const platform::FolderHandle* contacts = _syncManager.zetoContactsFolder()) {
    const std::string fileName(kFileName);
    (void)contacts->removeStaleTemporaries(fileName);
    _vcardFile = platform::AtomicFile::create(*contacts, fileName).valueOrNone();
  }
  try {
    std::shared_ptr<tessel::Snapshot> snapshot = contactTruthSnapshot();
    // The contacts are read a batch at a time, never all at once: with their pictures, a
    // large address book would not fit in memory.
    const std::vector<std::string> identifiers =
        snapshot->recordIdentifiersOfEntity(tessel::TesselEntity_Contacts_Contact);
    Log::debug("Truth contains %ul contacts", identifiers.size());

    VCardWriter writer(*snapshot, [this]() -> ContactPhotoPreparation* {
      return _syncManager.shouldSyncContactImages() ? &ContactPhotoPreparation::shared() : nullptr;
    });
    tessel::Session& session = *_syncManager.syncSession();
    std::string card;
    std::size_t written = 0;
    bool photosUsed = false;
    // The selected contacts are written a batch at a time, after their pictures have been
    // converted together; the photo setting is asked only once a card is to be written.
    std::vector<platform::Dictionary> batch;
    // Where each contact of the batch was read: its identifier and generation.
    std::vector<std::pair<std::string, std::int64_t>> read;
    std::vector<const platform::Data*> pictures;
    std::vector<PictureOrigin> origins;
    // Within the store file, a record's identifier and generation stand for its picture's
    // bytes; without the file's identity, pictures are known by their bytes alone.
    const std::optional<std::string> store =
        platform::fileIdentity(_syncManager.services().storePath).valueOrNone();
    auto writeBatch = [&]() -> bool {
      if (batch.empty()) return true;
      if (_syncManager.shouldSyncContactImages()) {
        photosUsed = true;
        pictures.clear();
        origins.clear();
        for (std::size_t i = 0; i < batch.size(); ++i) {
          pictures.push_back(batch[i].dataAt(tessel::TesselAttribute_Contacts_Contact_Image));
          if (store) origins.push_back({*store, read[i].first, read[i].second});
        }
        ContactPhotoPreparation::shared().prefetch(pictures, origins);
      }
      for (const platform::Dictionary& contact : batch) {
        card.clear();
        writer.appendCard(card, contact);
        // One byte-order mark opens the file; the cards follow each other without one.
        if (written == 0) {
          _vcardPending += "\xFE\xFF";
          _vcardSize += 2;
        }
        appendToFile(card, Flush::WhenFull);
        ++written;
        if (session.isCancelled()) {
          Log::debug("Sync session is cancelled");
          _syncManager.setLastStatus(sync::kStatusCancelled);
          return false;
        }
      }
      batch.clear();
      read.clear();
      return true;
    };
    for (std::size_t first = 0; first < identifiers.size(); first += kPhotoBatch) {
      const std::vector<std::string> chunk(
          identifiers.begin() + static_cast<std::ptrdiff_t>(first),
          identifiers.begin() +
              static_cast<std::ptrdiff_t>(std::min(identifiers.size(), first + kPhotoBatch)));
      snapshot->forEachRecordWithIdentifiers(chunk, [&](tessel::Record& record) {
        if (isSelected(record.record)) {
          batch.push_back(std::move(record.record));
          read.emplace_back(std::move(record.id), record.generation);
        }
      });
      if (!writeBatch()) return false;
    }
    appendToFile({}, Flush::All);
    // The pictures of this push are all the photo cache keeps.
    if (photosUsed) ContactPhotoPreparation::shared().finishRun();
    Log::debug("Effectively stored %ul contacts on Zeto", written);
    return true;
  } catch (const tessel::Exception& exception) {
    _syncManager.reportEngineException("getting changes", exception);
    return false;
  }
}

}  // namespace zt::contacts
