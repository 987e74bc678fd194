#include "filters/zeto_contact_filter.h"

#include "tessel/schema.h"

namespace zt::filters {

namespace {

ContactFilterHelper* contactFilterHelper = nullptr;

constexpr SelectionFilter::Wording kWording = {
    ZetoContactFilter::kClassName, tessel::TesselEntity_Contacts_Contact, "Contact Filter",
    "*** WARNING: can't set list of selected contact groups. Will sync all contacts"};

}  // namespace

ZetoContactFilter::ZetoContactFilter() : SelectionFilter(kWording) {}

ZetoContactFilter::ZetoContactFilter(tessel::Decoder& decoder)
    : SelectionFilter(kWording, decoder) {}

void ZetoContactFilter::setContactFilterHelper(ContactFilterHelper* helper) {
  contactFilterHelper = helper;
}

bool ZetoContactFilter::shouldApplyRecord(const platform::Dictionary& record,
                                          const std::string& /*identifier*/) const {
  if (useAll() || !contactFilterHelper) return true;
  for (const std::string& identifier :
       platform::stringsIn(record.find(tessel::TesselRelationship_Contacts_Contact_ParentGroups))) {
    if (contactFilterHelper->shouldApplyContactGroupWithIdentifier(identifier)) return true;
  }
  return false;
}

bool ZetoContactFilter::isEqual(const tessel::Filtering& other) const {
  const auto* filter = dynamic_cast<const ZetoContactFilter*>(&other);
  if (!filter || filter->useAll() != useAll()) return false;
  return filter->selection() == selection();
}

}  // namespace zt::filters
