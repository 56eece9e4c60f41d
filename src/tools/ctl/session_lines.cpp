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

// What is wrong with a line, if anything is.
using Problem = std::optional<std::string>;

Problem notOfType(const char* key, Operation operation, const char* expected, const Value& found) {
  return fmt::format("\"{}\" of {}: expected {}, found {}", key, operationName(operation), expected,
                     typeName(found));
}

bool isInteger(const Value& value) {
  return value.type() == Value::Type::signedInteger || value.type() == Value::Type::unsignedInteger;
}

Problem readSend(const Dictionary& line, SessionLine& result) {
  const Value* payload = line.find(wire::kVeltraMessageParametersPayload);
  if (payload && !payload->asDictionary()) {
    return notOfType(wire::kVeltraMessageParametersPayload, Operation::send, "an object", *payload);
  }
  const Value* flag = line.find(wire::kVeltraMessageParametersFlag);
  if (flag && !isInteger(*flag)) {
    return notOfType(wire::kVeltraMessageParametersFlag, Operation::send, "an integer", *flag);
  }
  result.message = line;
  result.message.erase("op");
  return std::nullopt;
}

Problem readStates(const Dictionary& line, SessionLine& result) {
  const Value* userInfo = line.find("userInfo");
  if (!userInfo) return std::nullopt;
  if (!userInfo->asDictionary()) return notOfType("userInfo", Operation::states, "an object", *userInfo);
  result.userInfo = *userInfo->asDictionary();
  return std::nullopt;
}

Problem readUploadFile(const Dictionary& line, SessionLine& result) {
  const Value* path = line.find("path");
  if (!path) return "no \"path\" in uploadFile: expected a text";
  if (!path->asString()) return notOfType("path", Operation::uploadFile, "a text", *path);
  result.path = *path->asString();
  if (result.path.find('\0') == std::string::npos) return std::nullopt;
  return "\"path\" of uploadFile holds a NUL character: expected none";
}

Problem readUploadLogData(const Dictionary& line, SessionLine& result) {
  const Value* data = line.find("data");
  if (!data) return "no \"data\" in uploadLogData: expected an array";
  if (!data->asArray()) return notOfType("data", Operation::uploadLogData, "an array", *data);
  result.data = *data->asArray();
  return std::nullopt;
}

Problem readSleep(const Dictionary& line, SessionLine& result) {
  const std::string expected = fmt::format("expected an integer from 0 to {}", kLongestSleep.count());
  const Value* ms = line.find("ms");
  if (!ms) return fmt::format("no \"ms\" in sleep: {}", expected);
  const auto count = isInteger(*ms) ? ms->toInt64() : std::nullopt;
  if (!count) return fmt::format("\"ms\" of sleep: {}, found {}", expected, typeName(*ms));
  if (*count < 0 || *count > kLongestSleep.count()) {
    return fmt::format("\"ms\" of sleep: {}, found {}", expected, formats::writeJSON(*ms));
  }
  result.duration = std::chrono::milliseconds(*count);
  return std::nullopt;
}

Problem readFields(const Dictionary& line, SessionLine& result) {
  switch (result.operation) {
    case Operation::send:
      return readSend(line, result);
    case Operation::states:
      return readStates(line, result);
    case Operation::uploadFile:
      return readUploadFile(line, result);
    case Operation::uploadLogData:
      return readUploadLogData(line, result);
    case Operation::sleep:
      return readSleep(line, result);
    default:
      return std::nullopt;
  }
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
  SessionLine result;
  result.operation = operation.value();
  if (auto problem = readFields(*fields, result)) return Failure{*problem};
  return result;
}

}  // namespace veltrad::ctl
