// Facts of the client library that the daemon shares: its package version, its public key, its identifiers.
// Any thread.
#pragma once

#include <optional>
#include <string>

namespace veltrad {

namespace platform {
class FileStore;
class Preferences;
class Root;
}  // namespace platform

class Veltra {
 public:
  Veltra(platform::FileStore& files, platform::Preferences& preferences, const platform::Root& root);

  // String "version" of usr/share/veltra/package.plist; "8.0" when the package states none.
  std::string packageVersion() const;
  // The bytes of the resource "publicKey" of type "der"; read afresh at each call.
  std::optional<std::string> publicKeyDER() const;
  // A 36-character UUID text that stays the same across restarts: one while consent is respected (true),
  // another while it is overridden (false). Made and stored on first use under "uuidRespectDNU" and
  // "uuidOverrideDNU".
  std::string getPersistentIdentifierForDNU(bool respectDNU) const;

 private:
  platform::FileStore& _files;
  platform::Preferences& _preferences;
  const std::string _manifestPath;
  const std::string _publicKeyPath;
};

}  // namespace veltrad
