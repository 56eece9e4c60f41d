// The settings that hold for the life of the process. Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "base/mutex.h"
#include "platform/local_settings.h"

namespace veltrad::platform {
class FileStore;
class Preferences;
}  // namespace veltrad::platform

namespace veltrad::support {
class DeviceIdentity;
}  // namespace veltrad::support

namespace veltrad::config {

// Each setting is computed at the first call for it and kept: a preference that changes later takes effect at
// the next start. What cannot be computed for a shortage is nothing for now, and computed at a later call.
// `main` owns the one object of the process. What the constructor takes must outlive it.
class ProcessSettings {
 public:
  // `deploymentPath`: of either form; the file holds the texts "internalStorebagHost" and
  // "publicStorebagHost", each a host name with an optional port; example hosts stand in for what is missing.
  ProcessSettings(platform::Preferences& preferences, support::DeviceIdentity& device,
                  platform::FileStore& files, const std::string& deploymentPath);

  // 0 to 4; 0 names no section of a storebag.
  std::optional<std::uint32_t> currentEnvironment();
  // No slash at its end, unless the preference has one.
  std::optional<std::string> storebagServerURL();
  bool isInternalBuild();
  // Reads the deployment file again, if the address comes from there; for a broken file it stays as it is.
  void readDeploymentAgain();

 private:
  // The type, and the one that was refused for it.
  struct Environment {
    std::uint32_t type;
    std::optional<std::uint32_t> refused;
  };
  std::optional<Environment> userDefaultsEnvironment();
  std::optional<std::string> deployedStorebagServerURL();
  std::optional<std::string> storebagHost(bool internalBuild);

  // Constant after construction.
  platform::Preferences& _preferences;
  support::DeviceIdentity& _device;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};  // what was computed first is kept
  std::optional<std::uint32_t> _environment GUARDED_BY(_mutex);
  std::optional<std::string> _storebagServerURL GUARDED_BY(_mutex);
  bool _fromDeployment GUARDED_BY(_mutex) = false;  // there was no preference at the first call
  platform::LocalSettings _deployment GUARDED_BY(_mutex);
};

}  // namespace veltrad::config
