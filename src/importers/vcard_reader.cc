#include "importers/vcard_reader.h"

#include <algorithm>
#include <optional>
#include <stdexcept>

#include "importers/import_error.h"
#include "importers/physical_lines.h"
#include "importers/vcard_decoding.h"
#include "platform/ascii.h"

namespace tessel::importers {

namespace {

using zt::platform::lowerAscii;
using zt::platform::trimBlanks;
using zt::platform::upperAscii;

bool startsWithBlank(std::string_view text) {
  return !text.empty() && (text.front() == ' ' || text.front() == '\t');
}

// vCard 2.1 section 2.1.2 allows parameters without a name ("TEL;HOME;VOICE"); their name
// follows from the value.
std::string nameOfBareParameter(std::string_view value) {
  const std::string upper = upperAscii(value);
  if (upper == "QUOTED-PRINTABLE" || upper == "BASE64" || upper == "8BIT" || upper == "7BIT" ||
      upper == "B") {
    return "ENCODING";
  }
  return "TYPE";
}

class LineParser {
 public:
  LineParser(std::string_view text, std::size_t line, const std::string& source)
      : text_(text), line_(line), source_(source) {}

  ContentLine parse() {
    ContentLine content;
    content.line = line_;
    const std::size_t nameEnd = text_.find_first_of(";:");
    if (nameEnd == std::string_view::npos) fail("line has no colon");
    std::string_view name = text_.substr(0, nameEnd);
    if (const std::size_t dot = name.rfind('.'); dot != std::string_view::npos) {
      content.group = std::string(name.substr(0, dot));
      name.remove_prefix(dot + 1);
    }
    content.name = upperAscii(trimBlanks(name));
    if (content.name.empty()) fail("property without a name");
    pos_ = nameEnd;
    while (text_[pos_] == ';') {
      ++pos_;
      content.parameters.push_back(parameter());
      if (pos_ >= text_.size()) fail("line has no colon");
    }
    content.value = std::string(text_.substr(pos_ + 1));
    return content;
  }

 private:
  [[noreturn]] void fail(const std::string& reason) const {
    throw ImportError(source_, line_, reason);
  }

  Parameter parameter() {
    const std::size_t end = text_.find_first_of("=;:", pos_);
    if (end == std::string_view::npos) fail("line has no colon");
    Parameter parameter;
    const std::string_view name = trimBlanks(text_.substr(pos_, end - pos_));
    pos_ = end;
    if (text_[end] != '=') {
      if (!name.empty()) parameter = {nameOfBareParameter(name), {std::string(name)}};
      return parameter;
    }
    parameter.name = upperAscii(name);
    ++pos_;
    while (true) {
      parameter.values.push_back(parameterValue());
      if (pos_ >= text_.size()) fail("line has no colon");
      if (text_[pos_] != ',') break;
      ++pos_;
    }
    return parameter;
  }

  std::string parameterValue() {
    if (pos_ < text_.size() && text_[pos_] == '"') {
      const std::size_t close = text_.find('"', pos_ + 1);
      if (close == std::string_view::npos) fail("parameter value without its closing quote");
      std::string value(text_.substr(pos_ + 1, close - pos_ - 1));
      pos_ = close + 1;
      return value;
    }
    const std::size_t end = std::min(text_.find_first_of(",;:", pos_), text_.size());
    std::string value(trimBlanks(text_.substr(pos_, end - pos_)));
    pos_ = end;
    return value;
  }

