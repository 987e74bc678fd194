#include "importers/import_kind.h"

#include <optional>

#include "importers/import_error.h"
#include "platform/ascii.h"

namespace tessel::importers {

namespace {

// The start of the text as ASCII: UTF-16 (vCard files from Windows programs) read through
// its low bytes, anything else as it is. Enough to tell the kind; never used as content.
std::string asciiStart(std::string_view text) {
  constexpr std::size_t kLength = 1024;
  std::string start;
  if (text.starts_with("\xFE\xFF") || text.starts_with("\xFF\xFE")) {
    const std::size_t low = text.starts_with("\xFE\xFF") ? 1 : 0;
    for (std::size_t i = 2 + low; i < text.size() && start.size() < kLength; i += 2) {
      start += text[i];
    }
    return start;
  }
  if (text.starts_with("\xEF\xBB\xBF")) text.remove_prefix(3);
  return std::string(text.substr(0, kLength));
}

}  // namespace

ImportKind importKindOf(std::string_view text) {
  const std::string start = zt::platform::lowerAscii(asciiStart(text));
  const std::size_t first = start.find_first_not_of(" \t\r\n");
  if (first == std::string::npos) {
    return text.size() <= start.size() ? ImportKind::Empty : ImportKind::Unknown;
  }
  std::string_view head = std::string_view(start).substr(first);
  // vCard 3.0 lets any line carry a group name: "item1.BEGIN:VCARD" (RFC 2425 section 5.8.2).
  const std::size_t dot = head.find_first_not_of("abcdefghijklmnopqrstuvwxyz0123456789-");
  if (dot != std::string_view::npos && dot > 0 && head[dot] == '.' &&
      head.substr(dot + 1).starts_with("begin:vcard")) {
    return ImportKind::VCard;
  }
  if (head.starts_with("begin:vcard")) return ImportKind::VCard;
  for (const char* component : {"begin:vcalendar", "begin:vevent", "begin:vtodo"}) {
    if (head.starts_with(component)) return ImportKind::ICalendar;
  }
  if (head.starts_with("<") && (head.find("<html") != std::string_view::npos ||
                                head.find("<!doctype html") != std::string_view::npos)) {
    return ImportKind::Html;
  }
  return ImportKind::Unknown;
}

void checkImportKind(std::string_view text, ImportKind wanted, const std::string& source) {
  const ImportKind kind = importKindOf(text);
  const char* wantedName = wanted == ImportKind::VCard ? "a vCard file" : "an iCalendar file";
  switch (kind) {
    case ImportKind::Empty:
      throw ImportError(source, std::nullopt, std::string("the file is empty: not ") + wantedName);
    case ImportKind::Html:
      throw ImportError(source, std::nullopt,
                        std::string("this is an HTML page, not ") + wantedName +
                            " (a server may have answered with a login or error page)");
    case ImportKind::VCard:
      if (wanted != kind) {
        throw ImportError(source, std::nullopt, "this is a vCard file: use tessel import vcard");
      }
      break;
    case ImportKind::ICalendar:
      if (wanted != kind) {
        throw ImportError(source, std::nullopt,
                          "this is an iCalendar file: use tessel import ical");
      }
      break;
    case ImportKind::Unknown:
      break;
  }
}

}  // namespace tessel::importers
