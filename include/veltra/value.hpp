// SPDX-License-Identifier: Apache-2.0
// The values of veltra.hpp, which includes this file: owners of a veltra_value, with the rules of veltra.h.
#ifndef VELTRA_VALUE_HPP
#define VELTRA_VALUE_HPP

#include <concepts>
#include <cstdint>
#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "veltra/veltra.h"

namespace veltra {

struct Date {
  double secondsSince1970 = 0;
};
struct Data {
  // Copied into the value.
  std::string_view bytes;
};

// A reference to a value, or none. Copies share it.
class Value {
 public:
  Value() = default;
  template <std::same_as<bool> T>
  Value(T value) : _value(veltra_boolean(value)) {}
  template <std::signed_integral T>
  Value(T value) : _value(veltra_signed(value)) {}
  template <std::unsigned_integral T>
  requires(!std::same_as<T, bool>) Value(T value) : _value(veltra_unsigned(value)) {}
  template <std::floating_point T>
  Value(T value) : _value(veltra_real(static_cast<double>(value))) {}
  Value(const char* text) : _value(veltra_string(text)) {}
  Value(std::string_view text) : _value(veltra_string_with_length(text.data(), text.size())) {}
  Value(const std::string& text) : Value(std::string_view(text)) {}
  Value(Date date) : _value(veltra_date(date.secondsSince1970)) {}
  Value(Data data) : _value(veltra_data(data.bytes.data(), data.bytes.size())) {}

  Value(const Value& other) : _value(veltra_retain(other._value)) {}
  Value(Value&& other) noexcept : _value(std::exchange(other._value, nullptr)) {}
  Value& operator=(Value other) noexcept {
    std::swap(_value, other._value);
    return *this;
  }
  ~Value() { veltra_release(_value); }

  // Takes over a reference.
  static Value adopt(veltra_value* value) {
    Value made;
    made._value = value;
    return made;
  }
  // Adds a reference.
  static Value share(const veltra_value* value) { return adopt(veltra_retain(value)); }

  explicit operator bool() const { return _value != nullptr; }
  veltra_type type() const { return veltra_type_of(_value); }
  const veltra_value* get() const { return _value; }
  // Hands the reference over to the caller.
  veltra_value* release() { return std::exchange(_value, nullptr); }

  bool boolean() const { return veltra_get_boolean(_value); }
  std::int64_t asSigned() const { return veltra_get_signed(_value); }
  std::uint64_t asUnsigned() const { return veltra_get_unsigned(_value); }
  double real() const { return veltra_get_real(_value); }
  std::optional<std::string_view> string() const {
    std::size_t length = 0;
    const char* text = veltra_get_string(_value, &length);
    return text ? std::optional(std::string_view(text, length)) : std::nullopt;
  }
  std::optional<std::string_view> data() const {
    std::size_t length = 0;
    const auto* bytes = static_cast<const char*>(veltra_get_data(_value, &length));
    return bytes ? std::optional(std::string_view(bytes, length)) : std::nullopt;
  }
  std::size_t count() const { return veltra_count(_value); }
  Value item(std::size_t index) const { return share(veltra_array_item(_value, index)); }
  Value item(const char* key) const { return share(veltra_dictionary_item(_value, key)); }
  // By number, in ascending order of the keys' bytes.
  std::pair<std::string, Value> entry(std::size_t index) const {
    const char* key = nullptr;
    Value value = share(veltra_dictionary_entry(_value, index, &key));
    return {key ? key : "", std::move(value)};
  }

 private:
  veltra_value* _value = nullptr;
};

// {1, "two", 3.0}
class Array : public Value {
 public:
  Array(std::initializer_list<Value> items = {}) : Value(adopt(veltra_array())) {
    for (const Value& item : items) append(item);
  }
  bool append(Value item) {
    return veltra_array_append(const_cast<veltra_value*>(get()), item.release()) == VELTRA_OK;
  }
};

// {{"codec", "opus"}, {"seconds", 12.5}}
class Dictionary : public Value {
 public:
  using Entry = std::pair<const char*, Value>;
  Dictionary(std::initializer_list<Entry> entries = {}) : Value(adopt(veltra_dictionary())) {
    for (const Entry& entry : entries) set(entry.first, entry.second);
  }
  bool set(const char* key, Value value) {
    return veltra_dictionary_set(const_cast<veltra_value*>(get()), key, value.release()) == VELTRA_OK;
  }
};

}  // namespace veltra

#endif
