#include "tools/tessel/notification_file.h"

#include <fstream>
#include <nlohmann/json.hpp>
#include <system_error>

#include "platform/sync_progress.h"

namespace tessel::cli {

namespace {

bool isSyncNote(const nlohmann::json& note) {
  return note.is_object() && note.contains("name") && note["name"].is_string() &&
         note.contains("object") && note["object"].is_string();
}

// A notification's payload from its JSON line: the strings, numbers and lists of strings that
// the progress needs.
zt::platform::Dictionary payloadFromJson(const nlohmann::json& info) {
  zt::platform::Dictionary payload;
  if (!info.is_object()) return payload;
  for (const auto& [key, value] : info.items()) {
    if (value.is_string()) {
      payload.set(key, zt::platform::Value(value.get<std::string>()));
    } else if (value.is_number_integer()) {
      payload.set(key, zt::platform::Value::integer(value.get<std::int64_t>()));
    } else if (value.is_number()) {
      payload.set(key, zt::platform::Value::real(value.get<double>()));
    } else if (value.is_array()) {
      zt::platform::Array names;
      for (const auto& element : value) {
        if (element.is_string()) names.emplace_back(element.get<std::string>());
      }
      payload.set(key, zt::platform::Value(std::move(names)));
    }
  }
  return payload;
}

}  // namespace

std::uintmax_t NotificationFile::startOfFollowing(const std::filesystem::path& path,
                                                  const std::optional<std::string>& client) {
  std::ifstream in(path, std::ios::binary);
  std::uintmax_t offset = 0;
  std::optional<std::uintmax_t> running;
  for (std::string line; std::getline(in, line);) {
    const std::uintmax_t start = offset;
    offset += line.size() + 1;
    if (!client || in.eof()) continue;
    const nlohmann::json note = nlohmann::json::parse(line, nullptr, false);
    if (!isSyncNote(note) || note["object"] != *client) continue;
    const nlohmann::json info = note.value("userInfo", nlohmann::json::object());
    if (info.contains(std::string(zt::platform::sync_progress::kStatusKey))) {
      running.reset();
    } else if (!running) {
      running = start;
    }
  }
  std::error_code error;
  const std::uintmax_t size = std::filesystem::file_size(path, error);
  return running && !error ? *running : error ? 0 : size;
}

std::vector<zt::platform::Notification> NotificationFile::readNew() {
  std::vector<zt::platform::Notification> notes;
  std::error_code error;
  const std::uintmax_t size = std::filesystem::file_size(path_, error);
  if (error || size == offset_) return notes;
  if (size < offset_) {  // emptied: read it from its start, without the old partial line
    offset_ = 0;
    pending_.clear();
  }
  std::ifstream in(path_, std::ios::binary);
  in.seekg(static_cast<std::streamoff>(offset_));
  std::string chunk(static_cast<std::size_t>(size - offset_), '\0');
  in.read(chunk.data(), static_cast<std::streamsize>(chunk.size()));
  chunk.resize(static_cast<std::size_t>(in.gcount()));
  offset_ += chunk.size();
  pending_ += chunk;
  for (auto end = pending_.find('\n'); end != std::string::npos; end = pending_.find('\n')) {
    const std::string line = pending_.substr(0, end);
    pending_.erase(0, end + 1);
    const nlohmann::json note = nlohmann::json::parse(line, nullptr, false);
    if (!isSyncNote(note)) continue;
    notes.push_back({note["name"].get<std::string>(), note["object"].get<std::string>(),
                     payloadFromJson(note.value("userInfo", nlohmann::json()))});
  }
  return notes;
}

}  // namespace tessel::cli
