#include "tools/tessel/source_commands.h"

#include <filesystem>
#include <iostream>
#include <ostream>
#include <stdexcept>
#include <system_error>

#include "platform/ascii.h"
#include "sources/collection_text.h"
#include "sources/credentials.h"
#include "sources/http_client.h"
#include "sources/secret_service.h"
#include "sources/source_state.h"
#include "tools/tessel/usage_error.h"

namespace tessel::cli {

namespace fs = std::filesystem;
using sources::Collection;
using sources::Source;
using sources::SourceList;

namespace {

SourceList loadList() {
  auto list = SourceList::load(SourceList::defaultPath());
  if (!list) throw std::runtime_error(list.error());
  return std::move(list).value();
}

// A password in the address would show in `source list`, in messages and on command lines.
void refuseUserInAddress(const std::string& address) {
  if (sources::serverOfAddress(address).find('@') != std::string::npos)
    throw UsageError(
        "the address carries a user name: put USER:PASSWORD in a file only you can read and "
        "name it with --credentials, or name the user with --user and keep the password in the "
        "desktop's secret service (--secret-service)");
}

// Basic authentication over http beyond this machine (RFC 7617, section 4: the password is
// only encoded). A server on the loopback address is reached without a network in between.
bool sendsPasswordInClear(const std::string& address) {
  if (!zt::platform::lowerAscii(address).starts_with("http://")) return false;
  const std::size_t start = address.find("://") + 3;
  std::string host = address.substr(start, address.find_first_of("/?#", start) - start);
  if (host.starts_with("["))
    host = host.substr(0, host.find(']') + 1);
  else
    host = host.substr(0, host.find(':'));
  host = zt::platform::lowerAscii(host);
  return host != "localhost" && host != "[::1]" && !host.starts_with("127.");
}

Collection collectionOfAddress(const Source& source,
                               const std::optional<sources::BasicCredentials>& credentials) {
  const auto http = sources::makeHttpClient();
  auto response = http->get(source.location, credentials, {});
  if (!response) throw std::runtime_error("cannot tell what it holds: " + response.error());
  const std::optional<Collection> found = sources::collectionOfText(response->body);
  if (!found || !sources::checkDownload(*response, *found).ok()) {
    const auto checked = sources::checkDownload(*response, Collection::Calendar);
    throw std::runtime_error("cannot tell what it holds" +
                             (checked.ok() ? std::string() : ": " + checked.error()) +
                             "; say --calendar or --address-book");
  }
  return *found;
}

}  // namespace

void addSource(CommandContext& context, const std::string& location,
               std::optional<Collection> collection, const std::optional<std::string>& title,
               const std::optional<std::string>& credentialsFile,
               const std::optional<std::string>& secretServiceUser, importers::OnFault onFault) {
  SourceList list = loadList();
  Source source;
  source.title = title;
  source.onFault = onFault;
  std::optional<sources::BasicCredentials> credentials;
  if (Source::isAddress(location)) {
    refuseUserInAddress(location);
    source.location = location;
    if (credentialsFile) source.credentialsFile = fs::absolute(*credentialsFile);
    source.secretServiceUser = secretServiceUser;
    // A password that cannot be had now would fail every refresh: say so while the person is
    // here to store it.
    const auto secrets = sources::makeSecretService();
    auto found = sources::credentialsOf(source, *secrets);
    if (!found) throw std::runtime_error(found.error());
    credentials = std::move(found).value();
    if (credentials && sendsPasswordInClear(location))
      std::cerr << "tessel: warning: the password goes over plain http, readable on the way; "
                   "use the https address if the server has one\n";
  } else {
    if (location.find("://") != std::string::npos)
      throw UsageError(location + ": only http, https and webcal addresses are read");
    if (credentialsFile || secretServiceUser)
      throw UsageError("--credentials and --secret-service are for addresses, not files");
    std::error_code error;
    if (!fs::exists(location, error))
      throw std::runtime_error(location + ": no such file or folder");
    fs::path absolute = fs::canonical(location, error);
    source.location = (error ? fs::absolute(location) : absolute).string();
  }
  if (list.find(source.location) != nullptr)
    throw std::runtime_error(source.location + " is already source " +
                             list.find(source.location)->identifier);
  if (collection) {
    source.collection = *collection;
  } else if (source.isAddress()) {
    source.collection = collectionOfAddress(source, credentials);
  } else if (auto found = sources::collectionOfPath(source.location)) {
    source.collection = *found;
  } else {
    throw std::runtime_error(location +
                             ": cannot tell what it holds; say --calendar or "
                             "--address-book");
  }
  const Source& added = list.add(std::move(source));
  if (auto saved = list.save(); !saved) throw std::runtime_error(saved.error());
  context.out() << "source " << added.identifier << ": "
                << sources::collectionName(added.collection) << ' ' << added.location
                << " (tessel refresh brings it in)\n";
}

void listSources(CommandContext& context) {
  const SourceList list = loadList();
  for (const Source& source : list.sources()) {
    context.out() << source.identifier << '\t' << sources::collectionName(source.collection) << '\t'
                  << source.location;
    if (source.title) context.out() << "\ttitle: " << *source.title;
    if (source.credentialsFile)
      context.out() << "\tcredentials: " << source.credentialsFile->string();
    if (source.secretServiceUser)
      context.out() << "\tcredentials: secret service, user " << *source.secretServiceUser << " at "
                    << sources::serverOfAddress(source.location);
    if (source.onFault == importers::OnFault::Skip) context.out() << "\tlenient";
    context.out() << '\n';
  }
}

void removeSource(CommandContext& context, const std::string& identifierOrLocation) {
  SourceList list = loadList();
  const std::optional<Source> removed = list.remove(identifierOrLocation);
  if (!removed)
    throw std::runtime_error("no source " + identifierOrLocation + " (tessel source list)");
  if (auto saved = list.save(); !saved) throw std::runtime_error(saved.error());
  sources::SourceStates(context.storePath()).forget(*removed);
  context.out() << "removed source " << removed->identifier << " (" << removed->location
                << "); what it brought stays in the store\n";
}

}  // namespace tessel::cli
