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

// Says what is wrong with the field, unless it is absent or an object.
std::optional<std::string> objectProblem(Operation operation, const Dictionary& line, const char* key) {
  const Value* value = line.find(key);
  if (!value || value->asDictionary()) return std::nullopt;
  return fmt::format("\"{}\" of {}: expected an object, found {}", key, operationName(operation),
                     typeName(*value));
}

bool isInteger(const Value& value) {
  return value.type() == Value::Type::signedInteger || value.type() == Value::Type::unsignedInteger;
}

Result<SessionLine, std::string> parseSend(Dictionary line) {
  if (auto problem = objectProblem(Operation::send, line, wire::kVeltraMessageParametersPayload))
    return Failure{*problem};
  const Value* flag = line.find(wire::kVeltraMessageParametersFlag);
  if (flag && !isInteger(*flag)) {
    return Failure{fmt::format("\"flag\" of send: expected an integer, found {}", typeName(*flag))};
  }
  SessionLine result;
  result.operation = Operation::send;
  line.erase("op");
  result.message = std::move(line);
  return result;
}

Result<SessionLine, std::string> parseStates(const Dictionary& line) {
  if (auto problem = objectProblem(Operation::states, line, "userInfo")) return Failure{*problem};
  SessionLine result;
  result.operation = Operation::states;
  if (const Dictionary* userInfo = line.dictionary("userInfo")) result.userInfo = *userInfo;
  return result;
}

Result<SessionLine, std::string> parseUploadFile(const Dictionary& line) {
  const Value* path = line.find("path");
  if (!path) return Failure{std::string("no \"path\" in uploadFile: expected a text")};
  const std::string* text = path->asString();
  if (!text)
    return Failure{fmt::format("\"path\" of uploadFile: expected a text, found {}", typeName(*path))};
  if (text->find('\0') != std::string::npos)
    return Failure{std::string("\"path\" of uploadFile holds a NUL character: expected none")};
  SessionLine result;
  result.operation = Operation::uploadFile;
  result.path = *text;
  return result;
}

Result<SessionLine, std::string> parseUploadLogData(const Dictionary& line) {
  const Value* data = line.find("data");
  if (!data) return Failure{std::string("no \"data\" in uploadLogData: expected an array")};
  const Array* array = data->asArray();
  if (!array)
    return Failure{fmt::format("\"data\" of uploadLogData: expected an array, found {}", typeName(*data))};
  SessionLine result;
  result.operation = Operation::uploadLogData;
  result.data = *array;
  return result;
}

Result<SessionLine, std::string> parseSleep(const Dictionary& line) {
  const std::string expected = fmt::format("expected an integer from 0 to {}", kLongestSleep.count());
  const Value* ms = line.find("ms");
  if (!ms) return Failure{fmt::format("no \"ms\" in sleep: {}", expected)};
  const auto count = isInteger(*ms) ? ms->toInt64() : std::nullopt;
  if (!count) return Failure{fmt::format("\"ms\" of sleep: {}, found {}", expected, typeName(*ms))};
  if (*count < 0 || *count > kLongestSleep.count()) {
    return Failure{fmt::format("\"ms\" of sleep: {}, found {}", expected, formats::writeJSON(*ms))};
  }
  SessionLine result;
  result.operation = Operation::sleep;
  result.duration = std::chrono::milliseconds(*count);
  return result;
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
  switch (operation.value()) {
    case Operation::send:
      return parseSend(*fields);
    case Operation::states:
      return parseStates(*fields);
    case Operation::uploadFile:
      return parseUploadFile(*fields);
    case Operation::uploadLogData:
      return parseUploadLogData(*fields);
    case Operation::sleep:
      return parseSleep(*fields);
    default:
      break;
  }
  SessionLine result;
  result.operation = operation.value();
  return result;
}

}  // namespace veltrad::ctl
