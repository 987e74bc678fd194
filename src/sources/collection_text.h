#pragma once

#include <filesystem>
#include <optional>
#include <string_view>

#include "platform/result.h"
#include "sources/http_client.h"
#include "sources/source.h"

namespace tessel::sources {

// What a text holds, from its first BEGIN line: VCARD (RFC 6350) or VCALENDAR (RFC 5545).
std::optional<Collection> collectionOfText(std::string_view text);

// What a file or a vdir folder holds: the file's text, or the extensions of the folder's
// files (.vcf, .ics). None when it cannot tell (an empty folder, an unreadable file).
std::optional<Collection> collectionOfPath(const std::filesystem::path& path);

// Whether a download is the collection expected, and not, say, the login page of a web
// application or an error page served with 200.
zt::platform::Result<void> checkDownload(const HttpResponse& response, Collection expected);

}  // namespace tessel::sources
