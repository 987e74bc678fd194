#pragma once

struct icalcomponent_impl;

namespace tessel::importers {

class ICalDocument;
class ICalTimeZones;

// What ICalDocument::read hands on, in file order: each VCALENDAR object before its items,
// then each of its VEVENT and VTODO components.
class ICalDocumentVisitor {
 public:
  virtual ~ICalDocumentVisitor() = default;

  // The VCALENDAR object's properties and time zones, without its events and tasks; it and
  // `zones` last until read returns.
  virtual void calendar(const ICalDocument& document, icalcomponent_impl* calendar,
                        ICalTimeZones& zones) = 0;

  // One VEVENT or VTODO of the last calendar, with its alarms, read alone and freed once
  // the call returns.
  virtual void item(const ICalDocument& document, icalcomponent_impl* component) = 0;
};

}  // namespace tessel::importers
