// SPDX-License-Identifier: Apache-2.0
// Conversions of values, and dictionaries as sorted vectors.
#include "base/value.h"

#include <algorithm>
#include <cmath>

#include "base/filled_text.h"

namespace veltrad {

Value::Value(Data data) : _held(std::make_shared<const Data>(std::move(data))) {}
Value::Value(Array array) : _held(std::make_shared<Array>(std::move(array))) {}
Value::Value(Dictionary dictionary) : _held(std::move(dictionary)) {}

std::optional<Dictionary> Value::takeDictionary() && {
  auto* held = std::get_if<Dictionary>(&_held);
  if (!held) return std::nullopt;
  return std::move(*held);
}

// The cast is allowed: the array was not made const.
std::optional<Array> Value::takeArray() && {
  auto* held = std::get_if<std::shared_ptr<const Array>>(&_held);
  if (!held) return std::nullopt;
  if (held->use_count() == 1) return std::move(const_cast<Array&>(**held));
  return **held;
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
        return *asDictionary() == *other.asDictionary();
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

namespace {
// Most keys differ in their first byte. (A string's end counts as a byte of 0.)
bool isBefore(const std::string& a, std::string_view b) {
  if (!b.empty() && a[0] != b[0]) return static_cast<unsigned char>(a[0]) < static_cast<unsigned char>(b[0]);
  return a < b;
}

// The place of a key among entries in order.
template <typename Entries>
auto placeOf(Entries begin, Entries end, std::string_view key) {
  return std::lower_bound(begin, end, key,
                          [](const auto& entry, std::string_view k) { return isBefore(entry.first, k); });
}
}  // namespace

Dictionary::Dictionary(std::initializer_list<Entry> entries) {
  *this = fromEntries(std::vector<Entry>(entries));
}

Dictionary Dictionary::fromEntries(std::vector<Entry> entries) {
  Dictionary made;
  if (entries.empty()) return made;
  made._shared = new Shared{{1}, std::move(entries)};
  auto& kept = made._shared->entries;
  const auto follows = [](const Entry& a, const Entry& b) { return !isBefore(a.first, b.first); };
  if (std::adjacent_find(kept.begin(), kept.end(), follows) == kept.end()) return made;

  std::stable_sort(kept.begin(), kept.end(),
                   [](const Entry& a, const Entry& b) { return isBefore(a.first, b.first); });
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

void Dictionary::release() noexcept {
  if (_shared->owners.fetch_sub(1, std::memory_order_acq_rel) == 1) delete _shared;
}

std::vector<Dictionary::Entry>& Dictionary::own() {
  if (!_shared) {
    _shared = new Shared;
  } else if (_shared->owners.load(std::memory_order_acquire) != 1) {
    Shared* copy = new Shared{{1}, _shared->entries};
    release();
    _shared = copy;
  }
  return _shared->entries;
}

const Value* Dictionary::find(std::string_view key) const {
  const auto at = placeOf(begin(), end(), key);
  return at != end() && at->first == key ? &at->second : nullptr;
}

void Dictionary::set(std::string key, Value value) {
  auto& entries = own();
  const auto at = placeOf(entries.begin(), entries.end(), key);
  if (at != entries.end() && at->first == key) {
    at->second = std::move(value);
  } else {
    entries.emplace(at, std::move(key), std::move(value));
  }
}

bool Dictionary::erase(std::string_view key) {
  return take(key).has_value();
}

std::optional<Value> Dictionary::take(std::string_view key) {
  if (!find(key)) return std::nullopt;
  auto& entries = own();
  const auto at = placeOf(entries.begin(), entries.end(), key);
  std::optional<Value> taken = std::move(at->second);
  entries.erase(at);
  return taken;
}

std::optional<Dictionary> Dictionary::takeDictionary(std::string_view key) {
  if (!dictionary(key)) return std::nullopt;
  auto& entries = own();
  return std::move(placeOf(entries.begin(), entries.end(), key)->second).takeDictionary();
}

std::optional<Array> Dictionary::takeArray(std::string_view key) {
  if (!array(key)) return std::nullopt;
  auto& entries = own();
  return std::move(placeOf(entries.begin(), entries.end(), key)->second).takeArray();
}

void Dictionary::merge(const Dictionary& other) {
  if (other.empty()) return;
  if (empty()) {
    *this = other;
    return;
  }
  auto& mine = own();
  std::size_t added = 0;
  auto at = mine.begin();
  for (const auto& [key, value] : other) {
    at = placeOf(at, mine.end(), key);
    if (at != mine.end() && at->first == key) {
      at->second = value;
    } else {
      ++added;
    }
  }
  // From the end, so that no entry is moved twice.
  std::size_t left = mine.size();
  mine.reserve(left + added);
  for (std::size_t i = 0; i < added; ++i) mine.emplace_back(std::string(), false);
  std::size_t to = mine.size();
  for (const Entry* theirs = other.end(); added > 0;) {
    const Entry& next = *(theirs - 1);
    if (left > 0 && isBefore(next.first, mine[left - 1].first)) {
      mine[--to] = std::move(mine[--left]);
      continue;
    }
    --theirs;
    if (left > 0 && mine[left - 1].first == next.first) continue;  // replaced above
    mine[--to] = next;
    --added;
  }
}

namespace {
template <typename Result>
Result readAs(const Dictionary& dictionary, std::string_view key, Result (Value::*as)() const) {
  const Value* value = dictionary.find(key);
  return value ? (value->*as)() : Result();
}
}  // namespace

const std::string* Dictionary::string(std::string_view key) const {
  return readAs(*this, key, &Value::asString);
}
const Dictionary* Dictionary::dictionary(std::string_view key) const {
  return readAs(*this, key, &Value::asDictionary);
}
const Array* Dictionary::array(std::string_view key) const {
  return readAs(*this, key, &Value::asArray);
}
std::optional<bool> Dictionary::boolean(std::string_view key) const {
  return readAs(*this, key, &Value::toBoolean);
}
std::optional<std::int32_t> Dictionary::int32(std::string_view key) const {
  return readAs(*this, key, &Value::toInt32);
}
std::optional<std::uint32_t> Dictionary::uint32(std::string_view key) const {
  return readAs(*this, key, &Value::toUInt32);
}
std::optional<std::uint16_t> Dictionary::uint16(std::string_view key) const {
  return readAs(*this, key, &Value::toUInt16);
}
std::optional<double> Dictionary::real(std::string_view key) const {
  return readAs(*this, key, &Value::toDouble);
}

bool Dictionary::operator==(const Dictionary& other) const {
  return _shared == other._shared || std::equal(begin(), end(), other.begin(), other.end());
}

std::size_t dictionaryBytes(std::size_t entries) {
  return blockBytes(sizeof(Dictionary::Shared)) + blockBytes(entries * sizeof(Dictionary::Entry));
}

std::size_t keptBytes(const std::string& text) {
  // A short text is stored in the object itself.
  const std::size_t kInPlace = std::string().capacity();  // known to the compiler
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
      return keptBytes(*value.asDictionary());
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
  if (!dictionary._shared) return 0;
  std::size_t bytes = dictionaryBytes(dictionary.capacity());
  for (const auto& [key, value] : dictionary) bytes += keptBytes(key) + keptBytes(value);
  return bytes;
}

}  // namespace veltrad
