#include "importers/ical_participants.h"

#include <string>

#include "importers/ical_properties.h"
#include "platform/ascii.h"
#include "tessel/schema.h"

namespace tessel::importers::ical {

using zt::platform::Dictionary;
using zt::platform::lowerAscii;
using zt::platform::Value;

namespace {

// RFC 5545 section 3.2.12: participation words become the schema's ("NEEDS-ACTION" →
// "needsaction").
std::string participationWord(std::string_view partstat) {
  std::string word;
  for (char c : lowerAscii(partstat)) {
    if (c != '-') word += c;
  }
  return word;
}

}  // namespace

Dictionary participantRecord(icalproperty* property, std::string_view entity) {
  const bool attendee = entity == TesselEntity_Calendars_Attendee;
  Dictionary record{{TesselRecordEntityNameKey, Value(entity)}};
  if (auto dir = parameter(property, "DIR")) {
    record.set(TesselAttribute_Calendars_Attendee_DirectoryEntry, Value(*dir));
  }
  if (auto cn = parameter(property, "CN")) {
    record.set(TesselAttribute_Calendars_Attendee_CommonName, Value(*cn));
  }
  record.set(TesselAttribute_Calendars_Attendee_Email, Value(valueText(property)));
  if (!attendee) return record;
  if (auto cutype = parameter(property, "CUTYPE")) {
    record.set(TesselAttribute_Calendars_Attendee_UserType, Value(lowerAscii(*cutype)));
  }
  if (auto role = parameter(property, "ROLE")) {
    record.set(TesselAttribute_Calendars_Attendee_Role, Value(lowerAscii(*role)));
  }
  if (auto partstat = parameter(property, "PARTSTAT")) {
    record.set(TesselAttribute_Calendars_Attendee_Status, Value(participationWord(*partstat)));
  }
  if (auto rsvp = parameter(property, "RSVP")) {
    record.set(TesselAttribute_Calendars_Attendee_Rsvp,
               Value::boolean(lowerAscii(*rsvp) == "true"));
  }
  if (auto to = parameter(property, "DELEGATED-TO")) {
    record.set(TesselAttribute_Calendars_Attendee_Delegatedto, Value(*to));
  }
  if (auto from = parameter(property, "DELEGATED-FROM")) {
    record.set(TesselAttribute_Calendars_Attendee_Delegatedfrom, Value(*from));
  }
  return record;
}

}  // namespace tessel::importers::ical
