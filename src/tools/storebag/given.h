// SPDX-License-Identifier: Apache-2.0
// For whom a storebag is played: a session, its device and user, and its messages.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::storebag {

struct GivenMessage {
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::int32_t flag = 0;
  std::optional<Dictionary> payload;
};

// What is not given is as on a device in the release environment whose user has consented and which is
// sampled in. Its 14 fields are the options of explain.
struct Given {
  std::int32_t clientType = 0;
  std::uint32_t environment = 4;
  std::uint32_t sessionID = 0;
  std::uint16_t clientVersion = 0;
  std::optional<Dictionary> userInfo;
  bool requireUserInfo = false;
  bool batchEvents = false;
  std::optional<std::string> country;
  bool consent = true;
  // With the keys of device.plist.
  Dictionary device;
  double draw = 0;
  // By back end, instead of `draw`.
  std::map<std::string, double> draws;
  // What policy.json says; absent: no limits.
  std::optional<Dictionary> policy;
  std::vector<GivenMessage> messages;

  void setUserInfo(std::string key, Value value);
  // These take what people write, and return what is wrong with it: KEY=VALUE; the section or number of an
  // environment; the country of a locale, "US" or "419" in letters of any case; a sampling factor from 0 to
  // 1, or NAME=X of one back end.
  std::optional<std::string> takeUserInfo(const std::string& text);
  std::optional<std::string> takeEnvironment(const std::string& name);
  std::optional<std::string> takeCountry(const std::string& code);
  std::optional<std::string> takeDraw(const std::string& text);
  // An empty name is that of all back ends.
  std::optional<std::string> takeDraw(const std::string& backend, const Value& factor);
};

// {"category", "type", "flag", "payload"}; the error says what is wrong.
Result<GivenMessage, std::string> messageOf(const Value& message);
// A file that holds one dictionary, as JSON with comments or a property list. The error names the file.
Result<Dictionary, std::string> readDictionary(const std::string& file);
// The same for what device.plist and policy.json say; what the daemon would not take is an error.
Result<Dictionary, std::string> readDevice(const std::string& file);
Result<Dictionary, std::string> readPolicy(const std::string& file);
// "given" of a case; paths in it are relative to `directory`. The error names the key.
Result<Given, std::string> givenOf(const Dictionary& given, const std::string& directory);

}  // namespace veltrad::storebag
