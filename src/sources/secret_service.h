#pragma once

#include <memory>
#include <string>

#include "platform/result.h"

namespace tessel::sources {

// The desktop's keeper of passwords (the freedesktop Secret Service API: GNOME Keyring, KWallet,
// KeePassXC), asked for the password of a user at a server each time one is needed, so the
// password stays in the keyring and never in a file of ours. Items are of the schema
// "org.zeto.tessel.Source" with the attributes "user" and "server" (serverOfAddress), as
// `secret-tool store --label=... xdg:schema org.zeto.tessel.Source user USER server SERVER`
// stores them. A failure says what to do: start the refresh where the service runs (the
// desktop session), store the password, or unlock the keyring; it never holds the password.
class SecretService {
 public:
  virtual ~SecretService() = default;
  virtual zt::platform::Result<std::string> password(const std::string& user,
                                                     const std::string& server) = 0;
};

// The service over libsecret; it reaches the session bus only when a password is asked for.
std::unique_ptr<SecretService> makeSecretService();

}  // namespace tessel::sources
