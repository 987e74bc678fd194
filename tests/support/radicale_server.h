#pragma once

#include <filesystem>
#include <optional>
#include <string>

#include "support/process.h"

namespace zt::test_support {

// Radicale, the CalDAV/CardDAV server of Debian's radicale package, started for one test on
// 127.0.0.1 and a free port, with its collections in `folder` and one user whose
// "USER:PASSWORD" line is in `credentials` (htpasswd with plain passwords). Stopped when the
// object goes.
class RadicaleServer {
 public:
  static bool installed();

  RadicaleServer(const std::filesystem::path& folder, const std::filesystem::path& credentials);

  // Whether it takes connections; a test asserts this before it goes on.
  bool listening() const { return listening_; }
  // "http://127.0.0.1:PORT/USER/".
  const std::string& home() const { return home_; }

  // One request to home() + `path` as the user, through python3's own HTTP client (the
  // password read from the credentials file, never from a command line): the status, "201".
  std::string request(const std::string& method, const std::string& path,
                      const std::string& body = "",
                      const std::string& contentType = "text/calendar") const;
  // MKCALENDAR and MKCOL (RFC 4791, RFC 5689) of a calendar or address book under home().
  std::string makeCalendar(const std::string& name) const;
  std::string makeAddressBook(const std::string& name) const;

 private:
  std::filesystem::path credentials_;
  std::string home_;
  std::optional<BackgroundProcess> process_;
  bool listening_ = false;
};

// An iCalendar file of one event, and a vCard 3.0 card, as a client would PUT them.
std::string eventText(const std::string& uid, const std::string& summary);
std::string cardText(const std::string& uid, const std::string& name);

}  // namespace zt::test_support
