// SPDX-License-Identifier: Apache-2.0
// Settings that are constant for the life of the process. Any thread may ask.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

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

// Whether the host of the address is the built-in placeholder.
bool isExampleStorebagURL(std::string_view url);

// Each setting is computed at its first call and kept: a preference that changes later takes effect at the
// next start. During a shortage a setting is absent, and a later call computes it. The constructor's
// arguments must outlive it.
class ProcessSettings {
 public:
  // `deploymentPath`: of either form; the file holds the texts "internalStorebagHost" and
  // "publicStorebagHost", each a host name with an optional port; example hosts stand in for what is missing.
  ProcessSettings(platform::Preferences& preferences, support::DeviceIdentity& device,
                  platform::FileStore& files, const std::string& deploymentPath);

  // 0 to 4; 0 names no section of a storebag.
  std::optional<std::uint32_t> currentEnvironment();
  // Without a slash at the end, unless the preference has one.
  std::optional<std::string> storebagServerURL();
  // Reads the deployment file again, if the address comes from there; for a broken file it stays as it is.
  void readDeploymentAgain();
  // The problem of the deployment file when the address was computed; empty if there is none.
  std::string deploymentProblem();

 private:
  // The type, and the invalid one that it replaces.
  struct Environment {
    std::uint32_t type;
    std::optional<std::uint32_t> refused;
  };
  std::optional<Environment> userDefaultsEnvironment();
  std::optional<std::string> deployedStorebagServerURL();
  std::optional<std::string> storebagHost(bool internalBuild);
  void complain(std::string problem, const char* hosts);

  // Constant after construction.
  platform::Preferences& _preferences;
  support::DeviceIdentity& _device;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::optional<std::uint32_t> _environment GUARDED_BY(_mutex);
  std::optional<std::string> _storebagServerURL GUARDED_BY(_mutex);
  bool _fromDeployment GUARDED_BY(_mutex) = false;  // there was no preference at the first call
  platform::LocalSettings _deployment GUARDED_BY(_mutex);
  std::string _deploymentProblem GUARDED_BY(_mutex);
};

}  // namespace veltrad::config
