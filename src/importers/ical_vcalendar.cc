#include "importers/ical_vcalendar.h"

#include <algorithm>
#include <cctype>
#include <optional>
#include <stdexcept>
#include <string_view>

#include "importers/vcard_decoding.h"
#include "platform/ascii.h"

namespace tessel::importers {

namespace {

using zt::platform::trimBlanks;
using zt::platform::upperAscii;

// A property split as vCalendar writes it: parameters between ";" and no quoting.
struct Property {
  std::string name;  // upper case
  std::vector<std::string> parameters;
  std::string value;
};

std::optional<Property> split(const ICalContentLine& line) {
  const std::size_t colon = line.text.find(':');
  if (colon == std::string::npos || colon < line.name.size()) return std::nullopt;
  Property property{upperAscii(line.name), {}, line.text.substr(colon + 1)};
  std::size_t at = line.name.size();
  while (at < colon && line.text[at] == ';') {
    const std::size_t end = std::min(line.text.find(';', at + 1), colon);
    property.parameters.push_back(line.text.substr(at + 1, end - at - 1));
    at = end;
  }
  return property;
}

std::string joined(const std::vector<std::string>& parts, std::string_view separator) {
  std::string out;
  for (const std::string& part : parts) {
    if (!out.empty()) out += separator;
    out += part;
  }
  return out;
}

std::vector<std::string> words(std::string_view text, char separator) {
  std::vector<std::string> out;
  std::size_t start = 0;
  while (start <= text.size()) {
    const std::size_t end = std::min(text.find(separator, start), text.size());
    std::string word(trimBlanks(text.substr(start, end - start)));
    if (!word.empty()) out.push_back(std::move(word));
    start = end + 1;
  }
  return out;
}

// RFC 5545 section 3.3.11: "\", ";" and "," are escaped in text, and line ends are "\n".
std::string escapedText(std::string_view text) {
  std::string out;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    if (c == '\r' || c == '\n') {
      out += "\\n";
      if (c == '\r' && i + 1 < text.size() && text[i + 1] == '\n') ++i;
    } else if (c == '\\' || c == ';' || c == ',') {
      out += '\\';
      out += c;
    } else {
      out += c;
    }
  }
  return out;
}

bool isDigits(std::string_view text) {
  return !text.empty() &&
         std::all_of(text.begin(), text.end(), [](char c) { return c >= '0' && c <= '9'; });
}

bool isWeekday(std::string_view word) {
  for (const char* day : {"SU", "MO", "TU", "WE", "TH", "FR", "SA"}) {
    if (word == day) return true;
  }
  return false;
}

// vCalendar 1.0 section 3.9.10 (its appendix on the grammar of recurrence rules):
// "D2 #5", "W1 MO TH 19971231T000000Z", "MP1 1+ 2- FR #0", "MD1 1 15 LD #3", "YM1 6 7 #0",
// "YD3 1 100 #5". A rule without a duration repeats twice (#2); #0 repeats for ever.
std::optional<std::string> recurrenceRule(std::string_view rule) {
  std::vector<std::string> tokens = words(upperAscii(rule), ' ');
  if (tokens.empty()) return std::nullopt;
  const std::string& head = tokens.front();
  std::size_t letters = 0;
  while (letters < head.size() && std::isalpha(static_cast<unsigned char>(head[letters]))) {
    ++letters;
  }
  const std::string kind = head.substr(0, letters);
  const std::string interval = head.substr(letters);
  if (!isDigits(interval)) return std::nullopt;
  std::string frequency;
  if (kind == "D") frequency = "DAILY";
  if (kind == "W") frequency = "WEEKLY";
  if (kind == "MP" || kind == "MD") frequency = "MONTHLY";
  if (kind == "YM" || kind == "YD") frequency = "YEARLY";
  if (frequency.empty()) return std::nullopt;

  std::vector<std::string> days, occurrences, numbers;
  std::string end = "COUNT=2";
  for (std::size_t i = 1; i < tokens.size(); ++i) {
    std::string token = tokens[i];
    while (token.ends_with('$')) token.pop_back();  // "the occurrence of the rule itself"
    if (token.starts_with('#')) {
      if (!isDigits(token.substr(1))) return std::nullopt;
      end = token == "#0" ? "" : "COUNT=" + token.substr(1);
    } else if (token.find('T') != std::string::npos && isDigits(token.substr(0, 8))) {
      end = "UNTIL=" + token;
    } else if (isWeekday(token)) {
      days.push_back(token);
    } else if (token == "LD") {
      numbers.push_back("-1");
    } else if ((token.ends_with('+') || token.ends_with('-')) &&
               isDigits(token.substr(0, token.size() - 1))) {
      const std::string number = token.substr(0, token.size() - 1);
      (kind == "MP" ? occurrences : numbers)
          .push_back(token.ends_with('-') ? "-" + number : number);
    } else if (isDigits(token)) {
      numbers.push_back(token);
    } else {
      return std::nullopt;
    }
  }
  std::string out = "FREQ=" + frequency;
  if (interval != "1" && interval != "0") out += ";INTERVAL=" + interval;
  if (kind == "MP") {
    std::vector<std::string> byDay;
    for (const std::string& occurrence : occurrences) {
      for (const std::string& day : days) byDay.push_back(occurrence + day);
    }
    if (byDay.empty()) return std::nullopt;
    out += ";BYDAY=" + joined(byDay, ",");
  } else if (!days.empty()) {
    out += ";BYDAY=" + joined(days, ",");
  }
  if (!numbers.empty()) {
    if (kind == "D" || kind == "W" || kind == "MP") return std::nullopt;
    const char* key = kind == "MD" ? ";BYMONTHDAY=" : kind == "YM" ? ";BYMONTH=" : ";BYYEARDAY=";
    out += key + joined(numbers, ",");
  }
  if (!end.empty()) out += ";" + end;
  return out;
}

// vCalendar 1.0 section 3.9.1: "<run time>;<snooze time>;<repeat count>;<content>", content
// being the sound (AALARM), the text (DALARM), or the address and the note (MALARM).
std::vector<std::string> alarm(const Property& property) {
  const std::vector<std::string> parts = [&] {
    std::vector<std::string> all;
    std::size_t start = 0;
    while (true) {
      const std::size_t end = property.value.find(';', start);
      all.emplace_back(trimBlanks(
          std::string_view(property.value)
              .substr(start, end == std::string::npos ? std::string::npos : end - start)));
      if (end == std::string::npos) return all;
      start = end + 1;
    }
  }();
  const auto part = [&](std::size_t i) { return i < parts.size() ? parts[i] : std::string(); };
  std::vector<std::string> lines{"BEGIN:VALARM"};
  const std::string action = property.name == "AALARM"   ? "AUDIO"
                             : property.name == "DALARM" ? "DISPLAY"
                                                         : "EMAIL";
  lines.push_back("ACTION:" + action);
  // Without a run time the alarm rings when the event starts.
  lines.push_back(part(0).empty() ? "TRIGGER:PT0S" : "TRIGGER;VALUE=DATE-TIME:" + part(0));
  // RFC 5545 section 3.6.6: REPEAT and DURATION come together or not at all.
  if (!part(1).empty() && isDigits(part(2)) && part(2) != "0") {
    lines.push_back("DURATION:" + part(1));
    lines.push_back("REPEAT:" + part(2));
  }
  if (action == "DISPLAY") {
    lines.push_back("DESCRIPTION:" + (part(3).empty() ? std::string("Reminder") : part(3)));
  } else if (action == "EMAIL") {
    if (!part(3).empty()) lines.push_back("ATTENDEE:mailto:" + part(3));
    lines.push_back("SUMMARY:Reminder");
    lines.push_back("DESCRIPTION:" + (part(4).empty() ? std::string("Reminder") : part(4)));
  }
  lines.push_back("END:VALARM");
  return lines;
}

}  // namespace

