#include "tessel/test_store.h"

#include <algorithm>

#include "tessel/coder.h"
#include "tessel/decoder.h"
#include "tessel/filter_registry.h"
#include "tessel/schema.h"

namespace tessel::testing {

using zt::platform::Array;
using zt::platform::Dictionary;
using zt::platform::Value;

void StoreTest::SetUp() {
  storePath_ = folder_ / "store" / "truth.db";
  store_ = Store::open(storePath_);
  NameFilter::registerClass();
}

void StoreTest::TearDown() {
  NameFilter::unregisterClass();
  store_.reset();
}

Record contact(std::string id, std::string firstName, std::vector<std::string> groups) {
  Array parents(groups.begin(), groups.end());
  return Record{std::move(id),
                Dictionary{{std::string(TesselRecordEntityNameKey), TesselEntity_Contacts_Contact},
                           {std::string(TesselAttribute_Contacts_Contact_FirstName), firstName},
                           {std::string(TesselRelationship_Contacts_Contact_ParentGroups),
                            Value(std::move(parents))}}};
}

Record group(std::string id, std::string name) {
  return Record{std::move(id),
                Dictionary{{std::string(TesselRecordEntityNameKey), TesselEntity_Contacts_Group},
                           {std::string(TesselAttribute_Contacts_Group_Name), name}}};
}

std::vector<Change> drain(Session& session, const std::vector<std::string>& entityNames) {
  std::vector<Change> changes;
  ChangeEnumerator enumerator = session.changeEnumerator(entityNames);
  while (auto change = enumerator.next()) changes.push_back(std::move(*change));
  return changes;
}

std::vector<std::string> summary(const std::vector<Change>& changes) {
  std::vector<std::string> lines;
  for (const Change& change : changes) {
    const char* letter = change.type == ChangeType::Add      ? "A:"
                         : change.type == ChangeType::Modify ? "M:"
                                                             : "D:";
    lines.push_back(letter + change.recordIdentifier);
  }
  return lines;
}

void NameFilter::registerClass() {
  FilterRegistry::shared().registerClass(kClassName, [](Decoder& decoder) {
    std::vector<std::string> refused;
    for (const auto& element : decoder.decodeElements())
      refused.push_back(std::get<std::string>(element));
    return std::make_shared<NameFilter>(std::move(refused));
  });
}

void NameFilter::unregisterClass() {
  FilterRegistry::shared().unregisterClass(kClassName);
}

std::vector<std::string> NameFilter::supportedEntityNames() const {
  return {std::string(TesselEntity_Contacts_Contact)};
}

bool NameFilter::shouldApplyRecord(const Dictionary& record, const std::string&) const {
  const Value* name = record.find(TesselAttribute_Contacts_Contact_FirstName);
  return !name || !name->asString() ||
         std::find(refused_.begin(), refused_.end(), *name->asString()) == refused_.end();
}

bool NameFilter::isEqual(const Filtering& other) const {
  const auto* same = dynamic_cast<const NameFilter*>(&other);
  return same && same->refused_ == refused_;
}

void NameFilter::encode(Coder& coder) const {
  coder.encodeElements(CodedElements(refused_.begin(), refused_.end()));
}

}  // namespace tessel::testing
