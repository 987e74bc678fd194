#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <string>

#include "platform/result.h"

namespace tessel::sources {

// A user name and password for HTTP basic authentication (RFC 7617).
struct BasicCredentials {
  std::string user;
  std::string password;
};

// What the previous download of a collection answered, so that the next request can ask
// "only if it changed" (RFC 9110, section 13.1: If-None-Match and If-Modified-Since).
struct Validators {
  std::string entityTag;     // ETag, as the server sent it
  std::string lastModified;  // Last-Modified, as the server sent it
  bool empty() const { return entityTag.empty() && lastModified.empty(); }
};

enum class Freshness { Changed, NotModified };

struct HttpResponse {
  Freshness freshness = Freshness::Changed;
  std::string body;  // empty when NotModified
  std::string contentType;
  Validators validators;  // of this answer; those of the request when NotModified
  std::string finalUrl;   // after redirects
};

// The bounds every download keeps to.
struct HttpLimits {
  long connectSeconds = 15;
  // A collection of years of events over a slow link still fits; a server that trickles
  // forever does not keep the refresh (and a plugged-in player waiting for it) hanging.
  long totalSeconds = 120;
  // The importers hold a collection's whole text and its records in memory; 64 MiB is about
  // ten times a large address book with photos, and keeps a wrong address (a disk image, a
  // stream) from filling memory.
  std::size_t maxBytes = std::size_t{64} << 20;
  long maxRedirects = 5;
};

// GET of one collection over HTTP(S). Only http and https are spoken, and webcal:// (the
// subscription scheme calendars publish) as https, then as http when no TLS connection can be
// made and no password would go along; redirects are followed up to the limit and never from
// https to http; credentials go to the first host only. A
// failure (no connection, time-out, an answer other than 2xx or 304, a download cut short or
// over the size limit) is an error whose text names the address, never the password.
class HttpClient {
 public:
  virtual ~HttpClient() = default;
  virtual zt::platform::Result<HttpResponse> get(const std::string& url,
                                                 const std::optional<BasicCredentials>& credentials,
                                                 const Validators& previous) = 0;
};

// The client over libcurl.
std::unique_ptr<HttpClient> makeHttpClient(const HttpLimits& limits = {});

}  // namespace tessel::sources
