#include <curl/curl.h>

#include <mutex>
#include <string_view>
#include <utility>

#include "platform/ascii.h"
#include "sources/http_client.h"

namespace tessel::sources {

namespace {

using zt::platform::Error;
using zt::platform::Result;

constexpr std::string_view kWebcal = "webcal://";

// One download's state, which curl's callbacks fill in.
struct Transfer {
  std::size_t maxBytes = 0;
  bool tooLarge = false;
  std::string body;
  std::string entityTag;
  std::string lastModified;
};

std::size_t appendBody(char* data, std::size_t size, std::size_t count, void* context) {
  auto* transfer = static_cast<Transfer*>(context);
  const std::size_t bytes = size * count;
  // A chunked answer has no Content-Length for CURLOPT_MAXFILESIZE to check in advance.
  if (transfer->body.size() + bytes > transfer->maxBytes) {
    transfer->tooLarge = true;
    return 0;
  }
  transfer->body.append(data, bytes);
  return bytes;
}

std::string trimmed(std::string_view text) {
  while (!text.empty() &&
         (text.back() == '\r' || text.back() == '\n' || text.back() == ' ' || text.back() == '\t'))
    text.remove_suffix(1);
  while (!text.empty() && (text.front() == ' ' || text.front() == '\t')) text.remove_prefix(1);
  return std::string(text);
}

std::size_t readHeader(char* data, std::size_t size, std::size_t count, void* context) {
  auto* transfer = static_cast<Transfer*>(context);
  const std::size_t bytes = size * count;
  const std::string_view line(data, bytes);
  // Each answer of a redirect chain starts with its status line; only the last one counts.
  if (line.starts_with("HTTP/")) {
    transfer->entityTag.clear();
    transfer->lastModified.clear();
    return bytes;
  }
  const std::size_t colon = line.find(':');
  if (colon == std::string_view::npos) return bytes;
  const std::string name = zt::platform::lowerAscii(std::string(line.substr(0, colon)));
  if (name == "etag") transfer->entityTag = trimmed(line.substr(colon + 1));
  if (name == "last-modified") transfer->lastModified = trimmed(line.substr(colon + 1));
  return bytes;
}

struct CurlHandleDeleter {
  void operator()(CURL* handle) const { curl_easy_cleanup(handle); }
};
struct HeaderListDeleter {
  void operator()(curl_slist* list) const { curl_slist_free_all(list); }
};

// What a failed attempt leaves for the webcal fallback to decide on.
enum class Failure { None, Connection, Other };

class CurlHttpClient : public HttpClient {
 public:
  explicit CurlHttpClient(const HttpLimits& limits) : limits_(limits) {
    static std::once_flag initialised;
    std::call_once(initialised, [] { curl_global_init(CURL_GLOBAL_DEFAULT); });
  }

  Result<HttpResponse> get(const std::string& url,
                           const std::optional<BasicCredentials>& credentials,
                           const Validators& previous) override {
    if (!zt::platform::lowerAscii(url.substr(0, kWebcal.size())).starts_with(kWebcal))
      return attempt(url, credentials, previous).first;
    const std::string rest = url.substr(kWebcal.size());
    auto [secure, failure] = attempt("https://" + rest, credentials, previous);
    if (secure.ok() || failure != Failure::Connection) return secure;
    // Plain http would send the password where anyone on the way can read it.
    if (credentials) return secure;
    auto [plain, ignored] = attempt("http://" + rest, credentials, previous);
    if (plain.ok()) return plain;
    return Error{secure.error() + "; over http: " + plain.error()};
  }

