// SPDX-License-Identifier: Apache-2.0
// Reads the input of an evaluation.
#include "storebag/given.h"

#include <fmt/format.h>

#include <algorithm>
#include <utility>

#include "config/client_types.h"
#include "config/policy.h"
#include "config/storebag_content.h"
#include "formats/json.h"
#include "platform/local_settings.h"
#include "platform/locale.h"
#include "storebag/document.h"
#include "storebag/lint_sink.h"
#include "storebag/recording.h"
#include "storebag/spelling.h"
#include "tools/key_value.h"
#include "wire/constants.h"

namespace veltrad::storebag {
namespace {

constexpr std::int64_t kMostMessageCode = 65'535;

std::string pathBeside(const std::string& directory, const std::string& path) {
  return path.starts_with('/') || directory.empty() ? path : directory + "/" + path;
}

Failure<std::string> expected(const std::string& key, const Value& value, const char* what) {
  return Failure{fmt::format("\"{}\" is {}: expected {}", key, shownValue(value), what)};
}

std::optional<std::int64_t> wholeNumber(const Value& value, std::int64_t least, std::int64_t most) {
  const bool isInteger =
      value.type() == Value::Type::signedInteger || value.type() == Value::Type::unsignedInteger;
  const auto number = isInteger ? value.toInt64() : std::nullopt;
  return number && *number >= least && *number <= most ? number : std::nullopt;
}

Result<Dictionary, std::string> checkedDevice(Dictionary device, const std::string& where) {
  static const std::vector<std::string> kKnown{"ProductVersion", "BuildVersion", "ProductType",
                                               "DeviceName",     "HWModelStr",   "SerialNumber",
                                               "UniqueDeviceID", "ReleaseType"};
  for (const auto& [key, value] : device) {
    if (std::find(kKnown.begin(), kKnown.end(), key) == kKnown.end())
      return Failure{fmt::format("{}: unknown key {}{}", where, quoted(key), mostLike(key, kKnown))};
    if (!value.asString()) return Failure{where + ": " + expected(key, value, "a text").error};
  }
  return device;
}

Result<Dictionary, std::string> checkedPolicy(platform::LocalContent content) {
  content.kind = platform::LocalContent::Kind::good;
  std::string error;
  if (!config::Policy::of(content, error)) return Failure{error};
  return *content.value.asDictionary();
}

// An object, or the path of a file that holds one.
Result<Dictionary, std::string> deviceIn(const Value& value, const std::string& directory) {
  if (const Dictionary* device = value.asDictionary()) return checkedDevice(*device, "\"device\"");
  const std::string* path = value.asString();
  if (path == nullptr) return expected("device", value, "an object or the path of a file");
  return readDevice(pathBeside(directory, *path));
}

Result<Dictionary, std::string> policyIn(const Value& value, const std::string& directory) {
  const std::string* path = value.asString();
  if (path != nullptr) return readPolicy(pathBeside(directory, *path));
  if (value.asDictionary() == nullptr) return expected("policy", value, "an object or the path of a file");
  platform::LocalContent content;
  content.value = value;
  content.path = "\"policy\"";
  return checkedPolicy(std::move(content));
}

// A key of "given" and its value. Paths are relative to `directory`.
struct Reading {
  const char* key;
  const Value& value;
  const std::string& directory;
  Given& given;

