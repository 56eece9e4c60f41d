// SPDX-License-Identifier: Apache-2.0
// Reads the values of keys.
#include "config/key_table.h"

#include <algorithm>

namespace veltrad::config {

const Key* KeyTable::find(std::string_view name) const {
  const auto at = std::find_if(begin(), end(), [name](const Key& key) { return name == key.name; });
  return at == end() ? nullptr : &*at;
}

bool fits(const Value& value, KeyType type) {
  switch (type) {
    case KeyType::text:
    case KeyType::url:
    case KeyType::names:
      return value.asString() != nullptr;
    case KeyType::texts:
    case KeyType::dictionaries:
      return value.asArray() != nullptr;
    case KeyType::integer:
      return value.toInt64().has_value();
    case KeyType::real:
      return value.toDouble().has_value();
    case KeyType::dictionary:
      return value.asDictionary() != nullptr;
    case KeyType::boolean:
      return value.isBoolean();
    case KeyType::choice:
      return value.asString() != nullptr;
    case KeyType::presence:
      break;
  }
  return true;
}

void readKeys(const KeyTable& table, const Dictionary& dictionary, void* parsed) {
  for (const Key& key : table) {
    const Value* value = key.read != nullptr ? dictionary.find(key.name) : nullptr;
    if (value != nullptr) key.read(key, *value, parsed);
  }
}

void take(const Key&, const Value& value, std::optional<std::string>& field) {
  if (const std::string* text = value.asString()) field = *text;
}

void take(const Key&, const Value& value, std::vector<std::string>& field) {
  const std::string* text = value.asString();
  if (text == nullptr) return;
  std::size_t start = 0;
  for (std::size_t comma; (comma = text->find(',', start)) != std::string::npos; start = comma + 1)
    field.push_back(text->substr(start, comma - start));
  field.push_back(text->substr(start));
}

void take(const Key&, const Value& value, TextList& field) {
  field.asGiven = value;
  const Array* array = value.asArray();
  for (std::size_t i = 0; array != nullptr && i < array->size(); ++i) {
    if (const std::string* text = (*array)[i].asString()) field.texts.push_back(*text);
  }
}

void take(const Key&, const Value& value, std::int32_t& field) {
  field = value.toInt32().value_or(field);
}

void take(const Key&, const Value& value, std::optional<std::uint16_t>& field) {
  field = value.toUInt16();
}

void take(const Key& key, const Value& value, std::optional<std::int64_t>& field) {
  const auto number = value.toInt64();
  if (number)
    field = std::clamp(*number, static_cast<std::int64_t>(key.range.least),
                       static_cast<std::int64_t>(key.range.most));
}

void take(const Key&, const Value& value, std::optional<double>& field) {
  field = value.toDouble();
}

void take(const Key& key, const Value& value, bool& field) {
  field = key.type == KeyType::presence || value.toBoolean().value_or(false);
}

void take(const Key&, const Value& value, std::optional<Dictionary>& field) {
  if (const Dictionary* dictionary = value.asDictionary()) field = *dictionary;
}

}  // namespace veltrad::config
