// SPDX-License-Identifier: Apache-2.0
// Tables of the keys of storebags. One row makes a key known to the parser, to the code that uses it and to
// lint.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "base/value.h"

namespace veltrad::config {

// url: a text that begins with https://. names: a text of names separated by commas, not trimmed. texts,
// dictionaries: arrays. choice: one of a few texts. presence: any value; only the presence of the key
// matters.
enum class KeyType {
  text,
  url,
  names,
  texts,
  integer,
  real,
  presence,
  dictionary,
  dictionaries,
  boolean,
  choice
};

// The valid range of a number. The type of the key's field decides how a number outside is read.
struct Range {
  double least = 0;
  double most = 0;
};
inline constexpr Range kUnbounded;
inline constexpr Range kInt32{-2147483648.0, 2147483647.0};

enum class Need { optional, required };

struct KeyTable;

struct Key {
  const char* name;
  KeyType type;
  Range range;
  Need need;
  // The default, as a text.
  const char* byDefault;
  const char* meaning;
  // The keys of the dictionary, or of each dictionary in the array.
  const KeyTable* inner = nullptr;
  // Stores the value in the struct of its table; ignores one of the wrong type. Null if the daemon does not
  // read the key.
  void (*read)(const Key&, const Value&, void* parsed) = nullptr;
  const char* choices = nullptr;  // the texts of a choice, "|" between them
  // The range of meaningful values, for tools; the daemon accepts all of `range`. If unbounded, the same as
  // `range`.
  Range sensible = {};
};

constexpr Key sensibly(Range range, Key key) {
  key.sensible = range;
  return key;
}

struct KeyTable : std::span<const Key> {
  template <std::size_t N>
  constexpr KeyTable(const std::array<Key, N>& keys) : std::span<const Key>(keys) {}
  const Key* find(std::string_view name) const;
};

// True if the daemon accepts the value as one of this type.
bool fits(const Value& value, KeyType type);

// The texts of an array.
struct TextList {
  std::vector<std::string> texts;
  // For log lines.
  std::optional<Value> asGiven;
  bool operator==(const TextList& other) const { return texts == other.texts; }
};

// Store a value in a field: text or url, names, texts.
void take(const Key& key, const Value& value, std::optional<std::string>& field);
void take(const Key& key, const Value& value, std::vector<std::string>& field);
void take(const Key& key, const Value& value, TextList& field);
// These wrap to the width of the field.
void take(const Key& key, const Value& value, std::int32_t& field);
void take(const Key& key, const Value& value, std::optional<std::uint16_t>& field);
// Clamps to the key's range.
void take(const Key& key, const Value& value, std::optional<std::int64_t>& field);
void take(const Key& key, const Value& value, std::optional<double>& field);
void take(const Key& key, const Value& value, bool& field);  // presence, boolean
void take(const Key& key, const Value& value, std::optional<Dictionary>& field);

// The row of a key of `Parsed`, whose table is Parsed::kKeys.
template <typename Parsed>
struct Row {
  Key key;
};

void readKeys(const KeyTable& table, const Dictionary& dictionary, void* parsed);

template <typename Parsed>
Parsed parsed(const Dictionary& dictionary) {
  Parsed result;
  readKeys(Parsed::kKeys, dictionary, &result);
  return result;
}

// Skips elements that are not dictionaries.
template <typename Parsed>
void take(const Key&, const Value& value, std::optional<std::vector<Parsed>>& field) {
  const Array* array = value.asArray();
  if (array == nullptr) return;
  field.emplace();
  for (const Value& element : *array) {
    if (const Dictionary* dictionary = element.asDictionary()) field->push_back(parsed<Parsed>(*dictionary));
  }
}

template <typename Field, typename Parsed>
Parsed ownerOf(Field Parsed::*);

template <auto Member>
constexpr auto row(Key key) {
  using Parsed = decltype(ownerOf(Member));
  key.read = [](const Key& itself, const Value& value, void* parsed) {
    take(itself, value, static_cast<Parsed*>(parsed)->*Member);
  };
  return Row<Parsed>{key};
}

// All rows of a table must be of the same struct.
template <typename Parsed, std::size_t N>
constexpr std::array<Key, N> keysOf(const Row<Parsed> (&rows)[N]) {
  std::array<Key, N> keys{};
  for (std::size_t i = 0; i < N; ++i) keys[i] = rows[i].key;
  return keys;
}

}  // namespace veltrad::config
