#pragma once

#include <string>
#include <string_view>

namespace tessel::importers {

// What a file to import holds, told from its first line: users pick the wrong command, and
// servers answer a calendar or address-book URL with a login page.
enum class ImportKind { VCard, ICalendar, Html, Empty, Unknown };

ImportKind importKindOf(std::string_view text);

// Raises ImportError naming `source` when the text is, for sure, not of the `wanted` kind
// (VCard or ICalendar): another kind ("this is a vCard file: use tessel import vcard"), an
// HTML page, or nothing at all. Text of no kind it knows is left to the reader's own checks.
void checkImportKind(std::string_view text, ImportKind wanted, const std::string& source);

}  // namespace tessel::importers
