#include "filters/group_selection.h"

#include <algorithm>

namespace zt::filters::group_selection {

std::vector<std::string> identifiersForSnapshot(const tessel::CodedElements& selection,
                                                const tessel::Snapshot& snapshot) {
  std::vector<std::string> identifiers;
  identifiers.reserve(selection.size());
  for (const tessel::CodedElement& element : selection) {
    if (const auto* identifier = std::get_if<std::string>(&element)) {
      identifiers.push_back(*identifier);
    } else if (auto resolved = snapshot.recordIdentifierForReference(
                   std::get<tessel::RecordReference>(element))) {
      identifiers.push_back(std::move(*resolved));
    }
  }
  return identifiers;
}

tessel::CodedElements referencesForIdentifiers(const std::vector<std::string>& identifiers,
                                               const tessel::Snapshot& snapshot) {
  tessel::CodedElements references;
  for (const std::string& identifier : identifiers) {
    if (auto reference = snapshot.recordReferenceForRecordIdentifier(identifier)) {
      references.emplace_back(std::move(*reference));
    }
  }
  return references;
}

bool containsAll(const tessel::CodedElements& selection, const tessel::CodedElements& elements) {
  return std::all_of(elements.begin(), elements.end(), [&](const tessel::CodedElement& e) {
    return std::find(selection.begin(), selection.end(), e) != selection.end();
  });
}

void replace(tessel::CodedElements& selection, const tessel::CodedElements& replacement,
             bool useAll, bool& needsUpdate) {
  if (useAll) {
    selection = replacement;
    return;
  }
  if (selection.size() != replacement.size() || !containsAll(selection, replacement)) {
    selection = replacement;
    needsUpdate = true;
  }
}

std::string describe(const tessel::CodedElements& selection) {
  std::string text = "(";
  for (std::size_t i = 0; i < selection.size(); ++i) {
    if (i > 0) text += ", ";
    if (const auto* identifier = std::get_if<std::string>(&selection[i])) {
      text += *identifier;
    } else {
      text += std::get<tessel::RecordReference>(selection[i]).text();
    }
  }
  return text + ")";
}

}  // namespace zt::filters::group_selection
