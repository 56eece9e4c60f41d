// The configured property list first, then the machine. Any thread; files are read at each question.
#include "platform/device_properties.h"

#include "base/property_list.h"
#include "platform/file_store.h"
#include "platform/log.h"

namespace veltrad::platform {

MachineProperties::MachineProperties(FileStore& files, std::string devicePropertyListPath)
    : _files(files), _path(std::move(devicePropertyListPath)), _machine(files) {}

std::optional<std::string> MachineProperties::value(std::string_view key) {
  const Dictionary list = configured();
  const std::string* text = list.string(key);
  if (!text) return fromMachine(key);
  return text->empty() ? std::nullopt : std::optional(*text);
}

Dictionary MachineProperties::configured() {
  const auto bytes = _files.read(_path);
  if (!bytes) {
    if (bytes.error().kind != FileFailure::Kind::notFound) complainOnce(bytes.error().description);
    return {};
  }
  const auto list = parsePropertyList(bytes.value());
  const Dictionary* dictionary = list ? list.value().asDictionary() : nullptr;
  if (dictionary) return *dictionary;
  complainOnce(_path + ": " +
               (list ? "the outermost value is not a dictionary of texts" : list.error().detail));
  return {};
}

void MachineProperties::complainOnce(const std::string& why) {
  const auto stamp = _files.stamp(_path);
  {
    Lock lock(_mutex);
    if (_hasComplained && _complained == stamp) return;
    _hasComplained = true;
    _complained = stamp;
  }
  logError("Device properties could not be read, the machine is asked: %s", why.c_str());
}

// No machine says "ReleaseType".
std::optional<std::string> MachineProperties::fromMachine(std::string_view key) const {
  if (key == "ProductVersion") return _machine.productVersion();
  if (key == "BuildVersion") return _machine.buildVersion();
  if (key == "ProductType") return _machine.productType();
  if (key == "DeviceName") return _machine.deviceName();
  if (key == "HWModelStr") return _machine.hardwareModel();
  if (key == "SerialNumber") return _machine.serialNumber();
  if (key == "UniqueDeviceID") return _machine.uniqueDeviceID();
  return std::nullopt;
}

}  // namespace veltrad::platform
