#include "sources/collection_text.h"

#include <fstream>
#include <string>
#include <system_error>

#include "platform/ascii.h"

namespace tessel::sources {

namespace fs = std::filesystem;
using zt::platform::Error;
using zt::platform::lowerAscii;

namespace {

// Enough to pass a byte order mark, blank lines and a few comment-like lines.
constexpr std::size_t kHead = 4096;

std::string_view withoutByteOrderMark(std::string_view text) {
  if (text.starts_with("\xEF\xBB\xBF")) text.remove_prefix(3);
  return text;
}

std::string withArticle(Collection collection) {
  return collection == Collection::AddressBook ? "an address book" : "a calendar";
}

}  // namespace

std::optional<Collection> collectionOfText(std::string_view text) {
  const std::string head = lowerAscii(withoutByteOrderMark(text.substr(0, kHead)));
  std::size_t start = 0;
  while (start < head.size()) {
    std::size_t end = head.find('\n', start);
    if (end == std::string::npos) end = head.size();
    std::string_view line(head.data() + start, end - start);
    while (!line.empty() && (line.back() == '\r' || line.back() == ' ')) line.remove_suffix(1);
    if (line == "begin:vcard") return Collection::AddressBook;
    if (line == "begin:vcalendar") return Collection::Calendar;
    if (!line.empty()) return std::nullopt;
    start = end + 1;
  }
  return std::nullopt;
}

std::optional<Collection> collectionOfPath(const fs::path& path) {
  std::error_code error;
  if (fs::is_directory(path, error)) {
    std::size_t cards = 0, calendars = 0;
    for (fs::directory_iterator it(path, error), end; !error && it != end; it.increment(error)) {
      const std::string extension = lowerAscii(it->path().extension().string());
      cards += extension == ".vcf" ? 1 : 0;
      calendars += extension == ".ics" ? 1 : 0;
    }
    if (cards == calendars) return std::nullopt;
    return cards > calendars ? Collection::AddressBook : Collection::Calendar;
  }
  std::ifstream in(path, std::ios::binary);
  std::string head(kHead, '\0');
  in.read(head.data(), static_cast<std::streamsize>(head.size()));
  head.resize(static_cast<std::size_t>(in.gcount()));
  if (auto found = collectionOfText(head)) return found;
  const std::string extension = lowerAscii(path.extension().string());
  if (extension == ".vcf" || extension == ".vcard") return Collection::AddressBook;
  if (extension == ".ics" || extension == ".ical") return Collection::Calendar;
  return std::nullopt;
}

zt::platform::Result<void> checkDownload(const HttpResponse& response, Collection expected) {
  const std::string type = lowerAscii(response.contentType);
  const std::optional<Collection> found = collectionOfText(response.body);
  const std::string wanted = withArticle(expected);
  if (type.starts_with("text/html") ||
      (!found && lowerAscii(response.body.substr(0, 512)).find("<html") != std::string::npos))
    return Error{response.finalUrl + ": the server sent a web page, not " + wanted +
                 " (a login page? Check the address, and that it is the collection's export or "
                 "subscription link)"};
  // An address book emptied on the server is exported as nothing at all.
  if (!found && expected == Collection::AddressBook &&
      (type.starts_with("text/vcard") || type.starts_with("text/x-vcard")) &&
      response.body.find_first_not_of(" \r\n") == std::string::npos)
    return {};
  if (!found)
    return Error{
        response.finalUrl + ": what the server sent is not " + wanted +
        (expected == Collection::Calendar ? " (no BEGIN:VCALENDAR)" : " (no BEGIN:VCARD)")};
  if (*found != expected)
    return Error{response.finalUrl + ": the server sent " + withArticle(*found) +
                 ", but the source is " + wanted};
  return {};
}

}  // namespace tessel::sources
