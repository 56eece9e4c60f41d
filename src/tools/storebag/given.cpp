// SPDX-License-Identifier: Apache-2.0
// Reads what a storebag is played with.
#include "storebag/given.h"

#include <fmt/format.h>

#include <algorithm>
#include <utility>

#include "config/client_types.h"
#include "formats/json.h"
#include "storebag/document.h"
#include "storebag/lint_sink.h"
#include "storebag/spelling.h"
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

std::optional<std::string> readDraw(const Value& value, Given& given) {
  if (value.isNumber()) {
    given.draw = *value.toDouble();
    return std::nullopt;
  }
  const Dictionary* draws = value.asDictionary();
  if (draws == nullptr) return expected("draw", value, "a number from 0 to 1, or one by back end").error;
  for (const auto& [name, draw] : *draws) {
    if (!draw.isNumber()) return expected("draw", draw, "a number from 0 to 1").error;
    given.draws[name] = *draw.toDouble();
  }
  return std::nullopt;
}

// A dictionary, or the path of a file that holds one.
Result<Dictionary, std::string> dictionaryIn(const std::string& key, const Value& value,
                                             const std::string& directory) {
  if (const Dictionary* dictionary = value.asDictionary()) return *dictionary;
  const std::string* path = value.asString();
  if (path == nullptr) return expected(key, value, "an object or the path of a file");
  return readDictionary(pathBeside(directory, *path));
}

std::optional<std::string> readMessages(const Value& value, const std::string& directory, Given& given) {
  if (const std::string* path = value.asString()) {
    const std::string file = pathBeside(directory, *path);
    const auto lines = readBytes(file);
    if (!lines) return lines.error();
    auto messages = messagesIn(lines.value());
    if (!messages) return file + ":" + messages.error();
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
     [](const Value& value, const std::string&, Given& given) -> std::optional<std::string> {
       const auto environment = environmentNamed(value.toText().value_or(""));
       if (!environment) return environment.error();
       given.environment = environment.value();
       return std::nullopt;
     }},
    {"client",
     [](const Value& value, const std::string&, Given& given) -> std::optional<std::string> {
       if (!value.asString()) return expected("client", value, "a text").error;
       given.setUserInfo(wire::kVeltraUserInfoClientName, value);
       return std::nullopt;
     }},
    {"service",
     [](const Value& value, const std::string&, Given& given) -> std::optional<std::string> {
       if (!value.asString()) return expected("service", value, "a text").error;
       given.setUserInfo(wire::kVeltraUserInfoServiceName, value);
       return std::nullopt;
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
     [](const Value& value, const std::string&, Given& given) -> std::optional<std::string> {
       if (!value.asString()) return expected("country", value, "a text like \"US\"").error;
       given.country = *value.asString();
       return std::nullopt;
     }},
    {"consent", [](const Value& value, const std::string&,
                   Given& given) { return readFlag("consent", value, given.consent); }},
    {"device",
     [](const Value& value, const std::string& directory, Given& given) -> std::optional<std::string> {
       auto device = dictionaryIn("device", value, directory);
       if (!device) return device.error();
       given.device = std::move(device).value();
       return std::nullopt;
     }},
    {"draw", [](const Value& value, const std::string&, Given& given) { return readDraw(value, given); }},
    {"messages", readMessages},
    {"policy",
     [](const Value& value, const std::string& directory, Given& given) -> std::optional<std::string> {
       auto policy = dictionaryIn("policy", value, directory);
       if (!policy) return policy.error();
       given.policy = std::move(policy).value();
       return std::nullopt;
     }},
};

// False for a message that reached no back end for want of category or type, or whose contents are lost.
bool isWhole(const Dictionary& line) {
  return line.contains(wire::kVeltraMessageParametersCategory) &&
         line.contains(wire::kVeltraMessageParametersType) && !line.contains("contentsLost");
}

}  // namespace

void Given::setUserInfo(std::string key, Value value) {
  if (!userInfo) userInfo.emplace();
  userInfo->set(std::move(key), std::move(value));
}

Result<std::uint32_t, std::string> environmentNamed(const std::string& name) {
  std::string known;
  for (std::uint32_t number = 1; const char* section = config::sectionNameForEnvironment(number); ++number) {
    if (name == section || name == std::to_string(number)) return number;
    known += (known.empty() ? "" : ", ") + std::string(section);
  }
  return Failure{fmt::format("{} is no environment: expected one of {}", quoted(name), known)};
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

Result<std::vector<GivenMessage>, std::string> messagesIn(std::string_view lines) {
  std::vector<GivenMessage> messages;
  for (std::size_t number = 1; !lines.empty(); ++number) {
    const std::size_t end = std::min(lines.find('\n'), lines.size());
    const std::string_view line = trimmed(lines.substr(0, end));
    lines.remove_prefix(std::min(end + 1, lines.size()));
    if (line.empty()) continue;
    const auto value = formats::parseJSON(line);
    if (!value)
      return Failure{fmt::format("{}:{}: {}", number, value.error().offset + 1, value.error().detail)};
    const Dictionary* object = value.value().asDictionary();
    const std::string* event = object ? object->string("event") : nullptr;
    const std::string* operation = object ? object->string("op") : nullptr;
    const bool isMessage = event && *event == "message";
    if (!isMessage && !(operation && *operation == "send")) continue;
    if (isMessage && !isWhole(*object)) continue;
    auto message = messageOf(value.value());
    if (!message) return Failure{fmt::format("{}:1: {}", number, message.error())};
    messages.push_back(std::move(message).value());
  }
  return messages;
}

Result<Dictionary, std::string> readDictionary(const std::string& file) {
  const auto document = readDocument(file);
  if (!document) return Failure{document.error().line()};
  const Dictionary* dictionary = document.value().content.asDictionary();
  if (dictionary == nullptr) return Failure{file + ":1:1: expected an object"};
  return *dictionary;
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
    const auto meant = closestName(name, known);
    return Failure{fmt::format("unknown key {} in \"given\"{}", quoted(name),
                               meant ? ": did you mean " + quoted(*meant) + "?" : "")};
  }
  return given;
}

}  // namespace veltrad::storebag
