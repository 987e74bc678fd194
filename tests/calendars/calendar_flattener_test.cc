// The flattening of one calendar against a real store's snapshot, in process, where the
// nested record itself can be compared.
#include "calendars/calendar_flattener.h"

#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "support/temporary_folder.h"
#include "tessel/schema.h"
#include "tessel/store.h"

namespace zt::calendars {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

constexpr std::string_view kEntity = tessel::TesselRecordEntityNameKey;
constexpr std::string_view kEvent = tessel::TesselEntity_Calendars_Event;
constexpr std::string_view kTask = tessel::TesselEntity_Calendars_Task;

Array ids(std::initializer_list<const char*> identifiers) {
  Array array;
  for (const char* identifier : identifiers) array.emplace_back(identifier);
  return array;
}

// The flattener passes values through untouched, so dates may stand in as plain texts.
class CalendarFlattenerTest : public ::testing::Test {
 protected:
  void SetUp() override {
    store_ = tessel::Store::open(folder_ / "truth.db");
    client_ = store_->registerClient("client", "Zeto", {});
  }

  void put(std::string id, Dictionary record) { store_->putRecords({{std::move(id), record}}); }

  const tessel::Snapshot& snapshot() {
    if (!snapshot_) snapshot_ = store_->snapshotOfRecordsInTruth({}, *client_);
    return *snapshot_;
  }

  // The flattened calendar of a calendar record that is not stored itself.
  Dictionary flatten(const Dictionary& calendar, std::size_t order = 0) {
    std::optional<Dictionary> flattened =
        CalendarFlattener(snapshot()).flattenCalendar(calendar, "Title", order);
    EXPECT_TRUE(flattened.has_value());
    return flattened.value_or(Dictionary{});
  }

  zt::test_support::TemporaryFolder folder_;
  std::unique_ptr<tessel::Store> store_;
  std::unique_ptr<tessel::Client> client_;
  std::shared_ptr<tessel::Snapshot> snapshot_;
};

TEST_F(CalendarFlattenerTest, AnEventKeepsItsListedKeysAndItsRelatedRecordsInTableOrder) {
  put("ev", Dictionary{{kEntity, kEvent},
                       {"uid", "not listed"},
                       {"summary", "Lunch"},
                       {"attendees", ids({"att", "att-missing"})},
                       {"recurrences", Array{}},
                       {"organizer", ids({"org"})},
                       {"display alarms", ids({"alarm"})},
                       {"priority", Value::integer(5)},
                       {"calendar", ids({"cal"})}});
  put("att", Dictionary{{kEntity, tessel::TesselEntity_Calendars_Attendee},
                        {"email", "mailto:b@example.org"},
                        {"note", "not listed"},
                        {"common name", "B"}});
  put("org", Dictionary{{kEntity, tessel::TesselEntity_Calendars_Organizer},
                        {"email", "mailto:a@example.org"}});
  put("alarm", Dictionary{{kEntity, tessel::TesselEntity_Calendars_DisplayAlarm},
                          {"trigger duration", Value::integer(-900)},
                          {"summary", "display alarms have no summary"}});

  Dictionary flattened = flatten(Dictionary{{"events", ids({"ev"})}});

  // Key-list order, then the related records in the table's order whatever the record's.
  Dictionary event{
      {"summary", "Lunch"},
      {"priority", Value::integer(5)},
      {tessel::TesselEntity_Calendars_DisplayAlarm,
       Array{Dictionary{{"trigger duration", Value::integer(-900)}}}},
      {tessel::TesselEntity_Calendars_Organizer,
       Array{Dictionary{{"email", "mailto:a@example.org"}}}},
      {tessel::TesselEntity_Calendars_Attendee,
       Array{Dictionary{{"common name", "B"}, {"email", "mailto:b@example.org"}}}},
  };
  EXPECT_EQ(flattened, (Dictionary{{"title", "Title"},
                                   {tessel::TesselEntity_Calendars_CalendarOrder, "1l"},
                                   {kEvent, Array{event}}}));
}

TEST_F(CalendarFlattenerTest, TasksKeepOnlyTheirListAndRecordsOfOtherKindsAreLeftOut) {
  put("task", Dictionary{{kEntity, kTask},
                         {"due date", "tomorrow"},
                         {"location", "not a task key"},
                         {"recurrences", ids({"rule"})},
                         {"summary", "Pay"}});
  put("rule",
      Dictionary{{kEntity, tessel::TesselEntity_Calendars_Recurrence}, {"frequency", "daily"}});
  put("cal", Dictionary{{kEntity, tessel::TesselEntity_Calendars_Calendar}, {"title", "A"}});
  put("ev", Dictionary{{kEntity, kEvent}, {"summary", "Lunch"}});

  Dictionary flattened =
      flatten(Dictionary{{"events", ids({"cal", "ev"})}, {"tasks", ids({"task"})}}, 2);

  EXPECT_EQ(flattened,
            (Dictionary{{"title", "Title"},
                        {tessel::TesselEntity_Calendars_CalendarOrder, "3l"},
                        {kEvent, Array{Dictionary{{"summary", "Lunch"}}}},
                        {kTask, Array{Dictionary{{"summary", "Pay"}, {"due date", "tomorrow"}}}}}));
}

TEST_F(CalendarFlattenerTest, WithoutARelationshipThereIsNoArrayAndItsRecordsGoNowhere) {
  put("task", Dictionary{{kEntity, kTask}, {"summary", "Pay"}});
  put("ev", Dictionary{{kEntity, kEvent}, {"organizer", ids({"gone"})}});
  // Only an events relationship, listing a task: no task array, so the task goes nowhere; an
  // organizer missing from truth leaves an empty array.
  EXPECT_EQ(flatten(Dictionary{{"events", ids({"ev", "task"})}}),
            (Dictionary{
                {"title", "Title"},
                {tessel::TesselEntity_Calendars_CalendarOrder, "1l"},
                {kEvent, Array{Dictionary{{tessel::TesselEntity_Calendars_Organizer, Array{}}}}}}));
  // Neither relationship: title and order alone; an empty one still gives its array.
  EXPECT_EQ(flatten(Dictionary{}),
            (Dictionary{{"title", "Title"}, {tessel::TesselEntity_Calendars_CalendarOrder, "1l"}}));
  EXPECT_EQ(flatten(Dictionary{{"tasks", Array{}}}).find(kTask)->asArray()->size(), 0u);
}

}  // namespace
}  // namespace zt::calendars
