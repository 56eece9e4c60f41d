// Device properties from device.plist, else from the machine.
#include "platform/device_properties.h"

#include "formats/property_list.h"
#include "platform/file_store.h"
#include "platform/log.h"
#include "platform/machine_facts.h"

namespace veltrad::platform {

namespace {

// No machine states "ReleaseType".
std::optional<std::string> factOf(MachineFacts& machine, std::string_view key) {
  if (key == "ProductVersion") return machine.productVersion();
  if (key == "BuildVersion") return machine.buildVersion();
  if (key == "ProductType") return machine.productType();
  if (key == "DeviceName") return machine.deviceName();
  if (key == "HWModelStr") return machine.hardwareModel();
  if (key == "SerialNumber") return machine.serialNumber();
  if (key == "UniqueDeviceID") return machine.uniqueDeviceID();
  return std::nullopt;
}

}  // namespace

MachineProperties::MachineProperties(FileStore& files, std::string devicePropertyListPath)
    : _files(files), _path(std::move(devicePropertyListPath)) {}

DeviceProperty MachineProperties::value(std::string_view key) {
  const auto list = configured();
  // The machine's value does not stand in: it may differ.
  if (!list) return Failure{list.error()};
  const std::string* text = list.value().string(key);
  if (!text) return fromMachine(key);
  return text->empty() ? std::nullopt : std::optional(*text);
}

Result<Dictionary, FileFailure> MachineProperties::configured() {
  auto list = readList();
  const Lock lock(_mutex);
  if (list) _lastList = list.value();
  if (!list && _lastList) return *_lastList;
  return list;
}

Result<Dictionary, FileFailure> MachineProperties::readList() {
  const auto bytes = _files.read(_path);
  if (!bytes) {
    if (bytes.error().passes()) return Failure{bytes.error()};
    if (bytes.error().kind != FileFailure::Kind::notFound) complainOnce(bytes.error().description);
    return Dictionary();
  }
  const auto list = formats::parsePropertyList(bytes.value());
  const Dictionary* dictionary = list ? list.value().asDictionary() : nullptr;
  if (dictionary) return *dictionary;
  complainOnce(_path + ": " +
               (list ? "the outermost value is not a dictionary of texts" : list.error().detail));
  return Dictionary();
}

void MachineProperties::complainOnce(const std::string& why) {
  const auto stamp = _files.stamp(_path);
  if (!stamp) return;  // the next call logs it
  {
    const Lock lock(_mutex);
    if (_hasComplained && _complained == stamp.value()) return;
    _hasComplained = true;
    _complained = stamp.value();
  }
  logError("Device properties could not be read, the machine is asked: %s", why.c_str());
}

DeviceProperty MachineProperties::fromMachine(std::string_view key) {
  MachineFacts machine(_files);
  auto fact = factOf(machine, key);
  const Lock lock(_mutex);
  if (!machine.shortage())
    return _lastFacts.insert_or_assign(std::string(key), std::move(fact)).first->second;
  const auto last = _lastFacts.find(key);
  if (last == _lastFacts.end()) return Failure{*machine.shortage()};
  return last->second;
}

}  // namespace veltrad::platform
