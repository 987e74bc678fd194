#pragma once

namespace tessel::importers {

// Whether an import also deletes the records of earlier imports of the same kind (and, for
// calendars, of the same calendar) that it no longer produces.
enum class SyncDeletes { Off, On };

}  // namespace tessel::importers
