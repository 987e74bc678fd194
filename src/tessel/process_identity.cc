#include "tessel/process_identity.h"

#include <unistd.h>

#include <fstream>
#include <sstream>
#include <string>

namespace tessel::detail {

std::optional<std::int64_t> ProcessIdentity::startTimeOf(long pid) {
  std::ifstream in("/proc/" + std::to_string(pid) + "/stat");
  std::string line;
  if (!in || !std::getline(in, line)) return std::nullopt;
  // The command name may hold spaces and parentheses; the fields follow its last ')'.
  auto close = line.rfind(')');
  if (close == std::string::npos) return std::nullopt;
  std::istringstream fields(line.substr(close + 1));
  std::string state;
  fields >> state;
  if (state == "Z" || state == "X" || state == "x") return std::nullopt;
  // After the state come fields 4 to 21; the start time is field 22.
  std::string skipped;
  for (int field = 4; field <= 21; ++field) fields >> skipped;
  std::int64_t start = 0;
  if (!(fields >> start)) return std::nullopt;
  return start;
}

ProcessIdentity ProcessIdentity::current() {
  long pid = static_cast<long>(getpid());
  return {pid, startTimeOf(pid).value_or(0)};
}

bool ProcessIdentity::isAlive() const {
  auto start = startTimeOf(pid);
  return start && *start == startTime;
}

}  // namespace tessel::detail
