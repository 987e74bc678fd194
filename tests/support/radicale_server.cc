#include "support/radicale_server.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <thread>
#include <vector>

#include "support/files.h"

namespace zt::test_support {

namespace fs = std::filesystem;

namespace {

constexpr const char* kRadicale = "/usr/bin/radicale";
constexpr const char* kPython = "/usr/bin/python3";

sockaddr_in loopback(int port) {
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  address.sin_port = htons(static_cast<std::uint16_t>(port));
  return address;
}

// The port the system gives a socket bound to port 0, free again once it is closed.
int freePort() {
  const int fd = ::socket(AF_INET, SOCK_STREAM, 0);
  sockaddr_in address = loopback(0);
  socklen_t length = sizeof address;
  ::bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof address);
  ::getsockname(fd, reinterpret_cast<sockaddr*>(&address), &length);
  ::close(fd);
  return ntohs(address.sin_port);
}

bool accepts(int port) {
  const int fd = ::socket(AF_INET, SOCK_STREAM, 0);
  const sockaddr_in address = loopback(port);
  const bool connected =
      ::connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
  ::close(fd);
  return connected;
}

}  // namespace

bool RadicaleServer::installed() {
  return fs::exists(kRadicale) && fs::exists(kPython);
}

RadicaleServer::RadicaleServer(const fs::path& folder, const fs::path& credentials)
    : credentials_(credentials) {
  const int port = freePort();
  const std::string line = readFile(credentials);
  home_ = "http://127.0.0.1:" + std::to_string(port) + "/" + line.substr(0, line.find(':')) + "/";
  process_.emplace(std::vector<std::string>{
      kRadicale, "--config", "", "--server-hosts", "127.0.0.1:" + std::to_string(port),
      "--storage-filesystem-folder", (folder / "collections").string(), "--auth-type", "htpasswd",
      "--auth-htpasswd-filename", credentials.string(), "--auth-htpasswd-encryption", "plain",
      "--logging-level", "critical"});
  for (int tries = 0; tries < 200 && !listening_; ++tries) {
    listening_ = accepts(port);
    if (!listening_) std::this_thread::sleep_for(std::chrono::milliseconds(50));
  }
}

std::string RadicaleServer::request(const std::string& method, const std::string& path,
                                    const std::string& body, const std::string& contentType) const {
  const std::string script =
      "import base64, sys, urllib.error, urllib.request\n"
      "method, url, kind, secret = sys.argv[1:5]\n"
      "data = sys.stdin.buffer.read() or None\n"
      "request = urllib.request.Request(url, data=data, method=method)\n"
      "user = open(secret, 'rb').read().strip()\n"
      "request.add_header('Authorization', 'Basic ' + base64.b64encode(user).decode())\n"
      "request.add_header('Content-Type', kind)\n"
      "try:\n  print(urllib.request.urlopen(request).status)\n"
      "except urllib.error.HTTPError as e:\n  print(e.code)\n";
  ProcessOptions options;
  options.input = body;
  const ProcessRun run = runProcess(
      {kPython, "-c", script, method, home_ + path, contentType, credentials_.string()}, options);
  return run.out.substr(0, 3);
}

std::string RadicaleServer::makeCalendar(const std::string& name) const {
  return request("MKCALENDAR", name + "/");
}

std::string RadicaleServer::makeAddressBook(const std::string& name) const {
  return request("MKCOL", name + "/",
                 R"(<?xml version="1.0"?><mkcol xmlns="DAV:" )"
                 R"(xmlns:C="urn:ietf:params:xml:ns:carddav"><set><prop><resourcetype>)"
                 R"(<collection/><C:addressbook/></resourcetype></prop></set></mkcol>)",
                 "application/xml");
}

std::string eventText(const std::string& uid, const std::string& summary) {
  return "BEGIN:VCALENDAR\r\nVERSION:2.0\r\nPRODID:-//test//EN\r\nBEGIN:VEVENT\r\nUID:" + uid +
         "\r\nDTSTAMP:20260101T000000Z\r\nDTSTART:20260102T100000Z\r\nSUMMARY:" + summary +
         "\r\nEND:VEVENT\r\nEND:VCALENDAR\r\n";
}

std::string cardText(const std::string& uid, const std::string& name) {
  return "BEGIN:VCARD\r\nVERSION:3.0\r\nUID:" + uid + "\r\nFN:" + name + "\r\nN:" + name +
         ";;;;\r\nEND:VCARD\r\n";
}

}  // namespace zt::test_support
