#pragma once

#include <filesystem>
#include <optional>

#include "platform/result.h"
#include "sources/http_client.h"
#include "sources/secret_service.h"
#include "sources/source.h"

namespace tessel::sources {

// Reads the user name and password of a source from its credentials file: one line,
// "USER:PASSWORD" (the user name ends at the first colon, as RFC 7617 joins them). The file
// must be readable by its owner only (chmod 600): a file that others can read is refused,
// since its password is as good as published. Messages name the file, never its content.
zt::platform::Result<BasicCredentials> readCredentials(const std::filesystem::path& file);

// What the source's address is fetched with: the credentials file's, the secret service's
// password of its user at serverOfAddress, or none when the source names neither.
zt::platform::Result<std::optional<BasicCredentials>> credentialsOf(const Source& source,
                                                                    SecretService& secrets);

}  // namespace tessel::sources
