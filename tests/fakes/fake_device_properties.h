// A device whose facts the test sets; it begins as a customer's machine with every fact but "ReleaseType".
// Any thread.
#pragma once

#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "platform/device_properties.h"

namespace veltrad {

class FakeDeviceProperties final : public platform::DeviceProperties {
 public:
  std::optional<std::string> value(std::string_view key) override {
    std::lock_guard lock(_mutex);
    const auto found = _values.find(key);
    return found == _values.end() ? std::nullopt : std::optional(found->second);
  }
  void remove(const std::string& key) {
    std::lock_guard lock(_mutex);
    _values.erase(key);
  }
  void set(const std::string& key, const std::string& value) {
    std::lock_guard lock(_mutex);
    _values[key] = value;
  }

 private:
  std::mutex _mutex;
  std::map<std::string, std::string, std::less<>> _values{
      {"ProductVersion", "12"},
      {"BuildVersion", "12A301"},
      {"ProductType", "Workbench 3"},
      {"DeviceName", "Desktop"},
      {"HWModelStr", "WB3-B"},
      {"SerialNumber", "S0123456789"},
      {"UniqueDeviceID", "00112233445566778899aabbccddeeff00112233"},
  };
};

}  // namespace veltrad
