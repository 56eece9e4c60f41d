// The device property service: facts about this device by key. Any thread.
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

// Nothing where there is no value. A failure is a shortage: for now nobody can say, and it is no answer that
// may be remembered.
using DeviceProperty = Result<std::optional<std::string>, FileFailure>;

class DeviceProperties {
 public:
  virtual ~DeviceProperties() = default;
  // Keys: "ProductVersion", "BuildVersion", "ProductType", "DeviceName", "HWModelStr", "SerialNumber",
  // "UniqueDeviceID", "ReleaseType".
  virtual DeviceProperty value(std::string_view key) = 0;
};

// device.plist first (an empty text there: no value, and the machine is not asked), then what the machine
// says: os-release, DMI or device tree, chassis. "UniqueDeviceID" is 40 hexadecimal digits derived one-way
// from the machine id. The machine's files are always the host's, not under the root. An unreadable or
// malformed device.plist is one error line a change, and as if it were not there. Files are read at each
// question; one that cannot be read for a shortage is as it was when it last could be.
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
  // As last read; what stands in during a shortage.
  std::optional<Dictionary> _lastList GUARDED_BY(_mutex);
  std::map<std::string, std::optional<std::string>, std::less<>> _lastFacts GUARDED_BY(_mutex);
  // Of the file that the last error line was about.
  FileStamp _complained GUARDED_BY(_mutex);
  bool _hasComplained GUARDED_BY(_mutex) = false;
};

}  // namespace veltrad::platform
