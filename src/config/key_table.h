// Tables of the keys of a storebag. One row makes a key known to the parser, to what decides by it and to
// lint. Constants and plain functions; any thread.
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

enum class KeyType {
  text,
  url,    // a text that begins with https://
  names,  // a text: names between commas, not trimmed
  texts,  // an array of texts
  integer,
  real,
  presence,  // any value: that the key is there decides
  dictionary,
  dictionaries,  // an array of dictionaries
  boolean,
  choice,  // one of a few texts
};

// Of a number. What lies outside is read all the same, as the key's field says.
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
  const char* byDefault;  // what holds without the key
  const char* meaning;
  const KeyTable* inner = nullptr;  // the keys of the dictionary, or of each in the array
  // Puts the value into the struct of its table; one of the wrong type leaves it as if the key were absent.
  // Null: the daemon does not read the key.
  void (*read)(const Key&, const Value&, void* parsed) = nullptr;
  const char* choices = nullptr;  // the texts of a choice, "|" between them
};

struct KeyTable : std::span<const Key> {
  template <std::size_t N>
  constexpr KeyTable(const std::array<Key, N>& keys) : std::span<const Key>(keys) {}
  const Key* find(std::string_view name) const;
};

// Whether the daemon takes the value as one of this type.
bool fits(const Value& value, KeyType type);

// The texts of an array, and the value as it stands, for log lines.
struct TextList {
  std::vector<std::string> texts;
  std::optional<Value> asGiven;
  // Whether they read alike.
  bool operator==(const TextList& other) const { return texts == other.texts; }
};

void take(const Key& key, const Value& value, std::optional<std::string>& field);    // text, url
void take(const Key& key, const Value& value, std::vector<std::string>& field);      // names
void take(const Key& key, const Value& value, TextList& field);                      // texts
void take(const Key& key, const Value& value, std::int32_t& field);                  // wraps to its width
void take(const Key& key, const Value& value, std::optional<std::uint16_t>& field);  // wraps to its width
void take(const Key& key, const Value& value, std::optional<std::int64_t>& field);   // kept within the range
void take(const Key& key, const Value& value, std::optional<double>& field);
void take(const Key& key, const Value& value, bool& field);  // presence, boolean
void take(const Key& key, const Value& value, std::optional<Dictionary>& field);

// The row of a key of `Parsed`, which names its table "kKeys".
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

// Elements that are no dictionaries are passed over.
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

// A table takes the rows of its own struct alone.
template <typename Parsed, std::size_t N>
constexpr std::array<Key, N> keysOf(const Row<Parsed> (&rows)[N]) {
  std::array<Key, N> keys{};
  for (std::size_t i = 0; i < N; ++i) keys[i] = rows[i].key;
  return keys;
}

}  // namespace veltrad::config
