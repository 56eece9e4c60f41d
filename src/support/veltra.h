// SPDX-License-Identifier: Apache-2.0
// Facts about the client library that the daemon uses: its package version, public key and identifiers.
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

// The preferences with the identifiers of this device.
inline constexpr const char* kIdentifierRespectingConsent = "uuidRespectDNU";
inline constexpr const char* kIdentifierOverridingConsent = "uuidOverrideDNU";

class Veltra {
 public:
  Veltra(platform::FileStore& files, platform::Preferences& preferences, const platform::Root& root);

  // The text "version" in usr/share/veltra/package.plist, else the daemon's version.
  std::string packageVersion() const;
  // The same, but fails during a shortage.
  Result<std::string, platform::FileFailure> statedVersion() const;
  // The bytes of the resource "publicKey" of type "der", read at each call.
  Result<std::string, platform::FileFailure> publicKeyDER() const;
  const std::string& publicKeyPath() const { return _publicKeyPath; }
  // A UUID that persists across restarts: one for when consent is respected, another for when it is
  // overridden. Made and stored at the first use, under "uuidRespectDNU" and "uuidOverrideDNU". Absent during
  // a shortage.
  std::optional<std::string> getPersistentIdentifierForDNU(bool respectDNU) const;

 private:
  platform::FileStore& _files;
  platform::Preferences& _preferences;
  const std::string _manifestPath;
  const std::string _publicKeyPath;
};

}  // namespace veltrad::support
