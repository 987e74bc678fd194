#pragma once

#include <string>

namespace zt::filters {

// The filters do not judge records themselves: for the length of one sync they defer to the
// syncer of their data class, which knows the selected groups and calendars.
class ContactFilterHelper {
 public:
  virtual ~ContactFilterHelper() = default;
  virtual bool shouldApplyContactGroupWithIdentifier(const std::string& identifier) = 0;
};

class CalendarFilterHelper {
 public:
  virtual ~CalendarFilterHelper() = default;
  virtual bool shouldApplyCalendarWithIdentifier(const std::string& identifier) = 0;
};

}  // namespace zt::filters
