#pragma once

#include <string>
#include <vector>

#include "tessel/coder.h"
#include "tessel/snapshot.h"

// The selection logic shared by the contact and calendar filters: a list whose elements are
// record references (normally) or record identifiers (as older filters stored them).
namespace zt::filters::group_selection {

// The identifiers of the selection; references the snapshot cannot resolve are dropped.
std::vector<std::string> identifiersForSnapshot(const tessel::CodedElements& selection,
                                                const tessel::Snapshot& snapshot);

// The references of the identifiers the snapshot knows, in order.
tessel::CodedElements referencesForIdentifiers(const std::vector<std::string>& identifiers,
                                               const tessel::Snapshot& snapshot);

// Whether every element of `elements` is in `selection` (order aside).
bool containsAll(const tessel::CodedElements& selection, const tessel::CodedElements& elements);

// Stores `replacement` as the selection. While everything is selected the list is replaced
// silently; otherwise it is replaced, and `needsUpdate` raised, only when it really differs
// (another count, or an element the current list lacks): the same groups in another order
// change nothing, not even the order.
void replace(tessel::CodedElements& selection, const tessel::CodedElements& replacement,
             bool useAll, bool& needsUpdate);

// "(a, b)" with references and identifiers by their text.
std::string describe(const tessel::CodedElements& selection);

}  // namespace zt::filters::group_selection
