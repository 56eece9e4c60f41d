// Under which identifier a back end posts, and what the user's consent allows. Its owner's thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace veltrad::config {
class ProcessSettings;
}  // namespace veltrad::config

namespace veltrad::platform {
class Preferences;
}  // namespace veltrad::platform

namespace veltrad::support {
class Veltra;
}  // namespace veltrad::support

namespace veltrad::backends {

struct DeviceFacts;

class PostIdentity {
 public:
  // Where it learns what it needs; outlives it.
  struct Sources {
    platform::Preferences& preferences;
    const support::Veltra& library;
    config::ProcessSettings& settings;
  };
  explicit PostIdentity(const Sources& sources);

  // False: the device's identifiers could not be read.
  bool known() const { return !_uuidRespectDnu.empty() && !_uuidOverrideDnu.empty(); }
  bool consent() const { return _dnuEnabled; }
  // 0 consent respected; overridden: 1 without consent, 2 with it.
  std::int32_t dnuType() const { return _dnuType; }
  void setDNUType(std::int32_t value) { _dnuType = value; }
  // Other than 0: an internal build posts under the device's own identifier.
  void setExtrasOnInternal(std::int32_t value) { _extrasOnInternal = value; }
  // From now on under the identifier of this client and service; false: it cannot be read, and another would
  // be no better than a wrong one.
  bool takeCustomClientID(const std::optional<std::string>& clientName,
                          const std::optional<std::string>& serviceName);

  const std::string& clientIdentifier(const DeviceFacts& device) const;
  // Whether a readable copy of a post may be made.
  bool loggingAllowed() const;

 private:
  std::optional<std::string> getPersistentIdentifierForCustomClientIDSuffix(
      const std::optional<std::string>& clientName, const std::optional<std::string>& serviceName) const;

  // Constant after construction.
  platform::Preferences& _preferences;
  config::ProcessSettings& _settings;
  const bool _dnuEnabled;
  const bool _forceEventLogging;
  const std::string _uuidRespectDnu;
  const std::string _uuidOverrideDnu;

  std::int32_t _dnuType = 0;
  std::int32_t _extrasOnInternal = 0;
  std::optional<std::string> _uuidCustom;
};

}  // namespace veltrad::backends