  std::string_view text_;
  std::size_t line_;
  const std::string& source_;
  std::size_t pos_ = 0;
};

bool endsWithSoftBreak(std::string_view value) {
  const std::size_t last = value.find_last_not_of(" \t");
  return last != std::string_view::npos && value[last] == '=';
}

// Whether a line not yet parsed ends with a soft break of a quoted-printable value.
bool endsWithSoftBreakOfQp(std::string_view line) {
  if (!endsWithSoftBreak(line)) return false;
  return upperAscii(line.substr(0, line.find(':'))).find("QUOTED-PRINTABLE") != std::string::npos;
}

bool isEncoding(const ContentLine& line, std::string_view lowerCaseEncoding) {
  return lowerAscii(line.parameter("ENCODING")) == lowerCaseEncoding;
}

std::string decodeWholeText(std::string_view text, const std::string& source) {
  // A byte-order mark names the encoding of the whole file.
  if (text.starts_with("\xEF\xBB\xBF")) return std::string(text.substr(3));
  if (text.starts_with("\xFE\xFF") || text.starts_with("\xFF\xFE")) {
    try {
      std::string utf8 = toUtf8(text, "UTF-16");
      if (utf8.starts_with("\xEF\xBB\xBF")) utf8.erase(0, 3);
      return utf8;
    } catch (const std::invalid_argument&) {
      throw ImportError(source, std::nullopt, "not valid UTF-16 text");
    }
  }
  return std::string(text);
}

}  // namespace

std::string_view ContentLine::parameter(std::string_view name) const {
  for (const Parameter& p : parameters) {
    if (p.name == name && !p.values.empty()) return p.values.front();
  }
  return {};
}

std::vector<std::string> ContentLine::types() const {
  std::vector<std::string> types;
  for (const Parameter& p : parameters) {
    if (p.name != "TYPE") continue;
    for (const std::string& value : p.values) {
      // Some writers quote a whole list: TYPE="home,voice".
      for (const std::string& part : splitUnescaped(value, ',')) {
        types.push_back(lowerAscii(trimBlanks(part)));
      }
    }
  }
  return types;
}

bool ContentLine::hasType(std::string_view lowerCaseType) const {
  const std::vector<std::string> all = types();
  return std::find(all.begin(), all.end(), lowerCaseType) != all.end();
}

std::vector<Card> readCards(std::string_view input, const std::string& source) {
  std::vector<Card> cards;
  ImportWarnings strict(OnFault::Refuse);
  forEachCard(
      input, source, [&](Card& card) { cards.push_back(std::move(card)); }, strict);
  return cards;
}

void forEachCard(std::string_view input, const std::string& source,
                 const std::function<void(Card&)>& visit, ImportWarnings& warnings) {
  const std::string text = decodeWholeText(input, source);
  const std::vector<PhysicalLine> lines = physicalLines(text);
  Card card;
  // Depth of BEGIN:VCARD; cards nested in a vCard 2.1 AGENT property are skipped.
  int depth = 0;
  bool sawCard = false;
  std::optional<std::size_t> firstOutside;
  std::size_t i = 0;
  while (i < lines.size()) {
    const PhysicalLine& first = lines[i++];
    if (trimBlanks(first.text).empty()) continue;
    // RFC 2425 section 5.8.1: a line end followed by one blank is removed with the blank;
    // but after a quoted-printable soft break the next line is the value's, blank included.
    std::string logical(first.text);
    while (i < lines.size() && startsWithBlank(lines[i].text) && !endsWithSoftBreakOfQp(logical)) {
      logical.append(lines[i++].text.substr(1));
    }
    ContentLine content;
    try {
      content = LineParser(logical, first.number, source).parse();
    } catch (const ImportError& fault) {
      if (depth == 0 && !firstOutside) firstOutside = first.number;
      warnings.fault(
          fault, depth > 0 ? "dropped this line of the card of line " + std::to_string(card.line)
                           : std::string("dropped this line"));
      continue;
    }
    if (isEncoding(content, "quoted-printable")) {
      // RFC 2045 section 6.7: a "=" at the end of a line, maybe followed by blanks that a
      // transport added, is a soft break; the value goes on on the next line as it is, a
      // leading blank included, not folded.
      while (endsWithSoftBreak(content.value) && i < lines.size()) {
        while (content.value.back() != '=') content.value.pop_back();
        content.value.pop_back();
        content.value.append(lines[i++].text);
      }
    } else if (isEncoding(content, "base64") || isEncoding(content, "b")) {
      // Some vCard 2.1 writers break base64 into lines that are not indented; base64 has no
      // colon, so such a line cannot be a property.
      while (i < lines.size() && !trimBlanks(lines[i].text).empty() &&
             lines[i].text.find(':') == std::string_view::npos) {
        content.value.append(lines[i++].text);
      }
    }

    const bool isVCardMarker = lowerAscii(trimBlanks(content.value)) == "vcard";
    if (content.name == "BEGIN" && isVCardMarker) {
      if (depth++ == 0) card = Card{first.number, {}, {}};
      sawCard = true;
      continue;
    }
    if (content.name == "END" && isVCardMarker) {
      if (depth == 0) {
        warnings.fault(ImportError(source, first.number, "END:VCARD without BEGIN:VCARD"),
                       "dropped this line");
        continue;
      }
      if (--depth == 0) {
        visit(card);
        card = Card{};
      }
      continue;
    }
    if (depth == 0) {
      if (!firstOutside) firstOutside = first.number;
      warnings.fault(ImportError(source, first.number,
                                 content.name + " outside of a card (BEGIN:VCARD ... END:VCARD)"),
                     "dropped this line");
      continue;
    }
    if (depth > 1) continue;
    if (content.name == "VERSION") {
      card.version = std::string(trimBlanks(content.value));
      continue;
    }
    card.properties.push_back(std::move(content));
  }
  // Text without a single card is no address book with a few bad lines.
  if (!sawCard && firstOutside) {
    throw ImportError(source, firstOutside, "no BEGIN:VCARD: this is not a vCard file");
  }
  if (depth > 0) {
    warnings.fault(ImportError(source, card.line, "card has no END:VCARD"),
                   "kept what the card holds up to the end of the file");
    visit(card);
  }
}

}  // namespace tessel::importers
