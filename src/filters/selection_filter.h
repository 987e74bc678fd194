#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "tessel/coder.h"
#include "tessel/decoder.h"
#include "tessel/filtering.h"
#include "tessel/snapshot.h"

namespace zt::filters {

// What the contact and calendar filters have in common: everything selected or a list of
// records, coded as the "use all" flag and then the list. Each filter keeps its own
// judgement of records and its own equality.
class SelectionFilter : public tessel::Filtering {
 public:
  // The texts that tell the filters apart in their stored form and their messages.
  struct Wording {
    std::string_view className;        // "ZetoContactFilter"
    std::string_view entityName;       // the entity whose records it judges
    std::string_view descriptionName;  // "Contact Filter"
    std::string_view fallbackWarning;  // logged when a new list names no known record
  };

  bool needsUpdate() const { return _needsUpdate; }
  void setNeedsUpdate(bool needsUpdate) { _needsUpdate = needsUpdate; }

  std::string className() const override;
  std::vector<std::string> supportedEntityNames() const override;
  void encode(tessel::Coder& coder) const override;
  std::string description() const override;

 protected:
  // Everything selected.
  explicit SelectionFilter(const Wording& wording);
  // The stored form. Raises TesselCodingException when the payload holds something else.
  SelectionFilter(const Wording& wording, tessel::Decoder& decoder);

  bool useAll() const { return _useAll; }
  void setUseAll(bool useAll);
  const tessel::CodedElements& selection() const { return _selection; }
  std::vector<std::string> selectedIDsForSnapshot(const tessel::Snapshot& snapshot) const;
  void setSelection(const tessel::CodedElements& selection);
  // Selects the records the snapshot knows; when it knows none, everything is selected.
  void setSelectedIDs(const std::vector<std::string>& identifiers,
                      const tessel::Snapshot& snapshot);

 private:
  const Wording& _wording;
  bool _needsUpdate = false;
  bool _useAll = true;
  tessel::CodedElements _selection;
};

}  // namespace zt::filters
