#include "filters/zeto_contact_filter.h"

#include "filters/group_selection.h"
#include "platform/log.h"
#include "tessel/exception.h"
#include "tessel/schema.h"

namespace zt::filters {

namespace {
ContactFilterHelper* contactFilterHelper = nullptr;
}  // namespace

ZetoContactFilter::ZetoContactFilter() = default;

ZetoContactFilter::ZetoContactFilter(tessel::Decoder& decoder) {
  platform::Value useAll = decoder.decodeValue();
  const platform::Number* flag = useAll.asNumber();
  if (!flag) {
    throw tessel::Exception(tessel::TesselCodingException,
                            "ZetoContactFilter: the first coded value is not a number");
  }
  _useAllContacts = flag->boolValue();
  _usedContactGroups = decoder.decodeElements();
}

void ZetoContactFilter::setContactFilterHelper(ContactFilterHelper* helper) {
  contactFilterHelper = helper;
}

void ZetoContactFilter::setUseAllContacts(bool useAll) {
  if (useAll == _useAllContacts) return;
  _useAllContacts = useAll;
  _needsUpdate = true;
}

std::vector<std::string> ZetoContactFilter::usedContactGroupIDsForSnapshot(
    const tessel::Snapshot& snapshot) const {
  return group_selection::identifiersForSnapshot(_usedContactGroups, snapshot);
}

void ZetoContactFilter::setUsedContactGroups(const tessel::CodedElements& groups) {
  group_selection::replace(_usedContactGroups, groups, _useAllContacts, _needsUpdate);
}

void ZetoContactFilter::setUsedContactGroupIDs(const std::vector<std::string>& identifiers,
                                               const tessel::Snapshot& snapshot) {
  tessel::CodedElements groups = group_selection::referencesForIdentifiers(identifiers, snapshot);
  if (groups.empty()) {
    platform::Log::always(
        "*** WARNING: can't set list of selected contact groups. Will sync all contacts");
    setUseAllContacts(true);
    return;
  }
  setUsedContactGroups(groups);
}

std::vector<std::string> ZetoContactFilter::supportedEntityNames() const {
  return {std::string(tessel::TesselEntity_Contacts_Contact)};
}

bool ZetoContactFilter::shouldApplyRecord(const platform::Dictionary& record,
                                          const std::string& /*identifier*/) const {
  if (_useAllContacts || !contactFilterHelper) return true;
  for (const std::string& identifier :
       platform::stringsIn(record.find(tessel::TesselRelationship_Contacts_Contact_ParentGroups))) {
    if (contactFilterHelper->shouldApplyContactGroupWithIdentifier(identifier)) return true;
  }
  return false;
}

bool ZetoContactFilter::isEqual(const tessel::Filtering& other) const {
  const auto* filter = dynamic_cast<const ZetoContactFilter*>(&other);
  if (!filter || filter->_useAllContacts != _useAllContacts) return false;
  return filter->_usedContactGroups == _usedContactGroups;
}

void ZetoContactFilter::encode(tessel::Coder& coder) const {
  coder.encodeValue(platform::Value::boolean(_useAllContacts));
  coder.encodeElements(_usedContactGroups);
}

std::string ZetoContactFilter::description() const {
  const void* self = this;
  if (_useAllContacts) return platform::Log::format("Contact Filter %p: enableAll YES", {self});
  return platform::Log::format("Contact Filter %p: enableALL NO, with options %@",
                               {self, group_selection::describe(_usedContactGroups)});
}

}  // namespace zt::filters
