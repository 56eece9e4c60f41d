// SPDX-License-Identifier: Apache-2.0
// Value: the content of a property list. Immutable and shared: copies are cheap, a change makes a new value.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace veltrad {

class Value;

using Array = std::vector<Value>;

struct Date {
  // Since 1970-01-01 00:00:00 UTC. (Property lists count from 2001; their readers and writers convert.)
  double secondsSince1970 = 0;
  bool operator==(const Date&) const = default;
};

// Raw bytes, as opposed to a text.
struct Data {
  std::string bytes;
  bool operator==(const Data&) const = default;
};

// Keys are unique and are enumerated in ascending order of their bytes. Copies share their entries until one
// of them is changed, so copying costs an add.
class Dictionary {
 public:
  using Entry = std::pair<std::string, Value>;
  using const_iterator = const Entry*;

  Dictionary() = default;
  Dictionary(std::initializer_list<Entry> entries);
  Dictionary(const Dictionary& other) noexcept;
  Dictionary(Dictionary&& other) noexcept : _shared(std::exchange(other._shared, nullptr)) {}
  Dictionary& operator=(Dictionary other) noexcept {
    std::swap(_shared, other._shared);
    return *this;
  }
  ~Dictionary() {
    if (_shared) release();
  }
  // Entries in any order; of equal keys the last one counts.
  static Dictionary fromEntries(std::vector<Entry> entries);

  const Value* find(std::string_view key) const;
  bool contains(std::string_view key) const { return find(key) != nullptr; }
  // Adds or replaces. Linear in the number of entries after the key; use fromEntries for many entries.
  void set(std::string key, Value value);
  template <typename T>
  void setIfPresent(std::string_view key, const std::optional<T>& value) {
    if (value) set(std::string(key), *value);
  }
  // True if the key was present.
  bool erase(std::string_view key);
  // Removes the key and returns its value.
  std::optional<Value> take(std::string_view key);
  // Moves the dictionary or array under the key out and leaves an empty one; absent without such an entry.
  std::optional<Dictionary> takeDictionary(std::string_view key);
  std::optional<Array> takeArray(std::string_view key);
  // Adds or replaces every entry of `other`, in linear time.
  void merge(const Dictionary& other);

  std::size_t size() const;
  std::size_t capacity() const;
  bool empty() const { return size() == 0; }
  const_iterator begin() const;
  const_iterator end() const;

  // The key's value as this type, by the rules of Value; else absent or null.
  const std::string* string(std::string_view key) const;
  const Dictionary* dictionary(std::string_view key) const;
  const Array* array(std::string_view key) const;
  std::optional<bool> boolean(std::string_view key) const;
  std::optional<std::int32_t> int32(std::string_view key) const;
  std::optional<std::uint32_t> uint32(std::string_view key) const;
  std::optional<std::uint16_t> uint16(std::string_view key) const;
  std::optional<double> real(std::string_view key) const;

  bool operator==(const Dictionary& other) const;

 private:
  friend std::size_t keptBytes(const Dictionary& dictionary);
  friend std::size_t dictionaryBytes(std::size_t entries);
  struct Shared;

  void release() noexcept;
  // The entries, which are copied first if they are shared.
  std::vector<Entry>& own();

  // Null if there are no entries.
  Shared* _shared = nullptr;
};

class Value {
 public:
  enum class Type { boolean, signedInteger, unsignedInteger, real, string, date, data, array, dictionary };

  Value(bool v) : _held(v) {}
  Value(int v) : _held(static_cast<std::int64_t>(v)) {}
  Value(long v) : _held(static_cast<std::int64_t>(v)) {}
  Value(long long v) : _held(static_cast<std::int64_t>(v)) {}
  Value(unsigned v) : _held(static_cast<std::uint64_t>(v)) {}
  Value(unsigned long v) : _held(static_cast<std::uint64_t>(v)) {}
  Value(unsigned long long v) : _held(static_cast<std::uint64_t>(v)) {}
  Value(double v) : _held(v) {}
  Value(const char* text) : _held(std::string(text)) {}
  Value(std::string_view text) : _held(std::string(text)) {}
  Value(std::string text) : _held(std::move(text)) {}
  Value(Date date) : _held(date) {}
  Value(Data data);
  Value(Array array);
  Value(Dictionary dictionary);

  Type type() const { return static_cast<Type>(_held.index()); }

