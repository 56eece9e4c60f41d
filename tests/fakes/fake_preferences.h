// Preferences in memory. Any thread.
#pragma once

#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "platform/preferences.h"

namespace veltrad {

class FakePreferences final : public platform::Preferences {
 public:
  std::optional<Value> value(std::string_view domain, std::string_view key) override {
    std::lock_guard lock(_mutex);
    const auto found = _values.find(name(domain, key));
    return found == _values.end() ? std::nullopt : std::optional(found->second);
  }
  bool setValue(std::string_view domain, std::string_view key, const Value& value) override {
    std::lock_guard lock(_mutex);
    _values.insert_or_assign(name(domain, key), value);
    return true;
  }
  std::string textOrStore(std::string_view domain, std::string_view key, std::string (*make)()) override {
    std::lock_guard lock(_mutex);
    Value& stored = _values.try_emplace(name(domain, key), "").first->second;
    if (const auto text = stored.toText(); !text || text->empty()) stored = make();
    return *stored.toText();
  }

  // In the domain kVeltraPreferenceDomain.
  void set(std::string_view key, const Value& value) {
    setValue(platform::kVeltraPreferenceDomain, key, value);
  }
  void remove(std::string_view key) {
    std::lock_guard lock(_mutex);
    _values.erase(name(platform::kVeltraPreferenceDomain, key));
  }

 private:
  using Name = std::pair<std::string, std::string>;
  static Name name(std::string_view domain, std::string_view key) {
    return {std::string(domain), std::string(key)};
  }

  std::mutex _mutex;
  std::map<Name, Value> _values;
};

}  // namespace veltrad
