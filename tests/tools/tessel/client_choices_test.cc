// What a person chooses through `tessel`: the calendars' order, a client's data classes, and
// groups and calendars picked by name; each through the real binary on a store of samples.
#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include "support/files.h"
#include "tools/tessel/tessel_command_fixture.h"

namespace tessel::testing {
namespace {

const fs::path kSamples = fs::path(ZT_SAMPLES_DIR);
const std::string kWork = "ical-work", kHome = "ical-home", kHolidays = "ical-holidays";

class ClientChoices : public TesselCommandTest {
 protected:
  void SetUp() override {
    TesselCommandTest::SetUp();
    ASSERT_EQ(tessel({"init"}).status, 0);
    const fs::path vcf = kSamples / "contacts/friends-and-colleagues.vcf";
    ASSERT_EQ(tessel({"import", "vcard", vcf.string()}).status, 0);
    // Calendars of truth with known identifiers, as another source would put them.
    std::string lines;
    for (const auto& [id, title] : std::vector<std::pair<std::string, std::string>>{
             {kWork, "Work"}, {kHome, "Home"}, {kHolidays, "Holidays"}}) {
      lines += R"({"id":")" + id +
               R"(","record":{"tessel.record.entity":"tessel.calendars.Calendar","title":")" +
               title + "\"}}\n";
    }
    ASSERT_EQ(tessel({"records", "put", "-"}, lines).status, 0);
  }
  std::string order() { return tessel({"calendars", "list"}).out; }
};

TEST_F(ClientChoices, CalendarOrderListsEveryCalendarTheNamedOnesFirst) {
  const Outcome set = tessel({"calendars", "order", "Hol", kHome});
  ASSERT_EQ(set.status, 0) << set.err;
  EXPECT_EQ(order(), kHolidays + "\tHolidays\n" + kHome + "\tHome\n" + kWork + "\tWork\n");
  // Naming one moves it first; the others keep their places.
  ASSERT_EQ(tessel({"calendars", "order", "Work"}).status, 0);
  EXPECT_EQ(order(), kWork + "\tWork\n" + kHolidays + "\tHolidays\n" + kHome + "\tHome\n");
  // A calendar imported later is appended.
  const fs::path ics = kSamples / "calendars/home.ics";
  ASSERT_EQ(tessel({"import", "ical", ics.string(), "--title", "Imported"}).status, 0);
  const std::string listed = order();
  EXPECT_EQ(listed.rfind(kWork + "\tWork\n" + kHolidays + "\tHolidays\n" + kHome + "\tHome\n", 0),
            0u)
      << listed;
  EXPECT_EQ(std::count(listed.begin(), listed.end(), '\n'), 4) << listed;
  // Bad words change nothing.
  const std::pair<std::vector<std::string>, std::string> refused[] = {
      {{"calendars", "order", "Nowhere"}, "\"Nowhere\" is not a calendar of the store"},
      {{"calendars", "order", "H"}, "\"H\" names more than one calendar: "},
      {{"calendars", "order", "Work", kWork}, "calendar \"ical-work\" is named twice"},
  };
  for (const auto& [args, says] : refused) {
    const Outcome run = tessel(args);
    EXPECT_EQ(run.status, 2);
    EXPECT_CONTAINS(run.err, says);
  }
  EXPECT_EQ(order(), listed);
}

TEST_F(ClientChoices, RegisterKeepsTheDataClassesItDoesNotMention) {
  // The options after "client register c", the status, and `client list` afterwards.
  const std::tuple<std::vector<std::string>, int, std::string> steps[] = {
      {{"--name", "Kitchen"}, 2, "no client"},  // a new client for nothing is refused
      {{"--contacts", "--calendars"}, 0, "c\tc\tcontacts, calendars\n"},
      {{"--name", "Kitchen"}, 0, "c\tKitchen\tcontacts, calendars\n"},
      {{"--no-calendars"}, 0, "c\tKitchen\tcontacts\n"},
      {{"--no-contacts"}, 2, "c\tKitchen\tcontacts\n"},
      {{"--no-contacts", "--no-data-classes"}, 0, "c\tKitchen\tno data class\n"},
      {{"--calendars"}, 0, "c\tKitchen\tcalendars\n"},
      {{"--contacts", "--no-contacts"}, 2, "c\tKitchen\tcalendars\n"},
  };
  for (const auto& [options, status, classes] : steps) {
    SCOPED_TRACE(::testing::PrintToString(options));
    std::vector<std::string> args = {"client", "register", "c"};
    args.insert(args.end(), options.begin(), options.end());
    const Outcome run = tessel(args);
    EXPECT_EQ(run.status, status) << run.err;
    const std::string listed = tessel({"client", "list"}).out;
    if (classes == "no client") {
      EXPECT_CONTAINS(run.err, "would sync nothing");
      EXPECT_CONTAINS(listed, "no clients");
    } else {
      EXPECT_EQ(listed, classes);
    }
  }
}

TEST_F(ClientChoices, FiltersTakeNamesAndShowThem) {
  ASSERT_EQ(tessel({"client", "register", "c", "--contacts", "--calendars"}).status, 0);
  EXPECT_EQ(tessel({"groups", "list"}).out,
            "vcard-group/Book club\tBook club\nvcard-group/Family\tFamily\nvcard-group/"
            "Friends\tFriends\nvcard-group/Work\tWork\n");
  const std::tuple<std::vector<std::string>, int, std::string> cases[] = {
      {{"contacts", "--all"}, 0, ""},  // replaced by the next line, not added to
      {{"contacts", "--groups", "Fam,Book club"}, 0, "syncs 2 contact group(s)"},
      {{"contacts", "--groups", "F"},
       2,
       "\"F\" names more than one contact group: Family (vcard-group/Family), Friends "
       "(vcard-group/Friends)"},
      {{"contacts", "--groups", "Nobody"}, 2, "\"Nobody\" is not a contact group"},
      {{"calendars", "--calendars", "Work," + kHome}, 0, "syncs 2 calendar(s)"},
      // "Work" is a group's name too, but here only calendars count.
      {{"calendars", "--calendars", "Family"}, 2, "\"Family\" is not a calendar"},
      {{"calendars", "--all", "--calendars", "Home"}, 2, "tessel: "},
  };
  for (const auto& [options, status, says] : cases) {
    std::vector<std::string> args = {"client", "filter", "c"};
    args.insert(args.end(), options.begin(), options.end());
    const Outcome run = tessel(args);
    EXPECT_EQ(run.status, status) << run.err;
    EXPECT_CONTAINS(run.out + run.err, says);
  }
  EXPECT_EQ(tessel({"client", "filter", "ghost", "contacts", "--all"}).status, 1);
  EXPECT_CONTAINS(tessel({"client", "show", "c"}).out,
                  "filters:\n  contacts: the members of Family (vcard-group/Family), "
                  "Book club (vcard-group/Book club)\n  calendars: Work (ical-work), "
                  "Home (ical-home)\n");
}

}  // namespace
}  // namespace tessel::testing