std::vector<std::string> vCalendarAsICalendar(const ICalContentLine& line) {
  std::optional<Property> property = split(line);
  if (!property) return {line.text};
  const std::string& name = property->name;

  if (name == "AALARM" || name == "DALARM" || name == "MALARM") return alarm(*property);
  if (name == "STATUS") {
    const std::string word = upperAscii(trimBlanks(property->value));
    const std::string status = word == "NEEDS ACTION" ? "NEEDS-ACTION"
                               : word == "DECLINED"   ? "CANCELLED"
                               : word == "ACCEPTED"   ? "CONFIRMED"
                                                      : word;
    return {"STATUS:" + status};
  }
  if (name == "RRULE") {
    if (std::optional<std::string> rule = recurrenceRule(property->value)) {
      return {"RRULE:" + *rule};
    }
    return {line.text};
  }
  if (name == "EXDATE" || name == "RDATE" || name == "CATEGORIES") {
    return {line.name +
            (property->parameters.empty() ? "" : ";" + joined(property->parameters, ";")) + ':' +
            joined(words(property->value, ';'), ",")};
  }

  // Text in quoted-printable (RFC 2045 section 6.7) or in a named charset.
  bool quotedPrintable = false;
  std::optional<std::string> charset;
  std::string parameters;
  for (const std::string& parameter : property->parameters) {
    const std::string upper = upperAscii(parameter);
    if (upper == "ENCODING=QUOTED-PRINTABLE" || upper == "QUOTED-PRINTABLE") {
      quotedPrintable = true;
    } else if (upper.starts_with("CHARSET=")) {
      charset = parameter.substr(8);
    } else {
      parameters += ';' + parameter;
    }
  }
  if (!quotedPrintable && !charset) return {line.text};
  std::string text = property->value;
  try {
    if (quotedPrintable) text = decodeQuotedPrintable(text);
    try {
      text = toUtf8(text, charset);
    } catch (const std::invalid_argument&) {
      text = toUtf8(text, std::nullopt);
    }
  } catch (const std::invalid_argument&) {
    return {line.text};
  }
  return {line.name + parameters + ':' + escapedText(text)};
}

}  // namespace tessel::importers
