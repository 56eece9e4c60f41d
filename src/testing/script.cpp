// SPDX-License-Identifier: Apache-2.0
// Keeps messages as the library's values, which are made through its public interface alone.
#include "testing/script.h"

namespace veltrad::testing {

namespace {

veltra_value* nodeOf(const Value& value);

veltra_value* nodeOf(const Array& array) {
  veltra_value* made = veltra_array();
  for (const Value& item : array) veltra_array_append(made, nodeOf(item));
  return made;
}

veltra_value* nodeOf(const Dictionary& dictionary) {
  veltra_value* made = veltra_dictionary();
  for (const auto& [key, value] : dictionary) veltra_dictionary_set(made, key.c_str(), nodeOf(value));
  return made;
}

veltra_value* nodeOf(const Value& value) {
  switch (value.type()) {
    case Value::Type::boolean:
      return veltra_boolean(*value.toBoolean());
    case Value::Type::signedInteger:
      return veltra_signed(*value.asSigned());
    case Value::Type::unsignedInteger:
      return veltra_unsigned(*value.asUnsigned());
    case Value::Type::real:
      return veltra_real(*value.asReal());
    case Value::Type::string:
      return veltra_string_with_length(value.asString()->data(), value.asString()->size());
    case Value::Type::date:
      return veltra_date(value.asDate()->secondsSince1970);
    case Value::Type::data:
      return veltra_data(value.asData()->bytes.data(), value.asData()->bytes.size());
    case Value::Type::array:
      return nodeOf(*value.asArray());
    case Value::Type::dictionary:
      return nodeOf(*value.asDictionary());
  }
  return nullptr;
}

}  // namespace

void Script::take(const Dictionary& message) {
  auto made = veltra::Value::adopt(nodeOf(message));
  Lock lock(_mutex);
  _messages.push_back(std::move(made));
  _came.notifyAll();
}

std::size_t Script::count() {
  Lock lock(_mutex);
  return _messages.size();
}

bool Script::waitFor(std::size_t count, std::chrono::steady_clock::time_point deadline) {
  Lock lock(_mutex);
  while (_messages.size() < count && _came.waitUntil(_mutex, deadline)) {
  }
  return _messages.size() >= count;
}

const veltra_value* Script::message(std::size_t index) {
  Lock lock(_mutex);
  return index < _messages.size() ? _messages[index].get() : nullptr;
}

void Script::refuse(std::optional<std::string> text) {
  Lock lock(_mutex);
  _refusal = std::move(text);
}

std::optional<std::string> Script::refusal() {
  Lock lock(_mutex);
  return _refusal;
}

}  // namespace veltrad::testing
