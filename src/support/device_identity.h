// SPDX-License-Identifier: Apache-2.0
// Facts about the device that the daemon reports. Any thread may ask.
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

// Reads properties of the device property service, which must outlive it. Only the release type is cached.
// During a shortage, properties are absent.
class DeviceIdentity {
 public:
  explicit DeviceIdentity(platform::DeviceProperties& properties) : _properties(properties) {}

  std::optional<std::string> deviceProductVersion() { return value("ProductVersion"); }
  std::optional<std::string> deviceBuildVersion() { return value("BuildVersion"); }
  std::optional<std::string> deviceProductType() { return value("ProductType"); }
  std::optional<std::string> deviceName() { return value("DeviceName"); }
  std::optional<std::string> deviceHardwareModel() { return value("HWModelStr"); }
  std::optional<std::string> deviceSerialNumber() { return value("SerialNumber"); }

  // Absent if they cannot be read at the moment.
  struct NameAndType {
    std::optional<std::string> name;
    std::optional<std::string> productType;
  };
  std::optional<NameAndType> nameAndType();

  // Copies the unique ID and a NUL to `buffer`, which has `size` bytes. The buffer is unchanged if there is
  // no ID or it does not fit.
  void copyUniqueDeviceID(char* buffer, std::size_t size);

  // True if this is the product type, or if it cannot be read because of a shortage.
  bool mayHaveProductType(std::string_view type);

  // True if the release type is "Internal". Constant once it could be read; until then false, or absent.
  bool isInternalBuild() { return internalBuild().value_or(false); }
  std::optional<bool> internalBuild();

 private:
  std::optional<std::string> value(std::string_view key);

  platform::DeviceProperties& _properties;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::optional<bool> _internalBuild GUARDED_BY(_mutex);
};

}  // namespace veltrad::support
