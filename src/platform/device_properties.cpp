// SPDX-License-Identifier: Apache-2.0
// The configured list first, then the machine. Any thread; the machine's files are read at each question.
#include "platform/device_properties.h"

#include <openssl/evp.h>
#include <openssl/hmac.h>

#include <cstdlib>

#include "base/text.h"
#include "platform/device_secret.h"
#include "platform/file_store.h"
#include "platform/log.h"
#include "platform/machine_facts.h"
#include "platform/preferences.h"

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

MachineProperties::MachineProperties(FileStore& files, const std::string& devicePath)
    : _files(files), _file(files, devicePath) {}

DeviceProperty MachineProperties::value(std::string_view key) {
  const auto list = configured();
  // The machine's value is not used instead, because it may differ.
  if (!list) return Failure{list.error()};
  const std::string* text = list.value().string(key);
  if (!text) return key == "UniqueDeviceID" ? sinceReset(fromMachine(key)) : fromMachine(key);
  return text->empty() ? std::nullopt : std::optional(*text);
}

bool MachineProperties::configures(std::string_view key) {
  const auto list = configured();
  return list && list.value().string(key) != nullptr;
}

void MachineProperties::heedReset(Preferences& preferences, DeviceSecret& secret) {
  _preferences = &preferences;
  _secret = &secret;
}

DeviceProperty MachineProperties::sinceReset(const DeviceProperty& machines) {
  if (!_preferences || !machines || !machines.value()) return machines;
  const auto reset = _preferences->lookUp(kVeltraPreferenceDomain, kIdentifiersReset);
  if (!reset) return Failure{reset.error()};
  if (!reset.value()) return machines;
  const auto secret = _secret->bytes();
  if (!secret) return Failure{FileFailure{FileFailure::Kind::shortage, "the secret of this device"}};
  const std::string& text = *machines.value();
  unsigned char digest[EVP_MAX_MD_SIZE];
  if (HMAC(EVP_sha256(), secret->data(), static_cast<int>(secret->size()),
           reinterpret_cast<const unsigned char*>(text.data()), text.size(), digest, nullptr) == nullptr)
    std::abort();
  return std::optional(hex({reinterpret_cast<const char*>(digest), 20}));
}

void MachineProperties::readAgain() {
  {
    const Lock lock(_mutex);
    _file.readAgain();
  }
  static_cast<void>(configured());
}

Result<Dictionary, FileFailure> MachineProperties::configured() {
  std::shared_ptr<const LocalContent> fresh;
  Dictionary list;
  {
    const Lock lock(_mutex);
    const auto now = _file.content();
    if (!now && !_content) return Failure{now.error()};
    if (now && now.value() != _content) {
      fresh = now.value();
      const Dictionary* good =
          fresh->kind == LocalContent::Kind::good ? fresh->value.asDictionary() : nullptr;
      _list = good ? *good : Dictionary();
      _content = fresh;  // last, so that there is another attempt for want of memory
    }
    list = _list;
  }
  if (fresh) complain(*fresh);
  return list;
}

void MachineProperties::complain(const LocalContent& content) {
  if (content.warning) logWarning("Device properties: %s", content.warning->c_str());
  if (content.kind == LocalContent::Kind::absent) return;
  const bool good = content.kind == LocalContent::Kind::good;
  if (good && content.value.asDictionary()) return;
  const std::string why =
      good ? content.placeOf({}) + ": the outermost value is not a dictionary of texts" : content.error;
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
