// SPDX-License-Identifier: Apache-2.0
// Reads binary property lists from untrusted bytes.
//
// Layout: "bplist00", the objects, a table of their offsets, and a trailer of 32 bytes that says where the
// table is and how wide offsets and references are. All numbers are big-endian.

#include <bit>
#include <cstring>
#include <limits>

#include "base/filled_text.h"
#include "base/property_list.h"
#include "base/property_list_binary.h"
#include "base/text.h"
#include "base/utf16.h"

namespace veltrad {

namespace {

using namespace binary_property_list;
using Kind = PropertyListError::Kind;

// The memory of a string that was allocated with this length; a short one is stored in the object itself.
std::size_t textBlock(std::size_t length) {
  const std::size_t kInPlace = std::string().capacity();  // known to the compiler
  return length > kInPlace ? blockBytes(length + 1) : 0;
}

// Reads one list. The bytes must outlive it.
class Reader {
 public:
  Reader(std::string_view bytes, const PropertyListLimits& limits)
      : _bytes(bytes),
        _objectsLeft(limits.objects),
        _textLeft(limits.textBytes),
        _memoryLeft(limits.memory),
        _depthLimit(limits.depth) {}

  Result<Value, PropertyListError> read() {
    const auto trailer = parseTrailer(_bytes);
    if (!trailer) return Failure{trailer.error()};
    _trailer = trailer.value();
    Value value(false);
    Object top;
    if (!charge(1) || !locate(_trailer.top, top) || !readObject(top, nullptr, 1, value)) {
      return Failure{std::move(_error)};
    }
    return value;
  }

 private:
  // The containers that are being read, from the innermost outwards.
  struct Path {
    std::uint64_t object;
    const Path* outer;
  };
  // An object: its number, its marker, and the bytes of the object area that follow the marker.
  struct Object {
    std::uint64_t number;
    std::uint8_t marker;
    std::string_view rest;
  };

  static bool isText(const Object& object) {
    const std::uint8_t type = object.marker & 0xF0;
    return type == kASCII || type == kUTF16;
  }

  [[gnu::cold]] bool fail(Kind kind, std::string detail) {
    _error = {kind, std::move(detail)};
    return false;
  }
  [[gnu::cold]] bool malformed(const Object& object, const char* what) {
    return fail(Kind::malformed, filled("object {}: {}", object.number, what));
  }

  [[gnu::cold]] bool badOffset(std::uint64_t number, std::uint64_t offset) {
    return fail(Kind::malformed, filled("object {}: offset {} lies outside the objects", number, offset));
  }

  bool charge(std::uint64_t objects);
  bool chargeText(std::uint64_t bytes);
  bool chargeMemory(std::uint64_t bytes);
  bool locate(std::uint64_t number, Object& object);
  bool takeCount(Object& object, std::uint64_t& count);
  bool take(Object& object, std::uint64_t count, std::size_t width, std::string_view& bytes);

  bool readObject(Object& object, const Path* path, int depth, Value& value);
  bool readSimple(const Object& object, Value& value);
  bool readInteger(Object& object, Value& value);
  bool readReal(Object& object, Value& value);
  bool readDate(Object& object, Value& value);
  bool readUID(Object& object, Value& value);
  bool readData(Object& object, Value& value);
  bool readText(Object& object, std::string& text);
  bool enter(const Object& object, const Path* path, int depth);
  bool readArray(Object& object, const Path* path, int depth, Value& value);
  bool readDictionary(Object& object, const Path* path, int depth, Value& value);

  std::uint64_t reference(std::string_view references, std::uint64_t i) const {
    return bigEndian(references.data() + i * _trailer.referenceSize, _trailer.referenceSize);
  }

