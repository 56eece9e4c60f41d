// What the daemon says about the device that it runs on. Any thread.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"

namespace veltrad::platform {
class DeviceProperties;
}  // namespace veltrad::platform

namespace veltrad::support {

// Asks the device property service under fixed keys. Nothing is cached but whether the build is an internal
// one. What the service cannot say for now is nothing, and is not remembered. The service must outlive it.
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

  // False only for another type than this, or none: what cannot be read just now may be it.
  bool mayHaveProductType(std::string_view type);

  // True when the release type is exactly "Internal". Decided when it can first be read, for the life of this
  // object; until then false, or nothing.
  bool isInternalBuild() { return internalBuild().value_or(false); }
  std::optional<bool> internalBuild();

 private:
  std::optional<std::string> value(std::string_view key);

  // Constant after construction.
  platform::DeviceProperties& _properties;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};  // the first answer is kept
  std::optional<bool> _internalBuild GUARDED_BY(_mutex);
};

}  // namespace veltrad::support
