// SPDX-License-Identifier: Apache-2.0
// Writes JSON with RapidJSON's writers directly into a string.
#include <rapidjson/prettywriter.h>
#include <rapidjson/writer.h>

#include <cmath>
#include <cstdint>
#include <cstring>

#include "base/base64.h"
#include "base/text.h"
#include "formats/json.h"

namespace veltrad::formats {

namespace {

// A RapidJSON stream that appends to a string.
class StringStream {
 public:
  using Ch = char;
  explicit StringStream(std::string& out) : _out(out) {}
  void Put(char c) { _out.push_back(c); }
  void Flush() {}

 private:
  std::string& _out;
};

// A RapidJSON stream that keeps the first bytes and counts the others.
class ExcerptStream {
 public:
  using Ch = char;
  ExcerptStream(JSONExcerpt& out, std::size_t most) : _out(out), _most(most) {}
  void Put(char c) {
    if (_out.text.size() < _most) {
      _out.text.push_back(c);
    } else {
      ++_out.leftOut;
    }
  }
  void Flush() {}

 private:
  JSONExcerpt& _out;
  const std::size_t _most;
};

template <typename Writer>
void putText(Writer& writer, const std::string& text, bool isKey) {
  if (!isUTF8(text)) return putText(writer, toUTF8(text), isKey);
  const auto length = static_cast<rapidjson::SizeType>(text.size());
  if (isKey) {
    writer.Key(text.data(), length);
  } else {
    writer.String(text.data(), length);
  }
}

template <typename Writer>
void putReal(Writer& writer, double number) {
  if (std::isfinite(number)) {
    writer.Double(number);
  } else {
    writer.Null();
  }
}

template <typename Writer>
void put(Writer& writer, const Value& value) {
  switch (value.type()) {
    case Value::Type::boolean:
      writer.Bool(*value.toBoolean());
      return;
    case Value::Type::signedInteger:
      writer.Int64(*value.asSigned());
      return;
    case Value::Type::unsignedInteger:
      writer.Uint64(*value.asUnsigned());
      return;
    case Value::Type::real:
      return putReal(writer, *value.asReal());
    case Value::Type::string:
      return putText(writer, *value.asString(), false);
    case Value::Type::date:
      writer.StartObject();
      putText(writer, "$date", true);
      putReal(writer, value.asDate()->secondsSince1970);
      writer.EndObject();
      return;
    case Value::Type::data:
      writer.StartObject();
      putText(writer, "$data", true);
      putText(writer, encodeBase64(value.asData()->bytes), false);
      writer.EndObject();
      return;
    case Value::Type::array:
      writer.StartArray();
      for (const Value& element : *value.asArray()) put(writer, element);
      writer.EndArray();
      return;
    case Value::Type::dictionary:
      writer.StartObject();
      for (const auto& [key, held] : *value.asDictionary()) {
        putText(writer, key, true);
        put(writer, held);
      }
      writer.EndObject();
      return;
  }
}

}  // namespace

std::string writeJSON(const Value& value, JSONStyle style, std::size_t expectedBytes) {
  std::string out;
  out.reserve(expectedBytes);
  StringStream stream(out);
  if (style == JSONStyle::pretty) {
    rapidjson::PrettyWriter<StringStream> writer(stream);
    writer.SetIndent(' ', 2);
    put(writer, value);
  } else {
    rapidjson::Writer<StringStream> writer(stream);
    put(writer, value);
  }
  return out;
}

JSONExcerpt excerptOfJSON(const Value& value, std::size_t most) {
  JSONExcerpt out;
  ExcerptStream stream(out, most);
  rapidjson::Writer<ExcerptStream> writer(stream);
  put(writer, value);
  const std::size_t whole = out.leftOut > 0 ? withoutIncompleteEnd(out.text).size() : out.text.size();
  out.leftOut += out.text.size() - whole;
  out.text.resize(whole);
  return out;
}

namespace {
constexpr std::uint64_t eachByte(std::uint64_t byte) {
  return byte * 0x0101010101010101u;
}

constexpr bool hasZeroByte(std::uint64_t word) {
  return ((word - eachByte(0x01)) & ~word & eachByte(0x80)) != 0;
}

// True if none of the eight characters needs an escape: printable ASCII, no quote, no backslash.
bool isPlain(std::uint64_t word) {
  const bool controls = ((word - eachByte(0x20)) & ~word & eachByte(0x80)) != 0;
  return (word & eachByte(0x80)) == 0 && !controls && !hasZeroByte(word ^ eachByte('"')) &&
         !hasZeroByte(word ^ eachByte('\\'));
}

// The bytes that escaping may add: a control character may become six bytes, an invalid byte three.
std::size_t escapesAtMost(std::string_view text) {
  std::size_t more = 0;
  for (const char c : text) {
    const auto byte = static_cast<unsigned char>(c);
    more += (byte < 0x20 ? 5u : 0u) + (byte >= 0x80 ? 2u : 0u) + (c == '"' || c == '\\' ? 1u : 0u);
  }
  return more;
}

// With its quotes. Tests eight characters at a time, since most texts need no escapes.
std::size_t textBytesAtMost(std::string_view text) {
  std::size_t bytes = text.size() + 2;
  for (std::size_t at = 0; at < text.size(); at += sizeof(std::uint64_t)) {
    const std::string_view piece = text.substr(at, sizeof(std::uint64_t));
    std::uint64_t word = eachByte('a');
    std::memcpy(&word, piece.data(), piece.size());
    if (!isPlain(word)) bytes += escapesAtMost(piece);
  }
  return bytes;
}
}  // namespace

std::size_t jsonBytesAtMost(const Dictionary& flat) {
  constexpr std::size_t kNumber = 32, kPunctuation = 2;
  std::size_t bytes = kPunctuation;
  for (const auto& [key, value] : flat) {
    const std::string* text = value.asString();
    bytes += textBytesAtMost(key) + (text ? textBytesAtMost(*text) : kNumber) + kPunctuation;
  }
  return bytes;
}

}  // namespace veltrad::formats
