#pragma once

#include <functional>
#include <memory>

#include "filters/filter_helpers.h"

namespace zt::sync {

class ZTSyncManager;

// A syncer of one data class. It lives from the manager's pull preparation to the end of
// its own doSync, and is its filter class's helper meanwhile. doSync answers whether the run
// goes on; on failure it has set the manager's status itself.
class ContactsSyncing : public filters::ContactFilterHelper {
 public:
  virtual bool doSync() = 0;
};

class CalendarsSyncing : public filters::CalendarFilterHelper {
 public:
  virtual bool doSync() = 0;
};

// Makers of the syncers, given to the manager by whoever assembles the tool. A data class
// without a maker is left out of the run.
struct SyncerMakers {
  std::function<std::unique_ptr<ContactsSyncing>(ZTSyncManager&)> contacts;
  std::function<std::unique_ptr<CalendarsSyncing>(ZTSyncManager&)> calendars;
};

}  // namespace zt::sync
