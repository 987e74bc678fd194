#include "filters/filter_classes.h"

#include <memory>
#include <string>

#include "filters/zeto_calendar_filter.h"
#include "filters/zeto_contact_filter.h"
#include "tessel/filter_registry.h"

namespace zt::filters {

void registerFilterClasses() {
  tessel::FilterRegistry& registry = tessel::FilterRegistry::shared();
  registry.registerClass(std::string(ZetoContactFilter::kClassName),
                         [](tessel::Decoder& d) { return std::make_shared<ZetoContactFilter>(d); });
  registry.registerClass(std::string(ZetoCalendarFilter::kClassName), [](tessel::Decoder& d) {
    return std::make_shared<ZetoCalendarFilter>(d);
  });
}

}  // namespace zt::filters
