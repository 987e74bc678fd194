#pragma once

// The syntax layer of vCard 2.1, 3.0 (RFC 2425/2426) and 4.0 (RFC 6350): a text becomes
// cards of content lines, with folded lines joined and parameters split, values still raw.

#include <cstddef>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "importers/import_warnings.h"

namespace tessel::importers {

struct Parameter {
  std::string name;                 // upper case: "TYPE", "ENCODING", "CHARSET"
  std::vector<std::string> values;  // as written, quotes removed, comma lists split
};

// One property of a card: `[group "."] name *(";" parameter) ":" value`.
struct ContentLine {
  std::size_t line = 0;  // 1-based line of the text on which the property starts
  std::string group;     // "item1" of "item1.EMAIL", as written
  std::string name;      // upper case
  std::vector<Parameter> parameters;
  // Unfolded but otherwise as written: still transfer-encoded, in its charset, escaped.
  std::string value;

  // The first value of the parameter `name` (upper case); empty when it is absent.
  std::string_view parameter(std::string_view name) const;
  // Every TYPE value, lower case: "TEL;HOME;VOICE" and "TEL;TYPE=home,voice" both give
  // {"home", "voice"}.
  std::vector<std::string> types() const;
  bool hasType(std::string_view lowerCaseType) const;
};

struct Card {
  std::size_t line = 0;                 // the line of its BEGIN:VCARD
  std::string version;                  // "2.1", "3.0", "4.0" as written; empty when absent
  std::vector<ContentLine> properties;  // VERSION, BEGIN and END not included
};

// Every card of a text, in order. A byte-order mark (UTF-8, or UTF-16 of either order)
// opens the text or is absent. Faults raise ImportError naming `source` and the line: a line
// without a colon, a property outside a card, a card without END:VCARD.
std::vector<Card> readCards(std::string_view text, const std::string& source);

// The same cards, handed to `visit` one by one as each ends, so that they are not all held
// at once. Each fault goes through `warnings` when the reading reaches it (`visit` has then
// seen the cards before it): a line that cannot be read is left out, and a card that the
// file ends inside is kept. A text of UTF-16 that is not valid, or with lines but no card at
// all, raises ImportError.
void forEachCard(std::string_view text, const std::string& source,
                 const std::function<void(Card&)>& visit, ImportWarnings& warnings);

}  // namespace tessel::importers
