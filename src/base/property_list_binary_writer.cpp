// SPDX-License-Identifier: Apache-2.0
// Writes binary property lists in two passes: one measures, one writes into a buffer of exactly that size.
#include <bit>
#include <cstring>

#include "base/property_list.h"
#include "base/property_list_binary.h"
#include "base/text.h"
#include "base/utf16.h"

namespace veltrad {

namespace {

using namespace binary_property_list;

std::size_t widthOf(std::uint64_t number) {
  std::size_t width = 1;
  while (width < 8 && number >> (8 * width)) ++width;
  return width;
}

// Integers have 1, 2, 4 or 8 bytes; the marker holds the logarithm.
unsigned exponentOf(std::uint64_t number) {
  return number < 0x100 ? 0u : number < 0x10000 ? 1u : number < 0x100000000 ? 2u : 3u;
}

std::size_t headSize(std::uint64_t count) {
  return count < 15 ? 1 : 2 + (std::size_t{1} << exponentOf(count));
}

std::size_t integerSize(std::uint64_t number, bool isSigned) {
  if (!isSigned && number >> 63) return 17;
  return 1 + (std::size_t{1} << exponentOf(number));
}

// The size of a value: its objects, the references between them, and the bytes of all objects without
// references.
struct Measure {
  std::uint64_t objects = 0;
  std::uint64_t references = 0;
  std::uint64_t bytes = 0;

  void add(const Value& value);
  void addText(std::string_view text);

 private:
  void addSized(std::uint64_t count, std::size_t width) { bytes += headSize(count) + count * width; }
};

void Measure::addText(std::string_view text) {
  ++objects;
  if (isASCII(text)) {
    addSized(text.size(), 1);
  } else {
    addSized(utf16UnitCount(text), 2);
  }
}

void Measure::add(const Value& value) {
  switch (value.type()) {
    case Value::Type::string:
      return addText(*value.asString());
    case Value::Type::boolean:
      bytes += 1;
      break;
    case Value::Type::signedInteger:
      bytes += integerSize(static_cast<std::uint64_t>(*value.asSigned()), true);
      break;
    case Value::Type::unsignedInteger:
      bytes += integerSize(*value.asUnsigned(), false);
      break;
    case Value::Type::real:
    case Value::Type::date:
      bytes += 9;
      break;
    case Value::Type::data:
      addSized(value.asData()->bytes.size(), 1);
      break;
    case Value::Type::array: {
      const Array& array = *value.asArray();
      addSized(array.size(), 0);
      references += array.size();
      for (const Value& element : array) add(element);
      break;
    }
    case Value::Type::dictionary: {
      const Dictionary& dictionary = *value.asDictionary();
      addSized(dictionary.size(), 0);
      references += 2 * dictionary.size();
      for (const auto& [key, held] : dictionary) {
        addText(key);
        add(held);
      }
      break;
    }
  }
  ++objects;
}

void putBigEndian(char*& at, std::uint64_t number, std::size_t size) {
  if (size == 1) {  // the most frequent case
    *at++ = static_cast<char>(number);
    return;
  }
  for (std::size_t i = size; i > 0; --i) {
    at[i - 1] = static_cast<char>(number);
    number >>= 8;
  }
  at += size;
}

// The widths and offsets that follow from a measure.
struct Layout {
  explicit Layout(const Measure& measure) : referenceSize(widthOf(measure.objects - 1)) {
    table = kHeader.size() + measure.bytes + measure.references * referenceSize;
    offsetSize = widthOf(table);
    size = table + measure.objects * offsetSize + kTrailerSize;
  }
  std::size_t referenceSize;
  std::size_t offsetSize;
  // Where the table of offsets begins.
  std::uint64_t table;
  std::uint64_t size;
};

// Writes into a buffer of the layout's size. Objects are numbered in the order in which they are begun.
class Writer {
 public:
  Writer(char* start, const Layout& layout)
      : _start(start),
        _table(start + layout.table),
        _referenceSize(layout.referenceSize),
        _offsetSize(layout.offsetSize),
        _at(start),
        _nextOffset(_table) {}

  void write(const Value& value) {
    std::memcpy(_at, kHeader.data(), kHeader.size());
    _at += kHeader.size();
    put(value);
    char* trailer = _nextOffset;
    std::memset(trailer, 0, 6);
    trailer[6] = static_cast<char>(_offsetSize);
    trailer[7] = static_cast<char>(_referenceSize);
    trailer += 8;
    putBigEndian(trailer, _next, 8);
    putBigEndian(trailer, 0, 8);
    putBigEndian(trailer, static_cast<std::uint64_t>(_table - _start), 8);
  }

