// SPDX-License-Identifier: Apache-2.0
// The identifier under which a back end posts, and what the user's consent allows.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "config/process_settings.h"
#include "platform/preferences.h"
#include "support/veltra.h"

namespace veltrad::backends {

struct DeviceFacts;

class PostIdentity {
 public:
  // All of it outlives the object.
  struct Sources {
    platform::Preferences& preferences;
    const support::Veltra& library;
    config::ProcessSettings& settings;
  };
  explicit PostIdentity(const Sources& sources);

  // False if the device's identifiers could not be read.
  bool known() const { return !_uuidRespectDnu.empty() && !_uuidOverrideDnu.empty(); }
  bool consent() const { return _dnuEnabled; }
  // As in ClientVerdict.
  std::int32_t dnuType() const { return _dnuType; }
  void setDNUType(std::int32_t value) { _dnuType = value; }
  // If it is not 0, an internal build posts under the device's own identifier.
  void setExtrasOnInternal(std::int32_t value) { _extrasOnInternal = value; }
  // From now on posts use the identifier of this client and service. False if it cannot be read.
  bool takeCustomClientID(const std::optional<std::string>& clientName,
                          const std::optional<std::string>& serviceName);

  // Reads the identifiers again; that of a client and service has to be taken again. Those that cannot be
  // read at the moment stay.
  void renewIdentifiers();
  void rereadConsent();

  const std::string& clientIdentifier(const DeviceFacts& device) const;
  // Whether a readable copy of a post may be logged.
  bool loggingAllowed() const;

 private:
  std::optional<std::string> getPersistentIdentifierForCustomClientIDSuffix(
      const std::optional<std::string>& clientName, const std::optional<std::string>& serviceName) const;

  // Constant after construction.
  platform::Preferences& _preferences;
  config::ProcessSettings& _settings;
  const support::Veltra& _library;
  const bool _forceEventLogging;

  bool _dnuEnabled;
  std::string _uuidRespectDnu;
  std::string _uuidOverrideDnu;
  std::int32_t _dnuType = 0;
  std::int32_t _extrasOnInternal = 0;
  std::optional<std::string> _uuidCustom;
};

}  // namespace veltrad::backends
