// SPDX-License-Identifier: Apache-2.0
// Conversions of values, and dictionaries as sorted vectors.
#include "base/value.h"

#include <algorithm>
#include <cmath>

#include "base/filled_text.h"

namespace veltrad {

Value::Value(Data data) : _held(std::make_shared<const Data>(std::move(data))) {}
Value::Value(Array array) : _held(std::make_shared<Array>(std::move(array))) {}
Value::Value(Dictionary dictionary) : _held(std::make_shared<Dictionary>(std::move(dictionary))) {}

namespace {
// Moves the content out if nobody shares it. The cast is allowed: the object was not made const.
template <typename T>
std::optional<T> takenFrom(std::shared_ptr<const T>* held) {
  if (!held) return std::nullopt;
  if (held->use_count() == 1) return std::move(const_cast<T&>(**held));
  return **held;
}
}  // namespace

std::optional<Dictionary> Value::takeDictionary() && {
  return takenFrom(std::get_if<std::shared_ptr<const Dictionary>>(&_held));
}

std::optional<Array> Value::takeArray() && {
  return takenFrom(std::get_if<std::shared_ptr<const Array>>(&_held));
}

bool Value::isNumber() const {
  return type() == Type::signedInteger || type() == Type::unsignedInteger || type() == Type::real;
}

std::optional<bool> Value::toBoolean() const {
  const auto number = toDouble();
  return number ? std::optional(*number != 0) : std::nullopt;
}

std::optional<std::int64_t> Value::toInt64() const {
  switch (type()) {
    case Type::boolean:
      return std::get<bool>(_held) ? 1 : 0;
    case Type::signedInteger:
      return std::get<std::int64_t>(_held);
    case Type::unsignedInteger:
      return static_cast<std::int64_t>(std::get<std::uint64_t>(_held));
    case Type::real: {
      const double number = std::get<double>(_held);
      // 64 bits, signed or unsigned: [-2^63, 2^64).
      if (!(number >= -0x1p63 && number < 0x1p64)) return std::nullopt;
      if (number < 0x1p63) return static_cast<std::int64_t>(number);
      return static_cast<std::int64_t>(static_cast<std::uint64_t>(number));
    }
    default:
      return std::nullopt;
  }
}

std::optional<double> Value::toDouble() const {
  switch (type()) {
    case Type::boolean:
      return std::get<bool>(_held) ? 1.0 : 0.0;
    case Type::signedInteger:
      return static_cast<double>(std::get<std::int64_t>(_held));
    case Type::unsignedInteger:
      return static_cast<double>(std::get<std::uint64_t>(_held));
    case Type::real: {
      const double number = std::get<double>(_held);
      if (!std::isfinite(number)) return std::nullopt;
      return number;
    }
    default:
      return std::nullopt;
  }
}

std::optional<std::string> Value::toText() const {
  switch (type()) {
    case Type::boolean:
      return std::get<bool>(_held) ? "1" : "0";
    case Type::signedInteger:
      return textOf(std::get<std::int64_t>(_held));
    case Type::unsignedInteger:
      return textOf(std::get<std::uint64_t>(_held));
    case Type::real:
      return textOf(std::get<double>(_held));
    case Type::string:
      return std::get<std::string>(_held);
    default:
      return std::nullopt;
  }
}

bool Value::operator==(const Value& other) const {
  if (type() == other.type()) {
    switch (type()) {
      case Type::data:
        return *asData() == *other.asData();
      case Type::array:
        return asArray() == other.asArray() || *asArray() == *other.asArray();
      case Type::dictionary:
        return asDictionary() == other.asDictionary() || *asDictionary() == *other.asDictionary();
      default:
        return _held == other._held;
    }
  }
  if (type() == Type::signedInteger && other.type() == Type::unsignedInteger) {
    const auto mine = std::get<std::int64_t>(_held);
    return mine >= 0 && static_cast<std::uint64_t>(mine) == std::get<std::uint64_t>(other._held);
  }
  if (type() == Type::unsignedInteger && other.type() == Type::signedInteger) return other == *this;
  return false;
}

Dictionary::Dictionary(std::initializer_list<Entry> entries) {
  *this = fromEntries(std::vector<Entry>(entries));
}

Dictionary Dictionary::fromEntries(std::vector<Entry> entries) {
  const auto before = [](const Entry& a, const Entry& b) { return a.first < b.first; };
  if (!std::is_sorted(entries.begin(), entries.end(), before)) {
    std::stable_sort(entries.begin(), entries.end(), before);
  }
  Dictionary made;
  made._entries = std::move(entries);
  auto& kept = made._entries;
  std::size_t end = 0;
  for (std::size_t i = 0; i < kept.size(); ++i) {
    if (end > 0 && kept[end - 1].first == kept[i].first) {
      kept[end - 1].second = std::move(kept[i].second);
    } else {
      if (end != i) kept[end] = std::move(kept[i]);
      ++end;
    }
  }
  kept.erase(kept.begin() + static_cast<std::ptrdiff_t>(end), kept.end());
  return made;
}

std::vector<Dictionary::Entry>::iterator Dictionary::place(std::string_view key) {
  return std::lower_bound(_entries.begin(), _entries.end(), key,
                          [](const Entry& entry, std::string_view k) { return entry.first < k; });
}

const Value* Dictionary::find(std::string_view key) const {
  const auto at = std::lower_bound(_entries.begin(), _entries.end(), key,
                                   [](const Entry& entry, std::string_view k) { return entry.first < k; });
  return at != _entries.end() && at->first == key ? &at->second : nullptr;
}

void Dictionary::set(std::string key, Value value) {
  const auto at = place(key);
  if (at != _entries.end() && at->first == key) {
    at->second = std::move(value);
  } else {
    _entries.emplace(at, std::move(key), std::move(value));
  }
}

std::optional<Value> Dictionary::take(std::string_view key) {
  const auto at = place(key);
  if (at == _entries.end() || at->first != key) return std::nullopt;
  std::optional<Value> taken = std::move(at->second);
  _entries.erase(at);
  return taken;
}

void Dictionary::merge(const Dictionary& other) {
  std::vector<Entry> both;
  both.reserve(_entries.size() + other._entries.size());
  auto mine = _entries.begin();
  for (const Entry& theirs : other._entries) {
    while (mine != _entries.end() && mine->first < theirs.first) both.push_back(std::move(*mine++));
    if (mine != _entries.end() && mine->first == theirs.first) ++mine;
    both.push_back(theirs);
  }
  std::move(mine, _entries.end(), std::back_inserter(both));
  _entries = std::move(both);
}

std::size_t keptBytes(const std::string& text) {
  // A short text is stored in the object itself.
  static const std::size_t kInPlace = std::string().capacity();
  return text.capacity() > kInPlace ? blockBytes(text.capacity() + 1) : 0;
}

std::size_t keptBytes(const Value& value) {
  switch (value.type()) {
    case Value::Type::string:
      return keptBytes(*value.asString());
    case Value::Type::data:
      return sharedBytes<Data>() + keptBytes(value.asData()->bytes);
    case Value::Type::array:
      return sharedBytes<Array>() + keptBytes(*value.asArray());
    case Value::Type::dictionary:
      return sharedBytes<Dictionary>() + keptBytes(*value.asDictionary());
    default:
      return 0;
  }
}

std::size_t keptBytes(const Array& array) {
  std::size_t bytes = blockBytes(array.capacity() * sizeof(Value));
  for (const Value& value : array) bytes += keptBytes(value);
  return bytes;
}

std::size_t keptBytes(const Dictionary& dictionary) {
  std::size_t bytes = blockBytes(dictionary.capacity() * sizeof(Dictionary::Entry));
  for (const auto& [key, value] : dictionary) bytes += keptBytes(key) + keptBytes(value);
  return bytes;
}

}  // namespace veltrad
