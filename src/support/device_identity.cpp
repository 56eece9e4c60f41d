// The fixed keys of the device property service. Any thread.
#include "support/device_identity.h"

#include <cstring>

#include "platform/device_properties.h"

namespace veltrad {

std::optional<std::string> DeviceIdentity::deviceProductVersion() {
  return _properties.value("ProductVersion");
}
std::optional<std::string> DeviceIdentity::deviceBuildVersion() {
  return _properties.value("BuildVersion");
}
std::optional<std::string> DeviceIdentity::deviceProductType() {
  return _properties.value("ProductType");
}
std::optional<std::string> DeviceIdentity::deviceName() {
  return _properties.value("DeviceName");
}
std::optional<std::string> DeviceIdentity::deviceHardwareModel() {
  return _properties.value("HWModelStr");
}
std::optional<std::string> DeviceIdentity::deviceSerialNumber() {
  return _properties.value("SerialNumber");
}

void DeviceIdentity::copyUniqueDeviceID(char* buffer, std::size_t size) {
  const std::optional<std::string> id = _properties.value("UniqueDeviceID");
  if (!id || id->size() >= size) return;
  std::memcpy(buffer, id->c_str(), id->size() + 1);
  buffer[size - 1] = '\0';
}

bool DeviceIdentity::isInternalBuild() {
  std::call_once(_internalBuildOnce,
                 [this] { _internalBuild = _properties.value("ReleaseType") == "Internal"; });
  return _internalBuild;
}

}  // namespace veltrad
