// SPDX-License-Identifier: Apache-2.0
// The input of an evaluation of a storebag: a session, its device and user, and its messages.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::storebag {

// What is wrong with something that people write; nothing: it was taken.
using Fault = std::optional<std::string>;

struct GivenMessage {
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::int32_t flag = 0;
  std::optional<Dictionary> payload;
};

// Missing values are those of a device in the release environment that is sampled in and has consent. Its 14
// fields are the options of explain.
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
  // The content of policy.json; absent if there are no limits.
  std::optional<Dictionary> policy;
  std::vector<GivenMessage> messages;

  void setUserInfo(std::string key, Value value);
  // These take KEY=VALUE; the section or number of an environment; the country of a locale, "US" or "419" in
  // letters of any case; a sampling factor from 0 to 1, or NAME=X of one back end.
  Fault takeUserInfo(const std::string& text);
  Fault takeEnvironment(const std::string& name);
  Fault takeCountry(const std::string& code);
  Fault takeDraw(const std::string& text);
  // An empty name is that of all back ends.
  Fault takeDraw(const std::string& backend, const Value& factor);
};

// Moves what was read into a field; the error is the fault.
template <typename T, typename Field>
Fault taken(Result<T, std::string> read, Field& field) {
  if (!read) return read.error();
  field = std::move(read).value();
  return std::nullopt;
}

// Names the one that is not known, and those that are.
std::string unknownBackend(const std::string& name);

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
