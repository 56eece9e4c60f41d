// SPDX-License-Identifier: Apache-2.0
// The device property service: facts about this device by key. Any thread may ask.
#pragma once

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "base/value.h"
#include "platform/file_store.h"
#include "platform/local_settings.h"

namespace veltrad::platform {

class DeviceSecret;
class Preferences;

// When the owner of the device has reset its identifiers: a date.
inline constexpr const char* kIdentifiersReset = "IdentifiersReset";

// Absent if there is no value. A failure is a shortage: the value cannot be determined now, and the failure
// must not be cached.
using DeviceProperty = Result<std::optional<std::string>, FileFailure>;

class DeviceProperties {
 public:
  virtual ~DeviceProperties() = default;
  // Keys: "ProductVersion", "BuildVersion", "ProductType", "DeviceName", "HWModelStr", "SerialNumber",
  // "UniqueDeviceID", "ReleaseType".
  virtual DeviceProperty value(std::string_view key) = 0;
};

// device.plist or .json first (an empty text there: no value, and the machine is not asked), then what the
// machine says: os-release, DMI or device tree, chassis. "UniqueDeviceID" is 40 hexadecimal digits derived
// one-way from the machine id. The machine's files are always the host's, not under the root. An unreadable
// or malformed one is one error line a change, and as if it were not there. The machine's files are read at
// each question; what cannot be read because of a shortage is as it was when it last could be.
class MachineProperties final : public DeviceProperties {
 public:
  // `devicePath`: of either form.
  MachineProperties(FileStore& files, const std::string& devicePath);
  // From now on, "UniqueDeviceID" of the machine is also derived from the secret if the preference
  // kIdentifiersReset is set. To be called before other threads ask; the arguments must outlive it.
  void heedReset(Preferences& preferences, DeviceSecret& secret);
  DeviceProperty value(std::string_view key) override;
  // Whether the configured list has the key. False also during a shortage.
  bool configures(std::string_view key);
  // Reads the configured list now, whether it has changed or not.
  void readAgain();

 private:
  DeviceProperty fromMachine(std::string_view key);
  // The identifier that replaces the machine's after a reset by the owner.
  DeviceProperty sinceReset(const DeviceProperty& machines);
  Result<Dictionary, FileFailure> configured();
  static void complain(const LocalContent& content);

  FileStore& _files;
  Preferences* _preferences = nullptr;
  DeviceSecret* _secret = nullptr;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  LocalSettings _file GUARDED_BY(_mutex);
  // The content as last read, used during a shortage.
  std::shared_ptr<const LocalContent> _content GUARDED_BY(_mutex);  // null before the first reading
  Dictionary _list GUARDED_BY(_mutex);
  std::map<std::string, std::optional<std::string>, std::less<>> _lastFacts GUARDED_BY(_mutex);
};

}  // namespace veltrad::platform
