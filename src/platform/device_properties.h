// The device property service: facts about this device by key. Any thread may ask.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "base/value.h"
#include "platform/file_store.h"

namespace veltrad::platform {

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

// Takes a property from device.plist (an empty text there means no value), else from the machine: os-release,
// DMI or device tree, chassis. "UniqueDeviceID" is 40 hexadecimal digits derived one-way from the machine id.
// The machine's files are the host's, not those under the root. An unreadable or malformed device.plist
// counts as missing, with one error line for each change of the file. Files are read at each call; during a
// shortage, the last content that was read is used.
class MachineProperties final : public DeviceProperties {
 public:
  MachineProperties(FileStore& files, std::string devicePropertyListPath);
  DeviceProperty value(std::string_view key) override;

 private:
  DeviceProperty fromMachine(std::string_view key);
  Result<Dictionary, FileFailure> configured();
  Result<Dictionary, FileFailure> readList();
  void complainOnce(const std::string& why);

  FileStore& _files;
  const std::string _path;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  // The last content and facts read, for use during a shortage.
  std::optional<Dictionary> _lastList GUARDED_BY(_mutex);
  std::map<std::string, std::optional<std::string>, std::less<>> _lastFacts GUARDED_BY(_mutex);
  // The stamp of the file that the last error line was about.
  FileStamp _complained GUARDED_BY(_mutex);
  bool _hasComplained GUARDED_BY(_mutex) = false;
};

}  // namespace veltrad::platform
