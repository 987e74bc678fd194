#pragma once

// The values that JSON has no kind for, as objects with one `$` key: {"$url": ...},
// {"$data": "<base64>"}, {"$date": "2007-03-15T12:30:00", "tz": ZONE}.

#include <optional>
#include <string_view>

#include "platform/calendar_date.h"
#include "platform/value.h"
#include "tessel/record_json_path.h"

namespace tessel::typed_json {

// {"$date": ..., "tz": ...}: the wall-clock time in the date's zone, and the zone.
Json dateToJson(const zt::platform::CalendarDate& date);

// The zone a date's "tz" names: "local", "GMT", "UTC" or a zone of the time-zone database.
std::optional<zt::platform::TimeZone> zoneNamed(std::string_view name);
// The date {"$date": wallClock, "tz": zone} stands for; nothing when the wall-clock text is not
// one (typedValueFromJson says why).
std::optional<zt::platform::Value> dateValue(std::string_view wallClock,
                                             zt::platform::TimeZone zone);

// The value of an object with a `$` key; RecordJsonError for anything but the typed forms.
zt::platform::Value typedValueFromJson(const Json& json, const Path& path);

}  // namespace tessel::typed_json