  const std::string_view _bytes;
  std::uint64_t _objectsLeft;
  std::uint64_t _textLeft;
  std::uint64_t _memoryLeft;
  const int _depthLimit;
  Trailer _trailer;
  PropertyListError _error{};
};

bool Reader::charge(std::uint64_t objects) {
  if (objects > _objectsLeft) return fail(Kind::tooLarge, "more objects than the limit");
  _objectsLeft -= objects;
  return true;
}

bool Reader::chargeText(std::uint64_t bytes) {
  if (bytes > _textLeft) return fail(Kind::tooLarge, "more bytes of texts and data than the limit");
  _textLeft -= bytes;
  return true;
}

// To be called before the memory is allocated.
inline bool Reader::chargeMemory(std::uint64_t bytes) {
  if (bytes > _memoryLeft) return fail(Kind::overMemory, "its values need more memory than the limit");
  _memoryLeft -= bytes;
  return true;
}

inline bool Reader::locate(std::uint64_t number, Object& object) {
  if (number >= _trailer.count)
    return fail(Kind::malformed, filled("a reference to object {} of {}", number, _trailer.count));
  const std::uint64_t offset =
      bigEndian(_bytes.data() + _trailer.table + number * _trailer.offsetSize, _trailer.offsetSize);
  if (offset < kHeader.size() || offset >= _trailer.table) return badOffset(number, offset);
  object.number = number;
  object.marker = static_cast<std::uint8_t>(_bytes[offset]);
  object.rest = std::string_view(_bytes.data() + offset + 1, _trailer.table - offset - 1);
  return true;
}

// The count of an object: the lower half of its marker or, if that is 15, the integer object that follows.
inline bool Reader::takeCount(Object& object, std::uint64_t& count) {
  count = object.marker & 0xFu;
  if (count != 0xF) return true;
  const std::uint8_t marker = object.rest.empty() ? 0 : static_cast<std::uint8_t>(object.rest[0]);
  const std::size_t size = std::size_t{1} << (marker & 0x7);
  if ((marker & 0xF8) != kInteger || size > 8 || object.rest.size() < 1 + size) {
    return malformed(object, "no integer where its count should be");
  }
  count = bigEndian(object.rest.data() + 1, size);
  object.rest.remove_prefix(1 + size);
  return true;
}

inline bool Reader::take(Object& object, std::uint64_t count, std::size_t width, std::string_view& bytes) {
  if (count > object.rest.size() / width) return malformed(object, "it reaches beyond the objects");
  bytes = object.rest.substr(0, count * width);
  return true;
}

bool Reader::readObject(Object& object, const Path* path, int depth, Value& value) {
  switch (object.marker & 0xF0) {
    case kSimple:
      return readSimple(object, value);
    case kInteger:
      return readInteger(object, value);
    case kReal:
      return readReal(object, value);
    case kDate & 0xF0:
      return readDate(object, value);
    case kData:
      return readData(object, value);
    case kASCII:
    case kUTF16: {
      std::string text;
      if (!readText(object, text)) return false;
      value.hold(std::move(text));
      return true;
    }
    case kUID:
      return readUID(object, value);
    case kArray:
    case kSet:
      return readArray(object, path, depth, value);
    case kDictionary:
      return readDictionary(object, path, depth, value);
    default:
      return malformed(object, "unknown type");
  }
}

bool Reader::readSimple(const Object& object, Value& value) {
  if (object.marker != kFalse && object.marker != kTrue) {
    return malformed(object, object.marker == kNull ? "a null outside a dictionary" : "unknown type");
  }
  value.hold(object.marker == kTrue);
  return true;
}

bool Reader::readInteger(Object& object, Value& value) {
  const unsigned exponent = object.marker & 0xFu;
  if (exponent > 4) return malformed(object, "an integer of more than 16 bytes");
  std::string_view bytes;
  if (!take(object, 1, std::size_t{1} << exponent, bytes)) return false;
  if (exponent < 4) {
    // 1, 2 and 4 bytes are unsigned, 8 signed.
    value.hold(static_cast<std::int64_t>(bigEndian(bytes.data(), bytes.size())));
    return true;
  }
  const std::uint64_t high = bigEndian(bytes.data(), 8);
  const std::uint64_t low = bigEndian(bytes.data() + 8, 8);
  const auto asSigned = static_cast<std::int64_t>(low);
  if (high == (asSigned < 0 ? ~std::uint64_t{0} : 0)) {
    value.hold(asSigned);
  } else if (high == 0) {
    value.hold(low);
  } else {
    return malformed(object, "an integer beyond 64 bits");
  }
  return true;
}

bool Reader::readReal(Object& object, Value& value) {
  const std::size_t size = std::size_t{1} << (object.marker & 0x7u);
  if ((object.marker & 0x8u) || (size != 4 && size != 8))
    return malformed(object, "a real of neither 4 nor 8 bytes");
  std::string_view bytes;
  if (!take(object, 1, size, bytes)) return false;
  const std::uint64_t bits = bigEndian(bytes.data(), size);
  value.hold(size == 8 ? std::bit_cast<double>(bits)
                       : static_cast<double>(std::bit_cast<float>(static_cast<std::uint32_t>(bits))));
  return true;
}

bool Reader::readDate(Object& object, Value& value) {
  if (object.marker != kDate) return malformed(object, "unknown type");
  std::string_view bytes;
  if (!take(object, 1, 8, bytes)) return false;
  value.hold(Date{std::bit_cast<double>(bigEndian(bytes.data(), 8)) + kSecondsFrom1970To2001});
  return true;
}

bool Reader::readUID(Object& object, Value& value) {
  const std::size_t size = (object.marker & 0xFu) + std::size_t{1};
  if (size > 8) return malformed(object, "an identifier beyond 64 bits");
  std::string_view bytes;
  if (!take(object, 1, size, bytes)) return false;
  value.hold(bigEndian(bytes.data(), size));
  return true;
}

bool Reader::readData(Object& object, Value& value) {
  std::uint64_t count = 0;
  std::string_view bytes;
  if (!takeCount(object, count) || !take(object, count, 1, bytes) || !chargeText(count) ||
      !chargeMemory(sharedBytes<Data>() + textBlock(count))) {
    return false;
  }
  value = Value(Data{std::string(bytes)});
  return true;
}

bool Reader::readText(Object& object, std::string& text) {
  const bool wide = (object.marker & 0xF0) == kUTF16;
  std::uint64_t count = 0;
  std::string_view bytes;
  if (!takeCount(object, count) || !take(object, count, wide ? 2 : 1, bytes)) return false;
  if (!wide) {
    if (!isASCII(bytes)) return malformed(object, "a byte above 127 in an ASCII text");
    if (!chargeText(count) || !chargeMemory(textBlock(count))) return false;
    text.assign(bytes);
    return true;
  }
  if (count > _textLeft) return chargeText(count);
  const std::size_t length = utf8LengthOfUTF16(bytes);
  if (!chargeText(length) || !chargeMemory(textBlock(length))) return false;
  text.reserve(length);
  forEachUTF16Character(bytes, [&](char32_t code) { appendUTF8(text, code); });
  return true;
}

bool Reader::enter(const Object& object, const Path* path, int depth) {
  for (; path; path = path->outer) {
    if (path->object == object.number) {
      return fail(Kind::cyclic, filled("object {} contains itself", object.number));
    }
  }
  if (depth > _depthLimit) return fail(Kind::tooDeep, filled("nested deeper than {}", _depthLimit));
  return true;
}

bool Reader::readArray(Object& object, const Path* path, int depth, Value& value) {
  std::uint64_t count = 0;
  std::string_view references;
  // The elements are charged before they are allocated.
  if (!enter(object, path, depth) || !takeCount(object, count) ||
      !take(object, count, _trailer.referenceSize, references) || !charge(count) ||
      !chargeMemory(sharedBytes<Array>() + blockBytes(count * sizeof(Value)))) {
    return false;
  }
  const Path here{object.number, path};
  Array array;
  array.reserve(count);
  for (std::uint64_t i = 0; i < count; ++i) {
    Object element;
    if (!locate(reference(references, i), element) ||
        !readObject(element, &here, depth + 1, array.emplace_back(false))) {
      return false;
    }
  }
  value = Value(std::move(array));
  return true;
}

bool Reader::readDictionary(Object& object, const Path* path, int depth, Value& value) {
  std::uint64_t count = 0;
  std::string_view references;
  if (!enter(object, path, depth) || !takeCount(object, count) ||
      !take(object, count, 2 * _trailer.referenceSize, references) || !charge(2 * count) ||
      !chargeMemory(dictionaryBytes(count))) {
    return false;
  }
  const Path here{object.number, path};
  std::vector<Dictionary::Entry> entries;
  entries.reserve(count);
  for (std::uint64_t i = 0; i < count; ++i) {
    Object key;
    Object held;
    if (!locate(reference(references, i), key) || !locate(reference(references, count + i), held))
      return false;
    if (!isText(key)) return malformed(key, "a key that is no text");
    auto& entry = entries.emplace_back(std::string(), false);
    if (!readText(key, entry.first)) return false;
    if (held.marker == kNull) {
      entries.pop_back();
    } else if (!readObject(held, &here, depth + 1, entry.second)) {
      return false;
    }
  }
  value.hold(Dictionary::fromEntries(std::move(entries)));
  return true;
}

}  // namespace

Result<Value, PropertyListError> parseBinaryPropertyList(std::string_view bytes,
                                                         const PropertyListLimits& limits) {
  if (!bytes.starts_with(kHeader)) {
    return Failure{PropertyListError{Kind::notAPropertyList, "it does not begin with \"bplist00\""}};
  }
  if (bytes.size() > limits.bytes) {
    return Failure{PropertyListError{Kind::tooLarge,
                                     filled("{} bytes, at most {} are read", bytes.size(), limits.bytes)}};
  }
  return Reader(bytes, limits).read();
}

}  // namespace veltrad
