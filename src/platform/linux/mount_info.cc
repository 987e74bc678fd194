#include "platform/linux/mount_info.h"

#include <charconv>
#include <fstream>
#include <sstream>

namespace zt::platform {
namespace {

std::vector<std::string_view> splitFields(std::string_view line) {
  std::vector<std::string_view> fields;
  std::size_t pos = 0;
  while (pos < line.size()) {
    while (pos < line.size() && line[pos] == ' ') ++pos;
    std::size_t end = line.find(' ', pos);
    if (end == std::string_view::npos) end = line.size();
    if (end > pos) fields.push_back(line.substr(pos, end - pos));
    pos = end;
  }
  return fields;
}

template <typename Number>
bool parseNumber(std::string_view text, Number& out) {
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), out);
  return error == std::errc() && end == text.data() + text.size();
}

bool isOctal(char c) {
  return c >= '0' && c <= '7';
}

std::optional<MountInfoEntry> parseLine(std::string_view line) {
  // mountId parentId major:minor root mountPoint options [optional fields...] - fsType source
  // superOptions
  std::vector<std::string_view> fields = splitFields(line);
  if (fields.size() < 10) return std::nullopt;
  MountInfoEntry entry;
  if (!parseNumber(fields[0], entry.mountId) || !parseNumber(fields[1], entry.parentId)) {
    return std::nullopt;
  }
  std::size_t colon = fields[2].find(':');
  if (colon == std::string_view::npos || !parseNumber(fields[2].substr(0, colon), entry.major) ||
      !parseNumber(fields[2].substr(colon + 1), entry.minor)) {
    return std::nullopt;
  }
  std::size_t separator = 6;
  while (separator < fields.size() && fields[separator] != "-") ++separator;
  if (separator + 2 >= fields.size()) return std::nullopt;
  entry.root = unescapeMountInfoField(fields[3]);
  entry.mountPoint = unescapeMountInfoField(fields[4]);
  entry.fsType = unescapeMountInfoField(fields[separator + 1]);
  entry.source = unescapeMountInfoField(fields[separator + 2]);
  return entry;
}

}  // namespace

std::string unescapeMountInfoField(std::string_view field) {
  std::string out;
  out.reserve(field.size());
  for (std::size_t i = 0; i < field.size(); ++i) {
    // Only a backslash and three octal digits of a byte value are an escape.
    if (field[i] == '\\' && i + 3 < field.size() && field[i + 1] >= '0' && field[i + 1] <= '3' &&
        isOctal(field[i + 2]) && isOctal(field[i + 3])) {
      int value = (field[i + 1] - '0') * 64 + (field[i + 2] - '0') * 8 + (field[i + 3] - '0');
      out.push_back(static_cast<char>(value));
      i += 3;
    } else {
      out.push_back(field[i]);
    }
  }
  return out;
}

std::vector<MountInfoEntry> parseMountInfo(std::string_view text) {
  std::vector<MountInfoEntry> entries;
  std::size_t pos = 0;
  while (pos < text.size()) {
    std::size_t end = text.find('\n', pos);
    if (end == std::string_view::npos) end = text.size();
    if (auto entry = parseLine(text.substr(pos, end - pos))) entries.push_back(std::move(*entry));
    pos = end + 1;
  }
  return entries;
}

std::optional<std::string> readMountInfo() {
  std::ifstream file("/proc/self/mountinfo");
  if (!file) return std::nullopt;
  std::ostringstream text;
  text << file.rdbuf();
  return std::move(text).str();
}

}  // namespace zt::platform
