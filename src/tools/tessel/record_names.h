#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "tessel/store.h"

namespace tessel::cli {

// A record a person picks by name: contact groups by their name, calendars by their title.
struct NamedRecord {
  std::string id;
  std::string name;
};

enum class NamedEntity { ContactGroup, Calendar };

// Every live record of the entity, in the store's order.
std::vector<NamedRecord> namedRecords(const Store& store, NamedEntity entity);

// The identifier that `given` stands for: an identifier, a name, or the unique prefix of one
// name. An unknown word or an ambiguous prefix is a usage error naming the candidates.
std::string resolveName(const std::vector<NamedRecord>& records, const std::string& given,
                        NamedEntity entity);

// The names of `identifiers`, "name (id)" each, comma-separated; an unknown one as it is.
std::string describeSelection(const std::vector<NamedRecord>& records,
                              const std::vector<std::string>& identifiers);

}  // namespace tessel::cli
