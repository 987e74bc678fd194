#include <libsecret/secret.h>

#include <string_view>

#include "sources/secret_service.h"

namespace tessel::sources {

namespace {

using zt::platform::Error;
using zt::platform::Result;

// libsecret matches an item by every attribute of the schema and by the schema's name, which
// it keeps in the item's "xdg:schema" attribute.
const SecretSchema kSchema = {"org.zeto.tessel.Source",
                              SECRET_SCHEMA_NONE,
                              {{"user", SECRET_SCHEMA_ATTRIBUTE_STRING},
                               {"server", SECRET_SCHEMA_ATTRIBUTE_STRING},
                               {nullptr, SECRET_SCHEMA_ATTRIBUTE_STRING}},
                              0,
                              nullptr,
                              nullptr,
                              nullptr,
                              nullptr,
                              nullptr,
                              nullptr,
                              nullptr};

// A word of the hint as a shell takes it back.
std::string shellWord(std::string_view word) {
  const bool plain = !word.empty() && word.find_first_not_of(
                                          "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz"
                                          "0123456789@%+=:,./_-") == std::string_view::npos;
  if (plain) return std::string(word);
  std::string quoted = "'";
  for (const char c : word) quoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
  return quoted + "'";
}

std::string takeMessage(GError* error) {
  std::string message = error->message != nullptr ? error->message : "unknown failure";
  g_error_free(error);
  return message;
}

class LibsecretSecretService final : public SecretService {
 public:
  Result<std::string> password(const std::string& user, const std::string& server) override {
    const std::string whose = user + " at " + server;
    GError* error = nullptr;
    // Asks the service to unlock a locked item, which shows the desktop's unlock prompt where a
    // desktop runs; without one the prompt fails at once and the answer is none.
    gchar* found =
        secret_password_lookup_sync(&kSchema, nullptr, &error, "user", user.c_str(), "server",
                                    server.c_str(), static_cast<const char*>(nullptr));
    if (error != nullptr)
      return Error{"cannot ask the desktop's secret service for the password of " + whose + " (" +
                   takeMessage(error) +
                   "): run tessel in your desktop session, where the service runs, or keep the "
                   "password in a credentials file instead (--credentials FILE)"};
    if (found != nullptr) {
      std::string password = found;
      secret_password_free(found);  // wipes the service's copy
      return password;
    }
    // The Secret Service API tells a locked item from a missing one only through a search whose
    // item objects libsecret does not free; the message covers both.
    return Error{"the desktop's secret service has no unlocked password of " + whose +
                 ": unlock the keyring that keeps it (logging in to the desktop unlocks the login "
                 "keyring), or store it, typing it when asked (secret-tool store --label=" +
                 shellWord("tessel: " + whose) + " xdg:schema " + kSchema.name + " user " +
                 shellWord(user) + " server " + shellWord(server) + ")"};
  }
};

}  // namespace

std::unique_ptr<SecretService> makeSecretService() {
  return std::make_unique<LibsecretSecretService>();
}

}  // namespace tessel::sources
