// SPDX-License-Identifier: Apache-2.0
// Facts about the client library, from its resources and the preferences.
#include "support/veltra.h"

#include "base/version.h"
#include "formats/property_list.h"
#include "platform/file_store.h"
#include "platform/log.h"
#include "platform/preferences.h"
#include "platform/root.h"
#include "platform/uuid.h"

namespace veltrad::support {

namespace {
constexpr std::size_t kMostResourceBytes = 1u << 20;
}  // namespace

Veltra::Veltra(platform::FileStore& files, platform::Preferences& preferences, const platform::Root& root)
    : _files(files),
      _preferences(preferences),
      _manifestPath(root.packageManifestPath()),
      _publicKeyPath(root.publicKeyPath()) {}

std::string Veltra::packageVersion() const {
  const auto stated = statedVersion();
  return stated ? stated.value() : kVersion;
}

Result<std::string, platform::FileFailure> Veltra::statedVersion() const {
  const auto bytes = _files.read(_manifestPath, kMostResourceBytes);
  if (!bytes && bytes.error().passes()) return Failure{bytes.error()};
  if (!bytes) return std::string(kVersion);
  const auto list = formats::parsePropertyList(bytes.value());
  if (!list) {
    logWarning("The package manifest states no version: %s: %s", _manifestPath.c_str(),
               list.error().description().c_str());
    return std::string(kVersion);
  }
  const Dictionary* manifest = list.value().asDictionary();
  const std::string* version = manifest ? manifest->string("version") : nullptr;
  return version && !version->empty() ? *version : std::string(kVersion);
}

Result<std::string, platform::FileFailure> Veltra::publicKeyDER() const {
  return _files.read(_publicKeyPath, kMostResourceBytes);
}

std::optional<std::string> Veltra::getPersistentIdentifierForDNU(bool respectDNU) const {
  return _preferences.textOrStore(platform::kVeltraPreferenceDomain,
                                  respectDNU ? kIdentifierRespectingConsent : kIdentifierOverridingConsent,
                                  platform::randomUUIDText);
}

}  // namespace veltrad::support
