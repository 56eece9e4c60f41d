// SPDX-License-Identifier: Apache-2.0
// Reads device properties by their keys.
#include "support/device_identity.h"

#include <cstring>

#include "platform/device_properties.h"

namespace veltrad::support {

void DeviceIdentity::copyUniqueDeviceID(char* buffer, std::size_t size) {
  const std::optional<std::string> id = value("UniqueDeviceID");
  if (!id || id->size() >= size) return;
  std::memcpy(buffer, id->c_str(), id->size() + 1);
  buffer[size - 1] = '\0';
}

std::optional<DeviceIdentity::NameAndType> DeviceIdentity::nameAndType() {
  auto name = _properties.value("DeviceName");
  auto type = _properties.value("ProductType");
  if (!name || !type) return std::nullopt;
  return NameAndType{std::move(name).value(), std::move(type).value()};
}

bool DeviceIdentity::mayHaveProductType(std::string_view type) {
  const auto known = _properties.value("ProductType");
  return !known || known.value() == type;
}

std::optional<bool> DeviceIdentity::internalBuild() {
  {
    const Lock held(_mutex);
    if (_internalBuild) return _internalBuild;
  }
  const auto type = _properties.value("ReleaseType");
  if (!type) return std::nullopt;
  const Lock held(_mutex);
  if (!_internalBuild) _internalBuild = type.value() == "Internal";
  return _internalBuild;
}

std::optional<std::string> DeviceIdentity::value(std::string_view key) {
  const auto answer = _properties.value(key);
  return answer ? answer.value() : std::nullopt;
}

}  // namespace veltrad::support
