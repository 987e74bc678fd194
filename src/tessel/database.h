#pragma once

#include <filesystem>
#include <memory>

#include "tessel/connection.h"
#include "tessel/store.h"

namespace tessel::detail {

// The store file as this process uses it: the path, the connection every write goes
// through, and new read connections for snapshots. Opening migrates the schema.
class Database {
 public:
  Database(std::filesystem::path path, StoreOpening opening);

  const std::filesystem::path& path() const { return path_; }
  Connection& writer() { return *writer_; }
  std::unique_ptr<Connection> openReader() const;
  int schemaVersion();

 private:
  void migrate();
  std::filesystem::path path_;
  std::unique_ptr<Connection> writer_;
};

// Seconds since the epoch, as the store keeps times.
std::int64_t unixNow();

}  // namespace tessel::detail
