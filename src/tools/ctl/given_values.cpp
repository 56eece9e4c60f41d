// SPDX-License-Identifier: Apache-2.0
// Checks values that a user gives as JSON.
#include "tools/ctl/given_values.h"

#include <fmt/format.h>

#include <algorithm>

#include "formats/json.h"

namespace veltrad::ctl {
namespace {

// In the order of Value::Type.
constexpr const char* kTypeNames[] = {"a boolean", "an integer", "an integer", "a number with a fraction",
                                      "a text",    "a date",     "data",       "an array",
                                      "an object"};
static_assert(std::size(kTypeNames) == static_cast<std::size_t>(Value::Type::dictionary) + 1);

}  // namespace

const char* typeName(const Value& value) {
  return kTypeNames[static_cast<std::size_t>(value.type())];
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
