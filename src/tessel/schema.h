#pragma once

// Names of the Tessel sync engine's published schema: entity names, attribute and
// relationship keys of engine records, enumeration values and data classes. Their texts
// belong to the engine; the tool only ever compares them by plain string equality.

#include <string_view>

namespace tessel {

// The key under which a record carries its entity name.
inline constexpr std::string_view TesselRecordEntityNameKey = "tessel.record.entity";

// Data classes.
inline constexpr std::string_view TesselDataClass_Contacts = "tessel.contacts";
inline constexpr std::string_view TesselDataClass_Calendars = "tessel.calendars";

// Entities.
inline constexpr std::string_view TesselEntity_Contacts_Contact = "tessel.contacts.Contact";
inline constexpr std::string_view TesselEntity_Contacts_EmailAddress =
    "tessel.contacts.EmailAddress";
inline constexpr std::string_view TesselEntity_Contacts_PhoneNumber = "tessel.contacts.PhoneNumber";
inline constexpr std::string_view TesselEntity_Contacts_IM = "tessel.contacts.IM";
inline constexpr std::string_view TesselEntity_Contacts_StreetAddress =
    "tessel.contacts.StreetAddress";
inline constexpr std::string_view TesselEntity_Contacts_URL = "tessel.contacts.URL";
inline constexpr std::string_view TesselEntity_Contacts_Group = "tessel.contacts.Group";
inline constexpr std::string_view TesselEntity_Calendars_CalendarOrder =
    "tessel.calendars.CalendarOrder";
inline constexpr std::string_view TesselEntity_Calendars_Calendar = "tessel.calendars.Calendar";
inline constexpr std::string_view TesselEntity_Calendars_Event = "tessel.calendars.Event";
inline constexpr std::string_view TesselEntity_Calendars_Task = "tessel.calendars.Task";
inline constexpr std::string_view TesselEntity_Calendars_Recurrence = "tessel.calendars.Recurrence";
inline constexpr std::string_view TesselEntity_Calendars_AudioAlarm = "tessel.calendars.AudioAlarm";
inline constexpr std::string_view TesselEntity_Calendars_MailAlarm = "tessel.calendars.MailAlarm";
inline constexpr std::string_view TesselEntity_Calendars_DisplayAlarm =
    "tessel.calendars.DisplayAlarm";
inline constexpr std::string_view TesselEntity_Calendars_Organizer = "tessel.calendars.Organizer";
inline constexpr std::string_view TesselEntity_Calendars_Attendee = "tessel.calendars.Attendee";

// Contacts: Contact.
inline constexpr std::string_view TesselAttribute_Contacts_Contact_FirstName = "first name";
inline constexpr std::string_view TesselAttribute_Contacts_Contact_LastName = "last name";
inline constexpr std::string_view TesselAttribute_Contacts_Contact_MiddleName = "middle name";
inline constexpr std::string_view TesselAttribute_Contacts_Contact_Title = "title";
inline constexpr std::string_view TesselAttribute_Contacts_Contact_Suffix = "suffix";
inline constexpr std::string_view TesselAttribute_Contacts_Contact_Nickname = "nickname";
inline constexpr std::string_view TesselAttribute_Contacts_Contact_MaidenName = "maiden name";
inline constexpr std::string_view TesselAttribute_Contacts_Contact_LastNameYomi =
    "phonetic last name";
inline constexpr std::string_view TesselAttribute_Contacts_Contact_FirstNameYomi =
    "phonetic first name";
inline constexpr std::string_view TesselAttribute_Contacts_Contact_CompanyName = "company name";
inline constexpr std::string_view TesselAttribute_Contacts_Contact_Department = "department";
inline constexpr std::string_view TesselAttribute_Contacts_Contact_JobTitle = "job title";
inline constexpr std::string_view TesselAttribute_Contacts_Contact_Notes = "notes";
inline constexpr std::string_view TesselAttribute_Contacts_Contact_Image = "image";
inline constexpr std::string_view TesselRelationship_Contacts_Contact_ParentGroups =
    "parent groups";
inline constexpr std::string_view TesselRelationship_Contacts_Contact_PhoneNumbers =
    "phone numbers";
inline constexpr std::string_view TesselRelationship_Contacts_Contact_EmailAddresses =
    "email addresses";
inline constexpr std::string_view TesselRelationship_Contacts_Contact_StreetAddresses =
    "street addresses";
inline constexpr std::string_view TesselRelationship_Contacts_Contact_URLs = "urls";
inline constexpr std::string_view TesselRelationship_Contacts_Contact_IMs = "instant messaging";

// Contacts: PhoneNumber.
inline constexpr std::string_view TesselAttribute_Contacts_PhoneNumber_Value = "value";
inline constexpr std::string_view TesselAttribute_Contacts_PhoneNumber_Type = "type";
inline constexpr std::string_view TesselEnumValue_Contacts_PhoneNumber_Type_Home = "home";
inline constexpr std::string_view TesselEnumValue_Contacts_PhoneNumber_Type_Work = "work";
inline constexpr std::string_view TesselEnumValue_Contacts_PhoneNumber_Type_Mobile = "mobile";
inline constexpr std::string_view TesselEnumValue_Contacts_PhoneNumber_Type_Main = "main";
inline constexpr std::string_view TesselEnumValue_Contacts_PhoneNumber_Type_HomeFax = "home fax";
inline constexpr std::string_view TesselEnumValue_Contacts_PhoneNumber_Type_WorkFax = "work fax";
inline constexpr std::string_view TesselEnumValue_Contacts_PhoneNumber_Type_Pager = "pager";
inline constexpr std::string_view TesselEnumValue_Contacts_PhoneNumber_Type_Other = "other";

// Contacts: EmailAddress.
inline constexpr std::string_view TesselAttribute_Contacts_EmailAddress_Value = "value";
inline constexpr std::string_view TesselAttribute_Contacts_EmailAddress_Type = "type";
inline constexpr std::string_view TesselEnumValue_Contacts_EmailAddress_Type_Home = "home";
inline constexpr std::string_view TesselEnumValue_Contacts_EmailAddress_Type_Work = "work";
inline constexpr std::string_view TesselEnumValue_Contacts_EmailAddress_Type_Other = "other";

// Contacts: StreetAddress.
inline constexpr std::string_view TesselAttribute_Contacts_StreetAddress_Type = "type";
inline constexpr std::string_view TesselAttribute_Contacts_StreetAddress_Street = "street";
inline constexpr std::string_view TesselAttribute_Contacts_StreetAddress_City = "city";
inline constexpr std::string_view TesselAttribute_Contacts_StreetAddress_State = "state";
inline constexpr std::string_view TesselAttribute_Contacts_StreetAddress_PostalCode = "postal code";
inline constexpr std::string_view TesselAttribute_Contacts_StreetAddress_Country = "country";
inline constexpr std::string_view TesselEnumValue_Contacts_StreetAddress_Type_Home = "home";
inline constexpr std::string_view TesselEnumValue_Contacts_StreetAddress_Type_Work = "work";
inline constexpr std::string_view TesselEnumValue_Contacts_StreetAddress_Type_Other = "other";

// Contacts: URL.
inline constexpr std::string_view TesselAttribute_Contacts_URL_Value = "value";
inline constexpr std::string_view TesselAttribute_Contacts_URL_Type = "type";

// Contacts: IM.
inline constexpr std::string_view TesselAttribute_Contacts_IM_User = "user";
inline constexpr std::string_view TesselAttribute_Contacts_IM_Service = "service";
inline constexpr std::string_view TesselAttribute_Contacts_IM_Type = "type";
inline constexpr std::string_view TesselEnumValue_Contacts_URL_IM_Type_Home = "home";
inline constexpr std::string_view TesselEnumValue_Contacts_URL_IM_Type_Work = "work";
inline constexpr std::string_view TesselEnumValue_Contacts_URL_IM_Type_Other = "other";

// Contacts: Group.
inline constexpr std::string_view TesselAttribute_Contacts_Group_Name = "name";
inline constexpr std::string_view TesselRelationship_Contacts_Group_Members = "members";

// Calendars: CalendarOrder.
inline constexpr std::string_view TesselRelationship_Calendars_CalendarOrder_Calendars =
    "calendars";

// Calendars: Calendar.
inline constexpr std::string_view TesselAttribute_Calendars_Calendar_Title = "title";
inline constexpr std::string_view TesselRelationship_Calendars_Calendar_Events = "events";
inline constexpr std::string_view TesselRelationship_Calendars_Calendar_Tasks = "tasks";

// Calendars: Event.
inline constexpr std::string_view TesselAttribute_Calendars_Event_Summary = "summary";
inline constexpr std::string_view TesselAttribute_Calendars_Event_Description = "description";
inline constexpr std::string_view TesselAttribute_Calendars_Event_Location = "location";
inline constexpr std::string_view TesselAttribute_Calendars_Event_Status = "status";
inline constexpr std::string_view TesselAttribute_Calendars_Event_Classification = "classification";
inline constexpr std::string_view TesselAttribute_Calendars_Event_StartDate = "start date";
inline constexpr std::string_view TesselAttribute_Calendars_Event_EndDate = "end date";
inline constexpr std::string_view TesselAttribute_Calendars_Event_OriginalDate = "original date";
inline constexpr std::string_view TesselAttribute_Calendars_Event_ExceptionDates =
    "exception dates";
inline constexpr std::string_view TesselAttribute_Calendars_Event_AllDay = "all day";
inline constexpr std::string_view TesselAttribute_Calendars_Event_Priority = "priority";
inline constexpr std::string_view TesselAttribute_Calendars_Event_Url = "url";
inline constexpr std::string_view TesselRelationship_Calendars_Event_Recurrences = "recurrences";
inline constexpr std::string_view TesselRelationship_Calendars_Event_AudioAlarms = "audio alarms";
inline constexpr std::string_view TesselRelationship_Calendars_Event_MailAlarms = "mail alarms";
inline constexpr std::string_view TesselRelationship_Calendars_Event_DisplayAlarms =
    "display alarms";
inline constexpr std::string_view TesselRelationship_Calendars_Event_Organizer = "organizer";
inline constexpr std::string_view TesselRelationship_Calendars_Event_Attendees = "attendees";
inline constexpr std::string_view TesselRelationship_Calendars_Event_DetachedEvents =
    "detached events";
inline constexpr std::string_view TesselRelationship_Calendars_Event_Calendar = "calendar";

// Calendars: Task.
inline constexpr std::string_view TesselAttribute_Calendars_Task_Summary = "summary";
inline constexpr std::string_view TesselAttribute_Calendars_Task_Description = "description";
inline constexpr std::string_view TesselAttribute_Calendars_Task_Status = "status";
inline constexpr std::string_view TesselAttribute_Calendars_Task_Classification = "classification";
inline constexpr std::string_view TesselAttribute_Calendars_Task_StartDate = "start date";
inline constexpr std::string_view TesselAttribute_Calendars_Task_DueDate = "due date";
inline constexpr std::string_view TesselAttribute_Calendars_Task_CompletionDate = "completion date";
inline constexpr std::string_view TesselAttribute_Calendars_Task_OriginalDate = "original date";
inline constexpr std::string_view TesselAttribute_Calendars_Task_ExceptionDates = "exception dates";
inline constexpr std::string_view TesselAttribute_Calendars_Task_Priority = "priority";
inline constexpr std::string_view TesselAttribute_Calendars_Task_Url = "url";
inline constexpr std::string_view TesselRelationship_Calendars_Task_Calendar = "calendar";

// Calendars: Recurrence.
inline constexpr std::string_view TesselAttribute_Calendars_Recurrence_Frequency = "frequency";
inline constexpr std::string_view TesselAttribute_Calendars_Recurrence_Until = "until";
inline constexpr std::string_view TesselAttribute_Calendars_Recurrence_Count = "count";
inline constexpr std::string_view TesselAttribute_Calendars_Recurrence_Interval = "interval";
inline constexpr std::string_view TesselAttribute_Calendars_Recurrence_Bymonth = "bymonth";
inline constexpr std::string_view TesselAttribute_Calendars_Recurrence_Byweeknumber =
    "byweeknumber";
inline constexpr std::string_view TesselAttribute_Calendars_Recurrence_Byyearday = "byyearday";
inline constexpr std::string_view TesselAttribute_Calendars_Recurrence_Bymonthday = "bymonthday";
inline constexpr std::string_view TesselAttribute_Calendars_Recurrence_Bysetpos = "bysetpos";
inline constexpr std::string_view TesselAttribute_Calendars_Recurrence_Bydayfreq = "bydayfreq";
inline constexpr std::string_view TesselAttribute_Calendars_Recurrence_Bydaydays = "bydaydays";
inline constexpr std::string_view TesselAttribute_Calendars_Recurrence_Weekstartday =
    "weekstartday";

// Calendars: AudioAlarm.
inline constexpr std::string_view TesselAttribute_Calendars_AudioAlarm_Triggerdate = "trigger date";
inline constexpr std::string_view TesselAttribute_Calendars_AudioAlarm_Triggerduration =
    "trigger duration";
inline constexpr std::string_view TesselAttribute_Calendars_AudioAlarm_RepeatCount = "repeat count";
inline constexpr std::string_view TesselAttribute_Calendars_AudioAlarm_RepeatInterval =
    "repeat interval";
inline constexpr std::string_view TesselAttribute_Calendars_AudioAlarm_Description = "description";
inline constexpr std::string_view TesselAttribute_Calendars_AudioAlarm_Summary = "summary";

// Calendars: MailAlarm.
inline constexpr std::string_view TesselAttribute_Calendars_MailAlarm_Triggerdate = "trigger date";
inline constexpr std::string_view TesselAttribute_Calendars_MailAlarm_Triggerduration =
    "trigger duration";
inline constexpr std::string_view TesselAttribute_Calendars_MailAlarm_RepeatCount = "repeat count";
inline constexpr std::string_view TesselAttribute_Calendars_MailAlarm_RepeatInterval =
    "repeat interval";
inline constexpr std::string_view TesselAttribute_Calendars_MailAlarm_Description = "description";
inline constexpr std::string_view TesselAttribute_Calendars_MailAlarm_Summary = "summary";
inline constexpr std::string_view TesselAttribute_Calendars_MailAlarm_Recipients = "recipients";

// Calendars: DisplayAlarm.
inline constexpr std::string_view TesselAttribute_Calendars_DisplayAlarm_Triggerdate =
    "trigger date";
inline constexpr std::string_view TesselAttribute_Calendars_DisplayAlarm_Triggerduration =
    "trigger duration";
inline constexpr std::string_view TesselAttribute_Calendars_DisplayAlarm_RepeatCount =
    "repeat count";
inline constexpr std::string_view TesselAttribute_Calendars_DisplayAlarm_RepeatInterval =
    "repeat interval";
inline constexpr std::string_view TesselAttribute_Calendars_DisplayAlarm_Description =
    "description";

// Calendars: Organizer. Its texts are the attendee's, so one sub-record reader serves both.
inline constexpr std::string_view TesselAttribute_Calendars_Organizer_DirectoryEntry =
    "directory entry";
inline constexpr std::string_view TesselAttribute_Calendars_Organizer_CommonName = "common name";
inline constexpr std::string_view TesselAttribute_Calendars_Organizer_Email = "email";

// Calendars: Attendee.
inline constexpr std::string_view TesselAttribute_Calendars_Attendee_DirectoryEntry =
    "directory entry";
inline constexpr std::string_view TesselAttribute_Calendars_Attendee_CommonName = "common name";
inline constexpr std::string_view TesselAttribute_Calendars_Attendee_Email = "email";
inline constexpr std::string_view TesselAttribute_Calendars_Attendee_UserType = "user type";
inline constexpr std::string_view TesselAttribute_Calendars_Attendee_Role = "role";
inline constexpr std::string_view TesselAttribute_Calendars_Attendee_Status = "status";
inline constexpr std::string_view TesselAttribute_Calendars_Attendee_Rsvp = "rsvp";
inline constexpr std::string_view TesselAttribute_Calendars_Attendee_Delegatedto = "delegated to";
inline constexpr std::string_view TesselAttribute_Calendars_Attendee_Delegatedfrom =
    "delegated from";

// The name carried by the exception raised when a session was cancelled; callers compare an
// exception's name with it.
inline constexpr std::string_view TesselSessionCancelledException =
    "TesselSessionCancelledException";

}  // namespace tessel
