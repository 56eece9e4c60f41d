// Facts of the client library that the daemon shares: its package version, its public key, its identifiers.
// Any thread.
#pragma once

#include <optional>
#include <string>

#include "base/result.h"
#include "platform/file_store.h"

namespace veltrad::platform {
class Preferences;
class Root;
}  // namespace veltrad::platform

namespace veltrad::support {

// Under which preferences the identifiers of this device are kept.
inline constexpr const char* kIdentifierRespectingConsent = "uuidRespectDNU";
inline constexpr const char* kIdentifierOverridingConsent = "uuidOverrideDNU";

class Veltra {
 public:
  Veltra(platform::FileStore& files, platform::Preferences& preferences, const platform::Root& root);

  // String "version" of usr/share/veltra/package.plist; "8.0" when the package states none.
  std::string packageVersion() const;
  // The same; a failure is a shortage: for now nobody can say.
  Result<std::string, platform::FileFailure> statedVersion() const;
  // The bytes of the resource "publicKey" of type "der"; read afresh at each call.
  Result<std::string, platform::FileFailure> publicKeyDER() const;
  const std::string& publicKeyPath() const { return _publicKeyPath; }
  // A 36-character UUID text that stays the same across restarts: one while consent is respected (true),
  // another while it is overridden (false). Made and stored on first use under "uuidRespectDNU" and
  // "uuidOverrideDNU". Nothing: for a shortage nobody can say which it is.
  std::optional<std::string> getPersistentIdentifierForDNU(bool respectDNU) const;

 private:
  platform::FileStore& _files;
  platform::Preferences& _preferences;
  const std::string _manifestPath;
  const std::string _publicKeyPath;
};

}  // namespace veltrad::support