 private:
  std::pair<Result<HttpResponse>, Failure> attempt(
      const std::string& url, const std::optional<BasicCredentials>& credentials,
      const Validators& previous) {
    std::unique_ptr<CURL, CurlHandleDeleter> handle(curl_easy_init());
    if (!handle) return {Error{url + ": cannot start an HTTP transfer"}, Failure::Other};
    CURL* curl = handle.get();
    Transfer transfer;
    transfer.maxBytes = limits_.maxBytes;
    char curlError[CURL_ERROR_SIZE] = {};

    const bool https = zt::platform::lowerAscii(url.substr(0, 8)) == "https://";
    curl_easy_setopt(curl, CURLOPT_URL, url.c_str());
    curl_easy_setopt(curl, CURLOPT_PROTOCOLS_STR, "http,https");
    // Once on TLS, stay on it: a redirect to http would expose the collection and the password.
    curl_easy_setopt(curl, CURLOPT_REDIR_PROTOCOLS_STR, https ? "https" : "http,https");
    curl_easy_setopt(curl, CURLOPT_FOLLOWLOCATION, 1L);
    curl_easy_setopt(curl, CURLOPT_MAXREDIRS, limits_.maxRedirects);
    curl_easy_setopt(curl, CURLOPT_CONNECTTIMEOUT, limits_.connectSeconds);
    curl_easy_setopt(curl, CURLOPT_TIMEOUT, limits_.totalSeconds);
    curl_easy_setopt(curl, CURLOPT_MAXFILESIZE_LARGE, static_cast<curl_off_t>(limits_.maxBytes));
    curl_easy_setopt(curl, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(curl, CURLOPT_ACCEPT_ENCODING, "");
    curl_easy_setopt(curl, CURLOPT_USERAGENT, "tessel");
    curl_easy_setopt(curl, CURLOPT_ERRORBUFFER, curlError);
    curl_easy_setopt(curl, CURLOPT_WRITEFUNCTION, appendBody);
    curl_easy_setopt(curl, CURLOPT_WRITEDATA, &transfer);
    curl_easy_setopt(curl, CURLOPT_HEADERFUNCTION, readHeader);
    curl_easy_setopt(curl, CURLOPT_HEADERDATA, &transfer);
    if (credentials) {
      curl_easy_setopt(curl, CURLOPT_HTTPAUTH, CURLAUTH_BASIC);
      curl_easy_setopt(curl, CURLOPT_USERNAME, credentials->user.c_str());
      curl_easy_setopt(curl, CURLOPT_PASSWORD, credentials->password.c_str());
    }
    curl_slist* list = nullptr;
    const auto addHeader = [&list](const std::string& header) {
      if (curl_slist* longer = curl_slist_append(list, header.c_str())) list = longer;
    };
    if (!previous.entityTag.empty()) addHeader("If-None-Match: " + previous.entityTag);
    if (!previous.lastModified.empty()) addHeader("If-Modified-Since: " + previous.lastModified);
    const std::unique_ptr<curl_slist, HeaderListDeleter> headers(list);
    if (headers) curl_easy_setopt(curl, CURLOPT_HTTPHEADER, headers.get());

    const CURLcode code = curl_easy_perform(curl);
    if (code != CURLE_OK)
      return {Error{url + ": " + describe(code, curlError, transfer)},
              connectionFailure(code) ? Failure::Connection : Failure::Other};

    long status = 0;
    curl_easy_getinfo(curl, CURLINFO_RESPONSE_CODE, &status);
    HttpResponse response;
    char* effective = nullptr;
    curl_easy_getinfo(curl, CURLINFO_EFFECTIVE_URL, &effective);
    response.finalUrl = effective != nullptr ? effective : url;
    // "Not modified" means nothing when nothing was asked about: there is no copy to keep.
    if (status == 304 && previous.empty())
      return {Error{url + ": the server answered 304 Not Modified to an unconditional request"},
              Failure::Other};
    if (status == 304) {
      response.freshness = Freshness::NotModified;
      response.validators = previous;
      return {std::move(response), Failure::None};
    }
    if (status < 200 || status > 299)
      return {Error{url + ": " + describeStatus(status)}, Failure::Other};
    char* type = nullptr;
    curl_easy_getinfo(curl, CURLINFO_CONTENT_TYPE, &type);
    if (type != nullptr) response.contentType = type;
    response.body = std::move(transfer.body);
    response.validators = {std::move(transfer.entityTag), std::move(transfer.lastModified)};
    return {std::move(response), Failure::None};
  }

  // Nothing listens for TLS there. A handshake that fails is not among these, nor is a
  // certificate that fails verification: whoever stands on the path can cause either, and a
  // fallback to http would hand them the collection.
  static bool connectionFailure(CURLcode code) { return code == CURLE_COULDNT_CONNECT; }

  std::string describe(CURLcode code, const char* detail, const Transfer& transfer) const {
    const std::string limit = std::to_string(limits_.maxBytes >> 20) + " MiB";
    if (transfer.tooLarge || code == CURLE_FILESIZE_EXCEEDED)
      return "the collection is larger than the limit of " + limit;
    std::string text = curl_easy_strerror(code);
    if (code == CURLE_PARTIAL_FILE) text = "the download stopped before its end";
    if (code == CURLE_TOO_MANY_REDIRECTS)
      text = "more than " + std::to_string(limits_.maxRedirects) + " redirects";
    if (code == CURLE_UNSUPPORTED_PROTOCOL)
      text = "only http and https addresses are read, and no redirect leaves https";
    if (detail[0] != '\0') text += " (" + std::string(detail) + ")";
    return text;
  }

  static std::string describeStatus(long status) {
    const std::string code = "HTTP " + std::to_string(status);
    if (status == 401) return "the server refused the user name or password (" + code + ")";
    if (status == 403) return "the server forbids access to it (" + code + ")";
    if (status == 404 || status == 410) return "the server has no such collection (" + code + ")";
    return "the server answered " + code;
  }

  HttpLimits limits_;
};

}  // namespace

std::unique_ptr<HttpClient> makeHttpClient(const HttpLimits& limits) {
  return std::make_unique<CurlHttpClient>(limits);
}

}  // namespace tessel::sources
