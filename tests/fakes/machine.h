// SPDX-License-Identifier: Apache-2.0
// The properties of a machine as the test sets them: time, locale, random numbers, device, preferences. Any
// thread; locale and random numbers must be set before threads start.
#pragma once

#include <atomic>
#include <cstdint>
#include <map>
#include <mutex>
#include <new>
#include <optional>
#include <string>
#include <string_view>

#include "base/property_list.h"
#include "fakes/fake_file_store.h"
#include "platform/clock.h"
#include "platform/device_properties.h"
#include "platform/locale.h"
#include "platform/preferences.h"
#include "platform/random.h"

namespace veltrad {

// Stands still until the test moves it.
class FakeClock final : public platform::Clock {
 public:
  explicit FakeClock(platform::TimeValue time = {1'700'000'000, 250'000})
      : _microseconds(time.seconds * 1'000'000 + time.microseconds) {}
  platform::TimeValue now() const override {
    const std::int64_t time = _microseconds;
    return {time / 1'000'000, static_cast<std::int32_t>(time % 1'000'000)};
  }
  void advance(double seconds) { _microseconds += static_cast<std::int64_t>(seconds * 1'000'000); }

 private:
  std::atomic<std::int64_t> _microseconds;
};

struct FakeLocale final : platform::Locale {
  std::optional<std::string> countryCode() override { return "DE"; }
  int timeZoneOffset() override { return 3'600; }
};

struct FakeRandom final : platform::Random {
  double uniform() override { return draw; }
  double draw = 0.5;
};

// Begins as a customer's machine with every fact but "ReleaseType".
class FakeDeviceProperties final : public platform::DeviceProperties {
 public:
  platform::DeviceProperty value(std::string_view key) override {
    std::lock_guard lock(_mutex);
    if (_lacksMemory.exchange(false)) throw std::bad_alloc();
    if (_short) return Failure{platform::FileFailure{platform::FileFailure::Kind::shortage, "no descriptor"}};
    const auto found = _values.find(key);
    return found == _values.end() ? std::nullopt : std::optional(found->second);
  }
  void set(const std::string& key, const std::string& value) {
    std::lock_guard lock(_mutex);
    _values[key] = value;
  }
  void runShort(bool isShort) { _short = isShort; }
  // The next value cannot be told for want of memory.
  void lackMemory() { _lacksMemory = true; }

 private:
  std::mutex _mutex;
  std::atomic<bool> _short = false;
  std::atomic<bool> _lacksMemory = false;
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

// The real ones over files in memory.
class FakePreferences {
 public:
  operator platform::Preferences&() { return _preferences; }
  // In the domain kVeltraPreferenceDomain.
  void set(std::string_view key, const Value& value) {
    const auto bytes = _files.read(kPath, 1u << 20);
    const auto list = parseBinaryPropertyList(bytes ? bytes.value() : "");
    Dictionary all = list ? *list.value().asDictionary() : Dictionary();
    all.set(std::string(key), value);
    _files.put(kPath, writeBinaryPropertyList(all));
  }
  void clear() { _files.remove(kPath); }
  void runShort(bool isShort) { _files.runShort(isShort); }

 private:
  static constexpr const char* kPath = "/preferences/com.florn.veltra.plist";
  FakeFileStore _files;
  platform::FilePreferences _preferences{_files, "/preferences"};
};

}  // namespace veltrad