  Fault expected(const char* what) const { return storebag::expected(key, value, what).error; }
  Fault within(const Fault& fault) const {
    return fault ? std::optional(fmt::format("\"{}\": {}", key, *fault)) : std::nullopt;
  }
  std::string text() const { return value.toText().value_or(""); }
};

Fault readClientType(const Reading& read) {
  const auto type = wholeNumber(read.value, 0, config::kVeltraClientTypeCount - 1);
  if (!type) return read.expected("an integer from 0 to 17");
  read.given.clientType = static_cast<std::int32_t>(*type);
  return std::nullopt;
}

Fault readName(const Reading& read, const char* name) {
  if (!read.value.asString()) return read.expected("a text");
  read.given.setUserInfo(name, read.value);
  return std::nullopt;
}

Fault readUserInfo(const Reading& read) {
  const Dictionary* info = read.value.asDictionary();
  if (info == nullptr) return read.expected("an object");
  for (const auto& [key, item] : *info) read.given.setUserInfo(key, item);
  return std::nullopt;
}

Fault readFlag(const Reading& read, bool& flag) {
  if (!read.value.isBoolean()) return read.expected("true or false");
  flag = *read.value.toBoolean();
  return std::nullopt;
}

Fault readDraw(const Reading& read) {
  const Dictionary* draws = read.value.asDictionary();
  if (draws == nullptr) return read.within(read.given.takeDraw("", read.value));
  Fault fault;
  for (const auto& [name, draw] : *draws)
    if (!fault) fault = read.within(read.given.takeDraw(name, draw));
  return fault;
}

Fault readMessagesOf(const Reading& read) {
  if (const std::string* path = read.value.asString())
    return taken(readMessages(pathBeside(read.directory, *path)), read.given.messages);
  const Array* array = read.value.asArray();
  if (array == nullptr) return read.expected("an array of objects or the path of a file");
  for (const Value& item : *array) {
    if (const Fault fault = taken(messageOf(item), read.given.messages.emplace_back()))
      return read.within(fault);
  }
  return std::nullopt;
}

struct GivenKey {
  const char* name;
  Fault (*read)(const Reading&);
};
constexpr GivenKey kKeys[] = {
    {"clientType", readClientType},
    {"environment", [](const Reading& read) { return read.within(read.given.takeEnvironment(read.text())); }},
    {"client", [](const Reading& read) { return readName(read, wire::kVeltraUserInfoClientName); }},
    {"service", [](const Reading& read) { return readName(read, wire::kVeltraUserInfoServiceName); }},
    {"userInfo", readUserInfo},
    {"requireUserInfo", [](const Reading& read) { return readFlag(read, read.given.requireUserInfo); }},
    {"batchEvents", [](const Reading& read) { return readFlag(read, read.given.batchEvents); }},
    {"country", [](const Reading& read) { return read.within(read.given.takeCountry(read.text())); }},
    {"consent", [](const Reading& read) { return readFlag(read, read.given.consent); }},
    {"device",
     [](const Reading& read) { return taken(deviceIn(read.value, read.directory), read.given.device); }},
    {"draw", readDraw},
    {"messages", readMessagesOf},
    {"policy",
     [](const Reading& read) { return taken(policyIn(read.value, read.directory), read.given.policy); }},
};

}  // namespace

void Given::setUserInfo(std::string key, Value value) {
  if (!userInfo) userInfo.emplace();
  userInfo->set(std::move(key), std::move(value));
}

Fault Given::takeUserInfo(const std::string& text) {
  auto entry = tools::parseKeyValue(text);
  if (!entry) return entry.error();
  setUserInfo(std::move(entry.value().first), std::move(entry.value().second));
  return std::nullopt;
}

Fault Given::takeEnvironment(const std::string& name) {
  std::vector<std::string> known;
  for (std::uint32_t number = 1; const char* section = config::sectionNameForEnvironment(number); ++number) {
    if (name == section || name == std::to_string(number)) {
      environment = number;
      return std::nullopt;
    }
    known.emplace_back(section);
  }
  return fmt::format("{} is no environment{}", quoted(name), mostLike(name, known));
}

Fault Given::takeCountry(const std::string& code) {
  country = platform::countryOfLocaleName("xx_" + code);
  if (country) return std::nullopt;
  return fmt::format("{} is no country: expected two letters like US, or three digits", quoted(code));
}

Fault Given::takeDraw(const std::string& text) {
  const std::size_t equals = text.find('=');
  const bool named = equals != std::string::npos;
  const std::string number = named ? text.substr(equals + 1) : text;
  const auto read = formats::parseJSON(number);
  return takeDraw(named ? text.substr(0, equals) : "", read ? read.value() : Value(number));
}

Fault Given::takeDraw(const std::string& backend, const Value& factor) {
  if (!backend.empty() && !config::StorebagSection::kKeys.find(backend)) return unknownBackend(backend);
  const auto number = factor.isNumber() ? factor.toDouble() : std::nullopt;
  if (!number || *number < 0 || *number > 1)
    return fmt::format("{} is no sampling factor: expected a number from 0 to 1", shownValue(factor));
  (backend.empty() ? draw : draws[backend]) = *number;
  return std::nullopt;
}

std::string unknownBackend(const std::string& name) {
  std::vector<std::string> known;
  for (const config::Key& key : config::StorebagSection::kKeys) known.emplace_back(key.name);
  return fmt::format("unknown back end {}{}", quoted(name), mostLike(name, known));
}

Result<GivenMessage, std::string> messageOf(const Value& value) {
  const Dictionary* message = value.asDictionary();
  if (message == nullptr) return Failure{shownValue(value) + " is no message: expected an object"};
  GivenMessage given;
  for (const auto& [key, number] : {std::pair(wire::kVeltraMessageParametersCategory, &given.category),
                                    std::pair(wire::kVeltraMessageParametersType, &given.type)}) {
    const Value* item = message->find(key);
    const auto code = item ? wholeNumber(*item, 0, kMostMessageCode) : std::nullopt;
    if (!code)
      return Failure{fmt::format("\"{}\" is {}: expected an integer from 0 to {}", key,
                                 item ? shownValue(*item) : "missing", kMostMessageCode)};
    *number = static_cast<std::uint16_t>(*code);
  }
  if (const Value* flag = message->find(wire::kVeltraMessageParametersFlag)) {
    const auto bits = wholeNumber(*flag, INT32_MIN, INT32_MAX);
    if (!bits) return expected(wire::kVeltraMessageParametersFlag, *flag, "an integer of 32 bits");
    given.flag = static_cast<std::int32_t>(*bits);
  }
  if (const Value* payload = message->find(wire::kVeltraMessageParametersPayload)) {
    if (!payload->asDictionary()) return expected("payload", *payload, "an object");
    given.payload = *payload->asDictionary();
  }
  return given;
}

Result<Dictionary, std::string> readDictionary(const std::string& file) {
  const auto document = readDocument(file);
  if (!document) return Failure{document.error().line()};
  const Dictionary* dictionary = document.value().content.asDictionary();
  if (dictionary == nullptr) return Failure{file + ":1:1: expected an object"};
  return *dictionary;
}

Result<Dictionary, std::string> readDevice(const std::string& file) {
  auto device = readDictionary(file);
  return device ? checkedDevice(std::move(device).value(), file) : device;
}

Result<Dictionary, std::string> readPolicy(const std::string& file) {
  auto document = readDocument(file);
  if (!document) return Failure{document.error().line()};
  platform::LocalContent content;
  content.path = file;
  content.value = std::move(document.value().content);
  content.bytes = std::move(document.value().bytes);
  return checkedPolicy(std::move(content));
}

Result<Given, std::string> givenOf(const Dictionary& dictionary, const std::string& directory) {
  Given given;
  std::vector<std::string> known;
  for (const GivenKey& key : kKeys) {
    known.emplace_back(key.name);
    const Value* value = dictionary.find(key.name);
    if (value == nullptr) continue;
    if (const Fault fault = key.read({key.name, *value, directory, given})) return Failure{*fault};
  }
  for (const auto& [name, value] : dictionary) {
    if (std::find(known.begin(), known.end(), name) != known.end()) continue;
    return Failure{fmt::format("unknown key {} in \"given\"{}", quoted(name), mostLike(name, known))};
  }
  return given;
}

}  // namespace veltrad::storebag
