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
};

// The environment that a section is for: its name, or its number as text.
Result<std::uint32_t, std::string> environmentNamed(const std::string& name);
// {"category", "type", "flag", "payload"}; the error says what is wrong.
Result<GivenMessage, std::string> messageOf(const Value& message);
// The messages in lines of `veltractl watch --json --contents` or of `veltractl session`; others are passed
// over. The error names the line.
Result<std::vector<GivenMessage>, std::string> messagesIn(std::string_view lines);
// A file that holds one dictionary, as JSON with comments or a property list. The error names the file.
Result<Dictionary, std::string> readDictionary(const std::string& file);
// "given" of a case; paths in it are relative to `directory`. The error names the key.
Result<Given, std::string> givenOf(const Dictionary& given, const std::string& directory);

}  // namespace veltrad::storebag
