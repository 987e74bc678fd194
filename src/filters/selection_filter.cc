#include "filters/selection_filter.h"

#include "filters/group_selection.h"
#include "platform/log.h"
#include "tessel/exception.h"

namespace zt::filters {

SelectionFilter::SelectionFilter(const Wording& wording) : _wording(wording) {}

SelectionFilter::SelectionFilter(const Wording& wording, tessel::Decoder& decoder)
    : _wording(wording) {
  platform::Value useAll = decoder.decodeValue();
  const platform::Number* flag = useAll.asNumber();
  if (!flag) {
    throw tessel::Exception(
        tessel::TesselCodingException,
        std::string(_wording.className) + ": the first coded value is not a number");
  }
  _useAll = flag->boolValue();
  _selection = decoder.decodeElements();
}

void SelectionFilter::setUseAll(bool useAll) {
  if (useAll == _useAll) return;
  _useAll = useAll;
  _needsUpdate = true;
}

std::vector<std::string> SelectionFilter::selectedIDsForSnapshot(
    const tessel::Snapshot& snapshot) const {
  return group_selection::identifiersForSnapshot(_selection, snapshot);
}

void SelectionFilter::setSelection(const tessel::CodedElements& selection) {
  group_selection::replace(_selection, selection, _useAll, _needsUpdate);
}

void SelectionFilter::setSelectedIDs(const std::vector<std::string>& identifiers,
                                     const tessel::Snapshot& snapshot) {
  tessel::CodedElements selection =
      group_selection::referencesForIdentifiers(identifiers, snapshot);
  if (selection.empty()) {
    platform::Log::always(_wording.fallbackWarning);
    setUseAll(true);
    return;
  }
  setSelection(selection);
}

std::string SelectionFilter::className() const {
  return std::string(_wording.className);
}

std::vector<std::string> SelectionFilter::supportedEntityNames() const {
  return {std::string(_wording.entityName)};
}

void SelectionFilter::encode(tessel::Coder& coder) const {
  coder.encodeValue(platform::Value::boolean(_useAll));
  coder.encodeElements(_selection);
}

std::string SelectionFilter::description() const {
  const void* self = this;
  const std::string name(_wording.descriptionName);
  if (_useAll) return platform::Log::format(name + " %p: enableAll YES", {self});
  return platform::Log::format(name + " %p: enableALL NO, with options %@",
                               {self, group_selection::describe(_selection)});
}

}  // namespace zt::filters
