// The device property service: facts about this device by key. Any thread; nothing is cached.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "base/value.h"
#include "platform/machine_facts.h"

namespace veltrad::platform {

class FileStore;
class Root;

class DeviceProperties {
 public:
  virtual ~DeviceProperties() = default;
  // Keys: "ProductVersion", "BuildVersion", "ProductType", "DeviceName", "HWModelStr", "SerialNumber",
  // "UniqueDeviceID", "ReleaseType". Nothing where there is no value.
  virtual std::optional<std::string> value(std::string_view key) = 0;
};

// device.plist first (an empty text there: no value, and the machine is not asked), then what the machine
// says: os-release, DMI or device tree, chassis. "UniqueDeviceID" is 40 hexadecimal digits derived one-way
// from the machine id. The machine's files are always the host's, not under the root. An unreadable or
// malformed device.plist is one error line a change, and as if it were not there.
class MachineProperties final : public DeviceProperties {
 public:
  MachineProperties(FileStore& files, std::string devicePropertyListPath);
  std::optional<std::string> value(std::string_view key) override;

 private:
  std::optional<std::string> fromMachine(std::string_view key) const;
  Dictionary configured();
  void complainOnce(const std::string& why);

  FileStore& _files;
  const std::string _path;
  const MachineFacts _machine;
  Mutex _mutex{LockRank::leaf};
  // Of the file that the last error line was about.
  std::optional<std::uint64_t> _complained GUARDED_BY(_mutex);
  bool _hasComplained GUARDED_BY(_mutex) = false;
};

}  // namespace veltrad::platform
