// SPDX-License-Identifier: Apache-2.0
// Parses the input lines.
#include "tools/ctl/session_lines.h"

#include <fmt/format.h>

#include <algorithm>

#include "formats/json.h"
#include "tools/ctl/given_values.h"
#include "wire/constants.h"

namespace veltrad::ctl {
namespace {

constexpr const char* kExpectedOperations =
    "expected one of send, flush, states, displayURL, uploadFile, uploadLogData, restart, sleep, finish";

constexpr const char* kPause = "ms";
constexpr const char* kExpectedPause = "an integer from 0 to 3600000";
static_assert(kLongestSleep.count() == 3'600'000);

// What is wrong with a line, if anything is.
using Problem = std::optional<std::string>;

bool isInteger(const Value& value) {
  return value.type() == Value::Type::signedInteger || value.type() == Value::Type::unsignedInteger;
}
bool isText(const Value& value) {
  return value.asString() != nullptr;
}
bool isArray(const Value& value) {
  return value.asArray() != nullptr;
}
bool isObject(const Value& value) {
  return value.asDictionary() != nullptr;
}

enum class Need { optional, required };

struct Field {
  Operation operation;
  Need need;
  const char* key;
  bool (*fits)(const Value&);
  const char* expected;
};
constexpr Field kFields[] = {
    {Operation::send, Need::optional, wire::kVeltraMessageParametersPayload, isObject, "an object"},
    {Operation::send, Need::optional, wire::kVeltraMessageParametersFlag, isInteger, "an integer"},
    {Operation::states, Need::optional, "userInfo", isObject, "an object"},
    {Operation::uploadFile, Need::required, "path", isText, "a text"},
    {Operation::uploadLogData, Need::required, "data", isArray, "an array"},
    {Operation::sleep, Need::required, kPause, isInteger, kExpectedPause},
};

Problem problemOfFields(const SessionLine& line) {
  const char* name = operationName(line.operation);
  for (const auto& [operation, need, key, fits, expected] : kFields) {
    if (operation != line.operation) continue;
    const Value* value = line.fields.find(key);
    if (!value && need == Need::required)
      return fmt::format("no \"{}\" in {}: expected {}", key, name, expected);
    if (value && !fits(*value))
      return fmt::format("\"{}\" of {}: expected {}, found {}", key, name, expected, typeName(*value));
  }
  return std::nullopt;
}

Problem readPath(const SessionLine& line) {
  if (line.fields.string("path")->find('\0') == std::string::npos) return std::nullopt;
  return "\"path\" of uploadFile holds a NUL character: expected none";
}

Problem readPause(SessionLine& line) {
  const Value& ms = *line.fields.find(kPause);
  const auto count = ms.toInt64();
  if (!count || *count < 0 || *count > kLongestSleep.count())
    return fmt::format("\"{}\" of sleep: expected {}, found {}", kPause, kExpectedPause,
                       formats::writeJSON(ms));
  line.duration = std::chrono::milliseconds(*count);
  return std::nullopt;
}

Result<Operation, std::string> operationOf(const Dictionary& line) {
  const Value* op = line.find("op");
  if (!op) return Failure{fmt::format("no \"op\": {}", kExpectedOperations)};
  const std::string* name = op->asString();
  if (!name) return Failure{fmt::format("\"op\": expected a text, found {}", typeName(*op))};
  const auto* found = std::find(std::begin(kOperationNames), std::end(kOperationNames), *name);
  const auto operation = static_cast<Operation>(found - std::begin(kOperationNames));
  const bool known = found != std::end(kOperationNames);
  if (known && operation != Operation::start && operation != Operation::oneShot) return operation;
  return Failure{fmt::format("unknown op {}: {}", formats::writeJSON(*op), kExpectedOperations)};
}

}  // namespace

bool isBlankLine(std::string_view line) {
  return line.find_first_not_of(" \t\r\n") == std::string_view::npos;
}

Result<SessionLine, std::string> parseSessionLine(std::string_view line) {
  if (line.size() > kLongestLine) {
    return Failure{fmt::format("the line is too long: expected at most {} bytes", kLongestLine)};
  }
  const auto json = formats::parseJSON(line);
  if (!json)
    return Failure{fmt::format("not JSON: at byte {}: {}", json.error().offset, json.error().detail)};
  const Dictionary* fields = json.value().asDictionary();
  if (!fields) {
    return Failure{
        fmt::format("expected an object such as {{\"op\":\"flush\"}}, found {}", typeName(json.value()))};
  }
  const auto operation = operationOf(*fields);
  if (!operation) return Failure{operation.error()};
  if (hasUnsendableKey(json.value()))
    return Failure{std::string("a key holds a NUL character: expected none")};
  SessionLine result{operation.value(), *fields};
  result.fields.erase("op");
  Problem problem = problemOfFields(result);
  if (!problem && result.operation == Operation::uploadFile) problem = readPath(result);
  if (!problem && result.operation == Operation::sleep) problem = readPause(result);
  if (problem) return Failure{*problem};
  return result;
}

}  // namespace veltrad::ctl
