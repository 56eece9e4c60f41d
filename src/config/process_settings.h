// The settings that hold for the life of the process. Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"

namespace veltrad::platform {
class FileStore;
class Preferences;
}  // namespace veltrad::platform

namespace veltrad::support {
class DeviceIdentity;
}  // namespace veltrad::support

namespace veltrad::config {

// Whether the address is that of a host which stands in for one that nobody has named.
bool isExampleStorebagURL(std::string_view url);

// Each setting is computed at the first call for it and kept: a preference that changes later takes effect at
// the next start. What cannot be computed for a shortage is nothing for now, and computed at a later call.
// `main` owns the one object of the process. What the constructor takes must outlive it.
class ProcessSettings {
 public:
  // `deploymentPath`: a property list with the texts "internalStorebagHost" and "publicStorebagHost", each a
  // host name with an optional port; example hosts stand in for what is missing.
  ProcessSettings(platform::Preferences& preferences, support::DeviceIdentity& device,
                  platform::FileStore& files, std::string deploymentPath);

  // 0 to 4; 0 names no section of a storebag.
  std::optional<std::uint32_t> currentEnvironment();
  // No slash at its end, unless the preference has one.
  std::optional<std::string> storebagServerURL();
  // What is wrong with the deployment file, as it was when the address was computed; empty: nothing is known.
  std::string deploymentProblem();
  bool isInternalBuild();

 private:
  // The type, and the one that was refused for it.
  struct Environment {
    std::uint32_t type;
    std::optional<std::uint32_t> refused;
  };
  std::optional<Environment> userDefaultsEnvironment();
  std::optional<std::string> computeStorebagServerURL();
  std::optional<std::string> storebagHost(bool internalBuild);
  void complain(std::string problem, const char* hosts);

  // Constant after construction.
  platform::Preferences& _preferences;
  support::DeviceIdentity& _device;
  platform::FileStore& _files;
  const std::string _deploymentPath;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};  // what was computed first is kept
  std::optional<std::uint32_t> _environment GUARDED_BY(_mutex);
  std::optional<std::string> _storebagServerURL GUARDED_BY(_mutex);
  std::string _deploymentProblem GUARDED_BY(_mutex);
};

}  // namespace veltrad::config
