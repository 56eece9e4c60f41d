// What the daemon says about the device that it runs on. Any thread.
#pragma once

#include <cstddef>
#include <mutex>
#include <optional>
#include <string>

namespace veltrad {

namespace platform {
class DeviceProperties;
}

// Asks the device property service under fixed keys. Nothing is cached but whether the build is an internal
// one. The service must outlive it.
class DeviceIdentity {
 public:
  explicit DeviceIdentity(platform::DeviceProperties& properties) : _properties(properties) {}

  // Each asks the service again; nothing where it has no value.
  std::optional<std::string> deviceProductVersion();
  std::optional<std::string> deviceBuildVersion();
  std::optional<std::string> deviceProductType();
  std::optional<std::string> deviceName();
  std::optional<std::string> deviceHardwareModel();
  std::optional<std::string> deviceSerialNumber();

  // The unique id with its terminating NUL into `buffer` of `size` bytes (callers have 41). The buffer stays
  // as it is when there is no id, or none that fits.
  void copyUniqueDeviceID(char* buffer, std::size_t size);

  // True when the release type is exactly "Internal". Decided at the first call, for the life of this object.
  bool isInternalBuild();

 private:
  // Constant after construction.
  platform::DeviceProperties& _properties;

  // Written once under _internalBuildOnce, read without a lock afterwards.
  std::once_flag _internalBuildOnce;
  bool _internalBuild = false;
};

}  // namespace veltrad