 private:
  void begin() {
    putBigEndian(_nextOffset, static_cast<std::uint64_t>(_at - _start), _offsetSize);
    ++_next;
  }
  void putByte(unsigned byte) { *_at++ = static_cast<char>(byte); }
  void putBytes(std::string_view bytes) {
    if (!bytes.empty()) std::memcpy(_at, bytes.data(), bytes.size());
    _at += bytes.size();
  }
  void putIntegerObject(std::uint64_t number) {
    const unsigned exponent = exponentOf(number);
    putByte(kInteger | exponent);
    putBigEndian(_at, number, std::size_t{1} << exponent);
  }
  void putHead(unsigned type, std::uint64_t count) {
    putByte(type | (count < 15 ? static_cast<unsigned>(count) : 15u));
    if (count >= 15) putIntegerObject(count);
  }
  void putDouble(unsigned marker, double number) {
    putByte(marker);
    putBigEndian(_at, std::bit_cast<std::uint64_t>(number), 8);
  }

  void put(const Value& value);
  void putText(std::string_view text);
  void putUnsigned(std::uint64_t number);
  void putArray(const Array& array);
  void putDictionary(const Dictionary& dictionary);

  char* const _start;
  char* const _table;
  const std::size_t _referenceSize;
  const std::size_t _offsetSize;
  char* _at;
  char* _nextOffset;
  std::uint64_t _next = 0;
};

void Writer::put(const Value& value) {
  if (const std::string* text = value.asString()) return putText(*text);
  begin();
  switch (value.type()) {
    case Value::Type::boolean:
      return putByte(*value.toBoolean() ? kTrue : kFalse);
    case Value::Type::signedInteger:
      return putIntegerObject(static_cast<std::uint64_t>(*value.asSigned()));
    case Value::Type::unsignedInteger:
      return putUnsigned(*value.asUnsigned());
    case Value::Type::real:
      return putDouble(kReal | 3, *value.asReal());
    case Value::Type::date:
      return putDouble(kDate, value.asDate()->secondsSince1970 - kSecondsFrom1970To2001);
    case Value::Type::data:
      putHead(kData, value.asData()->bytes.size());
      return putBytes(value.asData()->bytes);
    case Value::Type::array:
      return putArray(*value.asArray());
    case Value::Type::dictionary:
      return putDictionary(*value.asDictionary());
    case Value::Type::string:
      return;  // handled above
  }
}

void Writer::putText(std::string_view text) {
  begin();
  if (isASCII(text)) {
    putHead(kASCII, text.size());
    return putBytes(text);
  }
  putHead(kUTF16, utf16UnitCount(text));
  forEachUTF16Unit(text, [this](char16_t unit) { putBigEndian(_at, unit, 2); });
}

void Writer::putUnsigned(std::uint64_t number) {
  if (!(number >> 63)) return putIntegerObject(number);
  putByte(kInteger | 4);
  putBigEndian(_at, 0, 8);
  putBigEndian(_at, number, 8);
}

void Writer::putArray(const Array& array) {
  putHead(kArray, array.size());
  char* reference = _at;
  _at += array.size() * _referenceSize;
  for (const Value& element : array) {
    putBigEndian(reference, _next, _referenceSize);
    put(element);
  }
}

void Writer::putDictionary(const Dictionary& dictionary) {
  putHead(kDictionary, dictionary.size());
  char* keyReference = _at;
  char* valueReference = _at + dictionary.size() * _referenceSize;
  _at += 2 * dictionary.size() * _referenceSize;
  for (const auto& [key, value] : dictionary) {
    putBigEndian(keyReference, _next, _referenceSize);
    putText(key);
    putBigEndian(valueReference, _next, _referenceSize);
    put(value);
  }
}

}  // namespace

void appendBinaryPropertyList(const Value& value, std::string& out) {
  Measure measure;
  measure.add(value);
  const Layout layout(measure);
  const std::size_t before = out.size();
  out.resize(before + layout.size);
  Writer(out.data() + before, layout).write(value);
}

std::string writeBinaryPropertyList(const Value& value) {
  std::string out;
  appendBinaryPropertyList(value, out);
  return out;
}

}  // namespace veltrad
