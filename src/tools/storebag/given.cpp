// SPDX-License-Identifier: Apache-2.0
// Reads what a storebag is played with.
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
#include "storebag/words.h"
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

std::optional<std::string> readUserInfo(const Value& value, Given& given) {
  const Dictionary* info = value.asDictionary();
  if (info == nullptr) return expected("userInfo", value, "an object").error;
  for (const auto& [key, item] : *info) given.setUserInfo(key, item);
  return std::nullopt;
}

std::optional<std::string> inKey(const char* key, const std::optional<std::string>& fault) {
  return fault ? std::optional(fmt::format("\"{}\": {}", key, *fault)) : std::nullopt;
}

std::optional<std::string> readDraw(const Value& value, Given& given) {
  const Dictionary* draws = value.asDictionary();
  if (draws == nullptr) return inKey("draw", given.takeDraw("", value));
  std::optional<std::string> fault;
  for (const auto& [name, draw] : *draws)
    if (!fault) fault = inKey("draw", given.takeDraw(name, draw));
  return fault;
}

std::string mostLike(const std::string& name, const std::vector<std::string>& known) {
  const auto meant = closestName(name, known);
  return meant ? fmt::format(": did you mean {}?", quoted(*meant))
               : fmt::format(": expected one of {}", listed(known));
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

std::optional<std::string> takeMessages(const Value& value, const std::string& directory, Given& given) {
  if (const std::string* path = value.asString()) {
    auto messages = readMessages(pathBeside(directory, *path));
    if (!messages) return messages.error();
    given.messages = std::move(messages).value();
    return std::nullopt;
  }
  const Array* array = value.asArray();
  if (array == nullptr) return expected("messages", value, "an array of objects or the path of a file").error;
  for (const Value& item : *array) {
    auto message = messageOf(item);
    if (!message) return "\"messages\": " + message.error();
    given.messages.push_back(std::move(message).value());
  }
  return std::nullopt;
}

struct GivenKey {
  const char* name;
  // What is wrong; nothing: it was read.
  std::optional<std::string> (*read)(const Value&, const std::string& directory, Given&);
};

std::optional<std::string> readName(const char* key, const char* name, const Value& value, Given& given) {
  if (!value.asString()) return expected(key, value, "a text").error;
  given.setUserInfo(name, value);
  return std::nullopt;
}

std::optional<std::string> readFlag(const char* key, const Value& value, bool& flag) {
  if (!value.isBoolean()) return expected(key, value, "true or false").error;
  flag = *value.toBoolean();
  return std::nullopt;
}

constexpr GivenKey kKeys[] = {
    {"clientType",
     [](const Value& value, const std::string&, Given& given) -> std::optional<std::string> {
       const auto type = wholeNumber(value, 0, config::kVeltraClientTypeCount - 1);
       if (!type) return expected("clientType", value, "an integer from 0 to 17").error;
       given.clientType = static_cast<std::int32_t>(*type);
       return std::nullopt;
     }},
    {"environment",
     [](const Value& value, const std::string&, Given& given) {
       return inKey("environment", given.takeEnvironment(value.toText().value_or("")));
     }},
    {"client",
     [](const Value& value, const std::string&, Given& given) {
       return readName("client", wire::kVeltraUserInfoClientName, value, given);
     }},
    {"service",
     [](const Value& value, const std::string&, Given& given) {
       return readName("service", wire::kVeltraUserInfoServiceName, value, given);
     }},
    {"userInfo",
     [](const Value& value, const std::string&, Given& given) { return readUserInfo(value, given); }},
    {"requireUserInfo",
     [](const Value& value, const std::string&, Given& given) {
       return readFlag("requireUserInfo", value, given.requireUserInfo);
     }},
    {"batchEvents", [](const Value& value, const std::string&,
                       Given& given) { return readFlag("batchEvents", value, given.batchEvents); }},
    {"country",
     [](const Value& value, const std::string&, Given& given) {
       return inKey("country", given.takeCountry(value.toText().value_or("")));
     }},
    {"consent", [](const Value& value, const std::string&,
                   Given& given) { return readFlag("consent", value, given.consent); }},
    {"device",
     [](const Value& value, const std::string& directory, Given& given) -> std::optional<std::string> {
       auto device = deviceIn(value, directory);
       if (!device) return device.error();
       given.device = std::move(device).value();
       return std::nullopt;
     }},
    {"draw", [](const Value& value, const std::string&, Given& given) { return readDraw(value, given); }},
    {"messages", takeMessages},
    {"policy",
     [](const Value& value, const std::string& directory, Given& given) -> std::optional<std::string> {
       auto policy = policyIn(value, directory);
       if (!policy) return policy.error();
       given.policy = std::move(policy).value();
       return std::nullopt;
     }},
};

}  // namespace

void Given::setUserInfo(std::string key, Value value) {
  if (!userInfo) userInfo.emplace();
  userInfo->set(std::move(key), std::move(value));
}

std::optional<std::string> Given::takeUserInfo(const std::string& text) {
  auto entry = tools::parseKeyValue(text);
  if (!entry) return entry.error();
  setUserInfo(std::move(entry.value().first), std::move(entry.value().second));
  return std::nullopt;
}

std::optional<std::string> Given::takeEnvironment(const std::string& name) {
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

std::optional<std::string> Given::takeCountry(const std::string& code) {
  country = platform::countryOfLocaleName("xx_" + code);
  if (country) return std::nullopt;
  return fmt::format("{} is no country: expected two letters like US, or three digits", quoted(code));
}

std::optional<std::string> Given::takeDraw(const std::string& text) {
  const std::size_t equals = text.find('=');
  const bool named = equals != std::string::npos;
  const std::string number = named ? text.substr(equals + 1) : text;
  const auto read = formats::parseJSON(number);
  return takeDraw(named ? text.substr(0, equals) : "", read ? read.value() : Value(number));
}

std::optional<std::string> Given::takeDraw(const std::string& backend, const Value& factor) {
  std::vector<std::string> known;
  for (const config::Key& key : config::StorebagSection::kKeys) known.emplace_back(key.name);
  if (!backend.empty() && std::find(known.begin(), known.end(), backend) == known.end())
    return fmt::format("unknown back end {}{}", quoted(backend), mostLike(backend, known));
  const auto number = factor.isNumber() ? factor.toDouble() : std::nullopt;
  if (!number || *number < 0 || *number > 1)
    return fmt::format("{} is no sampling factor: expected a number from 0 to 1", shownValue(factor));
  (backend.empty() ? draw : draws[backend]) = *number;
  return std::nullopt;
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
  given.flag = message->int32(wire::kVeltraMessageParametersFlag).value_or(0);
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
    if (const auto wrong = key.read(*value, directory, given)) return Failure{*wrong};
  }
  for (const auto& [name, value] : dictionary) {
    if (std::find(known.begin(), known.end(), name) != known.end()) continue;
    return Failure{fmt::format("unknown key {} in \"given\"{}", quoted(name), mostLike(name, known))};
  }
  return given;
}

}  // namespace veltrad::storebag
