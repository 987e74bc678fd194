#include "tools/tessel/record_summary.h"

#include <string_view>
#include <utility>
#include <vector>

#include "tessel/schema.h"

namespace tessel::cli {

using zt::platform::Dictionary;
using zt::platform::Value;

namespace {

struct NamingKeys {
  std::string_view entity;
  std::vector<std::string_view> keys;
};

const std::vector<NamingKeys>& namingKeys() {
  static const std::vector<NamingKeys> table = {
      {TesselEntity_Contacts_Contact,
       {TesselAttribute_Contacts_Contact_FirstName, TesselAttribute_Contacts_Contact_LastName,
        TesselAttribute_Contacts_Contact_CompanyName}},
      {TesselEntity_Contacts_Group, {TesselAttribute_Contacts_Group_Name}},
      {TesselEntity_Contacts_PhoneNumber, {TesselAttribute_Contacts_PhoneNumber_Value}},
      {TesselEntity_Contacts_EmailAddress, {TesselAttribute_Contacts_EmailAddress_Value}},
      {TesselEntity_Contacts_URL, {TesselAttribute_Contacts_URL_Value}},
      {TesselEntity_Contacts_IM, {TesselAttribute_Contacts_IM_User}},
      {TesselEntity_Contacts_StreetAddress,
       {TesselAttribute_Contacts_StreetAddress_Street,
        TesselAttribute_Contacts_StreetAddress_City}},
      {TesselEntity_Calendars_CalendarOrder,
       {TesselRelationship_Calendars_CalendarOrder_Calendars}},
      {TesselEntity_Calendars_Calendar, {TesselAttribute_Calendars_Calendar_Title}},
      {TesselEntity_Calendars_Event,
       {TesselAttribute_Calendars_Event_Summary, TesselAttribute_Calendars_Event_StartDate}},
      {TesselEntity_Calendars_Task,
       {TesselAttribute_Calendars_Task_Summary, TesselAttribute_Calendars_Task_DueDate}},
      {TesselEntity_Calendars_Recurrence, {TesselAttribute_Calendars_Recurrence_Frequency}},
      {TesselEntity_Calendars_Organizer,
       {TesselAttribute_Calendars_Organizer_CommonName, TesselAttribute_Calendars_Organizer_Email}},
      {TesselEntity_Calendars_Attendee,
       {TesselAttribute_Calendars_Attendee_CommonName, TesselAttribute_Calendars_Attendee_Email}},
  };
  return table;
}

std::string text(const Value& value) {
  if (const std::string* s = value.asString()) return *s;
  if (const zt::platform::Array* array = value.asArray()) {
    std::string out;
    for (const Value& item : *array) {
      if (!out.empty()) out += ", ";
      out += text(item);
    }
    return out;
  }
  if (const zt::platform::Url* url = value.asUrl()) return url->text;
  if (value.kind() == Value::Kind::Data || value.kind() == Value::Kind::Dictionary) return {};
  return value.description();
}

// Cuts at a character boundary so that a shortened name stays valid UTF-8.
void shorten(std::string& s, std::size_t maxLength) {
  if (s.size() <= maxLength) return;
  std::size_t cut = maxLength;
  while (cut > 0 && (static_cast<unsigned char>(s[cut]) & 0xC0) == 0x80) --cut;
  s.resize(cut);
  s += "...";
}

}  // namespace

std::string recordSummary(const Dictionary& record, std::size_t maxLength) {
  std::string out;
  const Value* entity = record.find(TesselRecordEntityNameKey);
  const std::string* entityName = entity != nullptr ? entity->asString() : nullptr;
  if (entityName != nullptr) {
    for (const NamingKeys& naming : namingKeys()) {
      if (naming.entity != *entityName) continue;
      for (std::string_view key : naming.keys) {
        const Value* value = record.find(key);
        if (value == nullptr) continue;
        const std::string piece = text(*value);
        if (piece.empty()) continue;
        if (!out.empty()) out += ' ';
        out += piece;
      }
    }
  }
  if (out.empty()) {
    for (const auto& [key, value] : record) {
      if (key == TesselRecordEntityNameKey || value.asString() == nullptr) continue;
      if (value.asString()->empty()) continue;
      out = *value.asString();
      break;
    }
  }
  for (char& c : out) {
    if (c == '\t' || c == '\n' || c == '\r') c = ' ';
  }
  shorten(out, maxLength);
  return out;
}

}  // namespace tessel::cli
