// The settings that hold for the life of the process. Any thread.
#pragma once

#include <cstdint>
#include <mutex>
#include <optional>
#include <string>

namespace veltrad {

class DeviceIdentity;
namespace platform {
class FileStore;
class Preferences;
}  // namespace platform

// Each setting is computed at the first call for it and kept: a preference that changes later takes effect at
// the next start. `main` owns the one object of the process. What the constructor takes must outlive it.
class ProcessSettings {
 public:
  // `deploymentPath`: a property list with the texts "internalStorebagHost" and "publicStorebagHost", each a
  // host name with an optional port; example hosts stand in for what is missing.
  ProcessSettings(platform::Preferences& preferences, DeviceIdentity& device, platform::FileStore& files,
                  std::string deploymentPath);

  // 0 to 4; 0 names no section of a storebag.
  std::uint32_t currentEnvironment();
  // No slash at its end, unless the preference has one.
  std::string storebagServerURL();
  bool isInternalBuild();

 private:
  std::uint32_t userDefaultsEnvironment();
  std::string storebagHost(bool internalBuild);

  // Constant after construction.
  platform::Preferences& _preferences;
  DeviceIdentity& _device;
  platform::FileStore& _files;
  const std::string _deploymentPath;

  // Written once under the flag beside it, read without a lock afterwards.
  std::once_flag _environmentOnce;
  std::uint32_t _environment = 0;
  std::once_flag _storebagServerURLOnce;
  std::string _storebagServerURL;
};

}  // namespace veltrad