  // The content, or null for any other type. The pointer is valid as long as this value.
  const std::string* asString() const { return std::get_if<std::string>(&_held); }
  const std::int64_t* asSigned() const { return std::get_if<std::int64_t>(&_held); }
  const std::uint64_t* asUnsigned() const { return std::get_if<std::uint64_t>(&_held); }
  const double* asReal() const { return std::get_if<double>(&_held); }
  const Date* asDate() const { return std::get_if<Date>(&_held); }
  const Data* asData() const { return shared<Data>(); }
  const Array* asArray() const { return shared<Array>(); }
  const Dictionary* asDictionary() const { return std::get_if<Dictionary>(&_held); }

  // The content, moved out unless others share it; absent for any other type.
  std::optional<Dictionary> takeDictionary() &&;
  std::optional<Array> takeArray() &&;

  // Replaces the content by one of the types that are held as they are, without a value in between.
  template <typename Content>
  void hold(Content content) {
    _held.emplace<Content>(std::move(content));
  }

  bool isBoolean() const { return type() == Type::boolean; }
  // An integer or a real, not a boolean.
  bool isNumber() const;

  // Conversions of numbers and booleans: a boolean is 1 or 0 as a number, a number other than 0 is true as a
  // boolean, integers wrap to the requested width, and reals are truncated. Absent for NaN, infinity, reals
  // outside 64 bits, and any other type.
  std::optional<bool> toBoolean() const;
  std::optional<std::int64_t> toInt64() const;
  std::optional<std::int32_t> toInt32() const { return wrapped<std::int32_t>(); }
  std::optional<std::uint32_t> toUInt32() const { return wrapped<std::uint32_t>(); }
  std::optional<std::uint16_t> toUInt16() const { return wrapped<std::uint16_t>(); }
  // Absent for NaN, infinity and any other type.
  std::optional<double> toDouble() const;
  // A string, or the decimal text of a number or boolean ("1" or "0"); absent for any other type.
  std::optional<std::string> toText() const;

  // Values of different types differ, except that integers are compared by value.
  bool operator==(const Value& other) const;

 private:
  template <typename T>
  const T* shared() const {
    const auto* held = std::get_if<std::shared_ptr<const T>>(&_held);
    return held ? held->get() : nullptr;
  }
  template <typename Integer>
  std::optional<Integer> wrapped() const {
    const auto wide = toInt64();
    return wide ? std::optional(static_cast<Integer>(*wide)) : std::nullopt;
  }

  // In the order of Type.
  std::variant<bool, std::int64_t, std::uint64_t, double, std::string, Date, std::shared_ptr<const Data>,
               std::shared_ptr<const Array>, Dictionary>
      _held;
};

// Entries, and the number of dictionaries that share them.
struct Dictionary::Shared {
  std::atomic<std::size_t> owners{1};
  std::vector<Entry> entries;
};

inline Dictionary::Dictionary(const Dictionary& other) noexcept : _shared(other._shared) {
  if (_shared) _shared->owners.fetch_add(1, std::memory_order_relaxed);
}
inline std::size_t Dictionary::size() const {
  return _shared ? _shared->entries.size() : 0;
}
inline std::size_t Dictionary::capacity() const {
  return _shared ? _shared->entries.capacity() : 0;
}
inline Dictionary::const_iterator Dictionary::begin() const {
  return _shared ? _shared->entries.data() : nullptr;
}
inline Dictionary::const_iterator Dictionary::end() const {
  return begin() + size();
}

// The memory that malloc uses for a block of this size; 0 for 0 bytes.
constexpr std::size_t blockBytes(std::size_t bytes) {
  return bytes == 0 ? 0 : bytes <= 24 ? 32 : (bytes + 8 + 15) / 16 * 16;
}
// The memory that make_shared allocates: the object and its two counts.
template <typename T>
constexpr std::size_t sharedBytes() {
  return blockBytes(sizeof(T) + 2 * sizeof(void*));
}
// The memory that a dictionary with room for so many entries takes, without what the entries keep.
std::size_t dictionaryBytes(std::size_t entries);
// The memory that a text, value or container keeps besides its own object. What it shares with others counts
// in full.
std::size_t keptBytes(const std::string& text);
std::size_t keptBytes(const Value& value);
std::size_t keptBytes(const Dictionary& dictionary);
std::size_t keptBytes(const Array& array);

}  // namespace veltrad
