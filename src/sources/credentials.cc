#include "sources/credentials.h"

#include <fstream>
#include <string>
#include <system_error>
#include <utility>

namespace tessel::sources {

namespace fs = std::filesystem;
using zt::platform::Error;
using zt::platform::Result;

Result<BasicCredentials> readCredentials(const fs::path& file) {
  std::error_code error;
  const fs::file_status status = fs::status(file, error);
  if (error || !fs::is_regular_file(status))
    return Error{"credentials file " + file.string() + ": no such file"};
  const fs::perms others = fs::perms::group_all | fs::perms::others_all;
  if ((status.permissions() & others) != fs::perms::none)
    return Error{"credentials file " + file.string() +
                 " can be read or changed by other users: make it yours alone with chmod 600 " +
                 file.string()};
  std::ifstream in(file, std::ios::binary);
  std::string line;
  if (!in || !std::getline(in, line))
    return Error{"credentials file " + file.string() + ": cannot be read"};
  if (!line.empty() && line.back() == '\r') line.pop_back();
  const std::size_t colon = line.find(':');
  if (colon == std::string::npos || colon == 0)
    return Error{"credentials file " + file.string() + ": its first line must be USER:PASSWORD"};
  return BasicCredentials{line.substr(0, colon), line.substr(colon + 1)};
}

Result<std::optional<BasicCredentials>> credentialsOf(const Source& source,
                                                      SecretService& secrets) {
  if (source.credentialsFile) {
    auto read = readCredentials(*source.credentialsFile);
    if (!read) return Error{read.error()};
    return std::optional<BasicCredentials>(std::move(read).value());
  }
  if (source.secretServiceUser) {
    auto password = secrets.password(*source.secretServiceUser, serverOfAddress(source.location));
    if (!password) return Error{password.error()};
    return std::optional<BasicCredentials>(
        BasicCredentials{*source.secretServiceUser, std::move(password).value()});
  }
  return std::optional<BasicCredentials>();
}

}  // namespace tessel::sources
