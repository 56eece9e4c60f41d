// Value: what a property list holds, the one value type of the system. Immutable and shared: copies are
// cheap, a change makes a new value. Any thread.
#pragma once

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

class Dictionary;
class Value;

using Array = std::vector<Value>;

// Seconds since 1970-01-01 00:00:00 UTC, with fraction. (Property lists count from 2001; the codecs convert.)
struct Date {
  double secondsSince1970 = 0;
  bool operator==(const Date&) const = default;
};

// Raw bytes, as opposed to a text.
struct Data {
  std::string bytes;
  bool operator==(const Data&) const = default;
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

  // Exactly this type, else null. The pointer lives as long as this value.
  const std::string* asString() const { return std::get_if<std::string>(&_held); }
  const std::int64_t* asSigned() const { return std::get_if<std::int64_t>(&_held); }
  const std::uint64_t* asUnsigned() const { return std::get_if<std::uint64_t>(&_held); }
  const double* asReal() const { return std::get_if<double>(&_held); }
  const Date* asDate() const { return std::get_if<Date>(&_held); }
  const Data* asData() const;
  const Array* asArray() const;
  const Dictionary* asDictionary() const;

  // The content, moved out where nobody shares it, else copied; absent for another type.
  std::optional<Dictionary> takeDictionary() &&;
  std::optional<Array> takeArray() &&;

  bool isBoolean() const { return type() == Type::boolean; }
  // An integer of either sign, or a real; a boolean is not a number here.
  bool isNumber() const;

  // The rule for numbers and booleans in dictionaries from clients and storebags: a boolean read as a number
  // is 1 or 0, a number read as a boolean is true unless 0; integers wrap to the width asked for; reals
  // truncate; NaN, infinity and reals beyond 64 bits are absent; a text is never a number.
  std::optional<bool> toBoolean() const;
  std::optional<std::int64_t> toInt64() const;
  std::optional<std::int32_t> toInt32() const;
  std::optional<std::uint32_t> toUInt32() const;
  std::optional<std::uint16_t> toUInt16() const;
  // A boolean or integer as a real; NaN and infinity are absent.
  std::optional<double> toDouble() const;
  // A string as it is; a number or boolean as its decimal text (booleans "1" and "0"); anything else absent.
  std::optional<std::string> toText() const;

  // Exact: 1, 1u and 1.0 differ in type but integers of equal value are equal. Arrays and dictionaries by
  // content.
  bool operator==(const Value& other) const;

 private:
  friend class Dictionary;
  // In the order of Type.
  std::variant<bool, std::int64_t, std::uint64_t, double, std::string, Date, std::shared_ptr<const Data>,
               std::shared_ptr<const Array>, std::shared_ptr<const Dictionary>>
      _held;
};

// Keys are unique and ordered by their bytes, ascending: this is the enumeration order of every dictionary.
class Dictionary {
 public:
  using Entry = std::pair<std::string, Value>;
  using const_iterator = std::vector<Entry>::const_iterator;

  Dictionary() = default;
  Dictionary(std::initializer_list<Entry> entries);
  // Any order, linear-logarithmic; of equal keys the last one counts.
  static Dictionary fromEntries(std::vector<Entry> entries);

  const Value* find(std::string_view key) const;
  bool contains(std::string_view key) const { return find(key) != nullptr; }
  // Adds or replaces. Linear in the entries after the key; for many entries use fromEntries.
  void set(std::string key, Value value);
  // Sets the key when there is a value, does nothing otherwise.
  template <typename T>
  void setIfPresent(std::string key, const std::optional<T>& value) {
    if (value) set(std::move(key), Value(*value));
  }
  // True when the key was there.
  bool erase(std::string_view key);
  // Its value, which is then no longer there.
  std::optional<Value> take(std::string_view key);
  // Adds every entry of `other`, replacing entries of the same key. Linear in both.
  void merge(const Dictionary& other);

  std::size_t size() const { return _entries.size(); }
  std::size_t capacity() const { return _entries.capacity(); }
  bool empty() const { return _entries.empty(); }
  const_iterator begin() const { return _entries.begin(); }
  const_iterator end() const { return _entries.end(); }

  // Of the key's value when it has the type, by Value's rules; else absent or null.
  const std::string* string(std::string_view key) const;
  const Dictionary* dictionary(std::string_view key) const;
  const Array* array(std::string_view key) const;
  std::optional<bool> boolean(std::string_view key) const;
  std::optional<std::int32_t> int32(std::string_view key) const;
  std::optional<std::uint32_t> uint32(std::string_view key) const;
  std::optional<std::uint16_t> uint16(std::string_view key) const;
  std::optional<double> real(std::string_view key) const;

  bool operator==(const Dictionary& other) const { return _entries == other._entries; }

 private:
  std::vector<Entry>::iterator place(std::string_view key);
  std::vector<Entry> _entries;
};

// What malloc gives away for a block of that many bytes; 0 for none.
constexpr std::size_t blockBytes(std::size_t bytes) {
  return bytes == 0 ? 0 : bytes <= 24 ? 32 : (bytes + 8 + 15) / 16 * 16;
}
// Of an object made by make_shared, with its two counts.
template <typename T>
constexpr std::size_t sharedBytes() {
  return blockBytes(sizeof(T) + 2 * sizeof(void*));
}
std::size_t keptBytes(const std::string& text);
// The memory that a value or dictionary keeps beside its own object. What it shares with others counts in
// full. Linear in what it holds.
std::size_t keptBytes(const Value& value);
std::size_t keptBytes(const Dictionary& dictionary);
std::size_t keptBytes(const Array& array);

}  // namespace veltrad
