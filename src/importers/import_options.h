#pragma once

namespace tessel::importers {

// Whether an import also deletes the records of earlier imports of the same kind (and, for
// calendars, of the same calendar) that it no longer produces.
enum class SyncDeletes { Off, On };

// What a fault in an imported file costs: only what cannot be read (a property, else its
// component or card), with a warning; or, with Refuse, the whole import.
enum class OnFault { Skip, Refuse };

}  // namespace tessel::importers
