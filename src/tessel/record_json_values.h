#pragma once

// The values that JSON has no kind for, as objects with one `$` key: {"$url": ...},
// {"$data": "<base64>"}, {"$date": "2007-03-15T12:30:00", "tz": ZONE}.

#include "platform/calendar_date.h"
#include "platform/value.h"
#include "tessel/record_json_path.h"

namespace tessel::typed_json {

// {"$date": ..., "tz": ...}: the wall-clock time in the date's zone, and the zone.
Json dateToJson(const zt::platform::CalendarDate& date);

// The value of an object with a `$` key; RecordJsonError for anything but the typed forms.
zt::platform::Value typedValueFromJson(const Json& json, const Path& path);

}  // namespace tessel::typed_json
