// Values that a user gives as JSON, and what is said of them. Pure functions; any thread.
#include "tools/ctl/given_values.h"

#include <fmt/format.h>

#include <algorithm>

#include "formats/json.h"

namespace veltrad::ctl {

const char* typeName(const Value& value) {
  switch (value.type()) {
    case Value::Type::boolean:
      return "a boolean";
    case Value::Type::signedInteger:
    case Value::Type::unsignedInteger:
      return "an integer";
    case Value::Type::real:
      return "a number with a fraction";
    case Value::Type::string:
      return "a text";
    case Value::Type::date:
      return "a date";
    case Value::Type::data:
      return "data";
    case Value::Type::array:
      return "an array";
    case Value::Type::dictionary:
      return "an object";
  }
  return "something else";
}

bool hasUnsendableKey(const Value& value) {
  if (const Array* array = value.asArray())
    return std::any_of(array->begin(), array->end(), hasUnsendableKey);
  const Dictionary* dictionary = value.asDictionary();
  return dictionary &&
         std::any_of(dictionary->begin(), dictionary->end(), [](const Dictionary::Entry& entry) {
           return entry.first.find('\0') != std::string::npos || hasUnsendableKey(entry.second);
         });
}

Result<Array, std::string> parseLogData(std::string_view text) {
  const auto json = formats::parseJSON(text);
  if (!json)
    return Failure{fmt::format("not JSON: at byte {}: {}", json.error().offset, json.error().detail)};
  const Array* array = json.value().asArray();
  if (!array) return Failure{fmt::format("expected an array, found {}", typeName(json.value()))};
  if (hasUnsendableKey(json.value()))
    return Failure{std::string("a key holds a NUL character: expected none")};
  return *array;
}

}  // namespace veltrad::ctl
