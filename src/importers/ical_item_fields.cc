#include "importers/ical_item_fields.h"

#include "importers/ical_properties.h"
#include "platform/ascii.h"

namespace tessel::importers::ical {

using zt::platform::lowerAscii;

ItemFields readFields(const ComponentReader& reader, icalcomponent* component) {
  ItemFields fields;
  icalproperty* duration = nullptr;
  const bool task = icalcomponent_isa(component) == ICAL_VTODO_COMPONENT;
  // These may appear once (RFC 5545 section 3.6.1); of two, the first counts, as calendar
  // programs read them, and the other is named in a warning.
  const auto secondOf = [&](const std::optional<ReadDate>& first, icalproperty* property) {
    if (first) reader.warn(property, "a second " + reader.name(property) + ": ignored");
    return first.has_value();
  };
  const auto read = [&](icalproperty* property) {
    switch (icalproperty_isa(property)) {
      case ICAL_SUMMARY_PROPERTY:
        fields.summary = text(icalproperty_get_summary(property));
        break;
      case ICAL_DESCRIPTION_PROPERTY:
        fields.description = text(icalproperty_get_description(property));
        break;
      case ICAL_LOCATION_PROPERTY:
        fields.location = text(icalproperty_get_location(property));
        break;
      case ICAL_STATUS_PROPERTY:
        // The schema's status words are RFC 5545 section 3.8.1.11's in lower case.
        fields.status = lowerAscii(valueText(property));
        break;
      case ICAL_CLASS_PROPERTY:
        fields.classification = lowerAscii(valueText(property));
        break;
      case ICAL_URL_PROPERTY:
        fields.url = text(icalproperty_get_url(property));
        break;
      case ICAL_PRIORITY_PROPERTY:
        // 0 is "undefined" (section 3.8.1.9).
        if (int priority = icalproperty_get_priority(property); priority > 0) {
          fields.priority = priority;
        }
        break;
      case ICAL_DTSTART_PROPERTY:
        if (secondOf(fields.start, property)) break;
        fields.start = reader.date(property, icalproperty_get_dtstart(property));
        fields.startProperty = property;
        break;
      case ICAL_DTEND_PROPERTY:
        if (secondOf(fields.end, property)) break;
        fields.end = reader.date(property, icalproperty_get_dtend(property));
        break;
      case ICAL_DUE_PROPERTY:
        if (secondOf(fields.due, property)) break;
        fields.due = reader.date(property, icalproperty_get_due(property));
        break;
      case ICAL_COMPLETED_PROPERTY:
        fields.completed = reader.date(property, icalproperty_get_completed(property));
        break;
      case ICAL_DURATION_PROPERTY:
        duration = property;
        break;
      case ICAL_EXDATE_PROPERTY:
        fields.exceptionDates.emplace_back(
            reader.date(property, icalproperty_get_exdate(property)).date);
        break;
      case ICAL_RRULE_PROPERTY:
        fields.rules.push_back(property);
        break;
      case ICAL_ORGANIZER_PROPERTY:
        if (fields.organizer == nullptr) fields.organizer = property;
        break;
      case ICAL_ATTENDEE_PROPERTY:
        fields.attendees.push_back(property);
        break;
      default:
        break;
    }
  };
  for (icalproperty* property : propertiesOf(component)) {
    try {
      read(property);
    } catch (const ImportError& fault) {
      // An event is where and when it starts: without its start it is dropped as a whole.
      if (!task && icalproperty_isa(property) == ICAL_DTSTART_PROPERTY) throw;
      reader.drop(fault, property);
    }
  }
  std::optional<ReadDate>& finish = task ? fields.due : fields.end;
  if (!finish && fields.start) {
    if (duration != nullptr) {
      try {
        finish = reader.plus(duration, *fields.start, icalproperty_get_duration(duration));
      } catch (const ImportError& fault) {
        reader.drop(fault, duration);
      }
    }
    if (!finish && !task) {
      // Section 3.6.1: without DTEND or DURATION an event of a DATE lasts that day, one of
      // a DATE-TIME lasts no time.
      icaldurationtype day = icaldurationtype_null_duration();
      day.days = fields.start->wholeDay ? 1 : 0;
      finish = reader.plus(fields.startProperty, *fields.start, day);
    }
  }
  return fields;
}

}  // namespace tessel::importers::ical
