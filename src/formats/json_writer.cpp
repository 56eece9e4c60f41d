// SPDX-License-Identifier: Apache-2.0
// Writes JSON directly into a string.
#include <rapidjson/internal/dtoa.h>
#include <rapidjson/internal/itoa.h>
#include <rapidjson/writer.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>

#include "base/base64.h"
#include "base/text.h"
#include "formats/json.h"

namespace veltrad::formats {

namespace {

constexpr std::uint64_t eachByte(std::uint64_t byte) {
  return byte * 0x0101010101010101u;
}

// True if none of the eight characters needs an escape: printable ASCII, no quote, no backslash.
// A byte below 0x80 sets the high bit in a difference only if it is less than what is subtracted.
constexpr bool isPlain(std::uint64_t word) {
  return ((word | (word - eachByte(0x20)) | ((word ^ eachByte('"')) - eachByte(1)) |
           ((word ^ eachByte('\\')) - eachByte(1))) &
          eachByte(0x80)) == 0;
}

// Fewer than eight characters, filled up with others that need no escape.
inline std::uint64_t shortWord(std::string_view text) {
  std::uint64_t word = eachByte('a');
  std::uint32_t half;
  if (text.size() >= sizeof half) {  // two loads that overlap are faster than a copy of any length
    std::memcpy(&half, text.data() + text.size() - sizeof half, sizeof half);
    std::memcpy(reinterpret_cast<char*>(&word) + text.size() - sizeof half, &half, sizeof half);
    std::memcpy(&half, text.data(), sizeof half);
    std::memcpy(&word, &half, sizeof half);
  } else {
    for (std::size_t i = 0; i < text.size(); ++i) reinterpret_cast<char*>(&word)[i] = text[i];
  }
  return word;
}

// Writes into a string, as RapidJSON's writers do, but asks only once for each text or number whether there
// is room, not for each character.
class TextWriter {
 public:
  // Overwrites `out`, whose capacity it uses before it allocates more.
  TextWriter(std::string& out, JSONStyle style) : _out(out), _pretty(style == JSONStyle::pretty) {
    _out.clear();
    _at = _out.data();
  }
  TextWriter(const TextWriter&) = delete;
  ~TextWriter() { _out.resize(used()); }

  void Null() { putWord("null"); }
  void Bool(bool value) { putWord(value ? "true" : "false"); }
  void Int64(std::int64_t number) {
    begin(kNumber);
    _at = rapidjson::internal::i64toa(number, _at);
  }
  void Uint64(std::uint64_t number) {
    begin(kNumber);
    _at = rapidjson::internal::u64toa(number, _at);
  }
  void Double(double number) {
    begin(kNumber);
    _at = rapidjson::internal::dtoa(number, _at);
  }
  void String(std::string_view text) {
    begin(text.size() + kTextMore);
    putText(text);
  }
  void Key(std::string_view text) {
    String(text);
    *_at++ = ':';
    if (_pretty) *_at++ = ' ';
    _afterKey = true;
  }
  void StartObject() { open('{'); }
  void EndObject() { close('}'); }
  void StartArray() { open('['); }
  void EndArray() { close(']'); }

 private:
  static constexpr std::size_t kNumber = 32, kWord = sizeof(std::uint64_t), kIndent = 2;
  // The quotes, what follows a key, and up to a word that is written beyond the end.
  static constexpr std::size_t kTextMore = 4 + kWord;

  std::size_t used() const { return static_cast<std::size_t>(_at - _out.data()); }
  void reserve(std::size_t bytes) {
    if (_out.size() - used() < bytes) grow(bytes);
  }
  [[gnu::noinline]] void grow(std::size_t bytes) {
    constexpr std::size_t kStep = 1024;  // resize() fills with zeros, so no more than is needed soon
    const std::size_t before = used();
    _out.resize(before + std::max(bytes, kStep));
    _at = _out.data() + before;
  }
  // Makes room for the next value or key, and writes what precedes it.
  void begin(std::size_t bytes) {
    reserve(bytes + kNumber + kIndent * _depth);
    if (_afterKey) {
      _afterKey = false;
      return;
    }
    if (_follows) *_at++ = ',';
    if (_pretty && _depth > 0) newLine();
    _follows = true;
  }
  void newLine() {
    *_at++ = '\n';
    constexpr std::uint64_t kSpaces = eachByte(' ');
    const std::size_t indent = kIndent * _depth;
    for (std::size_t i = 0; i < indent; i += kWord) std::memcpy(_at + i, &kSpaces, kWord);
    _at += indent;
  }
  void open(char bracket) {
    begin(1);
    *_at++ = bracket;
    ++_depth;
    _follows = false;
  }
  void close(char bracket) {
    --_depth;
    reserve(kNumber + kIndent * _depth);
    if (_pretty && _follows) newLine();
    *_at++ = bracket;
    _follows = true;
  }
  void putWord(std::string_view word) {
    begin(word.size());
    std::memcpy(_at, word.data(), word.size());
    _at += word.size();
  }
  void putText(std::string_view text);
  void putEscaped(std::string_view text);

  std::string& _out;
  const bool _pretty;
  char* _at = nullptr;
  std::size_t _depth = 0;
  // Whether a comma must precede the next value or key, and whether the next value follows its key.
  bool _follows = false;
  bool _afterKey = false;
};

// There is room for the text if nothing in it needs an escape, which is tested for eight characters at a
// time.
void TextWriter::putText(std::string_view text) {
  *_at++ = '"';
  std::uint64_t word;
  for (; text.size() >= kWord; text.remove_prefix(kWord)) {
    std::memcpy(&word, text.data(), kWord);
    if (!isPlain(word)) break;
    std::memcpy(_at, &word, kWord);
    _at += kWord;
  }
  if (text.size() < kWord) {
    word = shortWord(text);
    if (isPlain(word)) {
      std::memcpy(_at, &word, kWord);
      _at += text.size();
      text = {};
    }
  }
  if (!text.empty()) {
    isUTF8(text) ? putEscaped(text) : putEscaped(toUTF8(text));
  }
  *_at++ = '"';
}

void TextWriter::putEscaped(std::string_view text) {
  constexpr std::size_t kPiece = 256, kLongestEscape = 6;
  constexpr char kDigits[] = "0123456789ABCDEF";
  for (; !text.empty(); text.remove_prefix(std::min(kPiece, text.size()))) {
    reserve(kPiece * kLongestEscape + kTextMore);
    for (const char c : text.substr(0, kPiece)) {
      const auto byte = static_cast<unsigned char>(c);
      if (byte >= 0x20 && c != '"' && c != '\\') {
        *_at++ = c;
        continue;
      }
      constexpr std::string_view kNamed = "\b\t\n\f\r\"\\", kNames = "btnfr\"\\";
      const std::size_t named = kNamed.find(c);
      *_at++ = '\\';
      if (named != std::string_view::npos) {
        *_at++ = kNames[named];
      } else {
        for (const char digit : {'u', '0', '0', kDigits[byte >> 4], kDigits[byte & 15]}) *_at++ = digit;
      }
    }
  }
}

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

// Writes to an excerpt.
class ExcerptWriter : public rapidjson::Writer<ExcerptStream> {
 public:
  using Writer::Writer;
  void String(std::string_view text) {
    if (!isUTF8(text)) return String(toUTF8(text));
    Writer::String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
  }
  void Key(std::string_view text) { String(text); }
};

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
      return writer.String(*value.asString());
    case Value::Type::date:
      writer.StartObject();
      writer.Key("$date");
      putReal(writer, value.asDate()->secondsSince1970);
      writer.EndObject();
      return;
    case Value::Type::data:
      writer.StartObject();
      writer.Key("$data");
      writer.String(encodeBase64(value.asData()->bytes));
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
        writer.Key(key);
        put(writer, held);
      }
      writer.EndObject();
      return;
  }
}

}  // namespace

void writeJSON(const Value& value, JSONStyle style, std::string& out) {
  TextWriter writer(out, style);
  put(writer, value);
}

std::string writeJSON(const Value& value, JSONStyle style, std::size_t expectedBytes) {
  std::string out;
  out.reserve(expectedBytes);
  writeJSON(value, style, out);
  return out;
}

JSONExcerpt excerptOfJSON(const Value& value, std::size_t most) {
  JSONExcerpt out;
  ExcerptStream stream(out, most);
  ExcerptWriter writer(stream);
  put(writer, value);
  const std::size_t whole = out.leftOut > 0 ? withoutIncompleteEnd(out.text).size() : out.text.size();
  out.leftOut += out.text.size() - whole;
  out.text.resize(whole);
  return out;
}

namespace {
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
  std::uint64_t word;
  for (; text.size() >= sizeof word; text.remove_prefix(sizeof word)) {
    std::memcpy(&word, text.data(), sizeof word);
    if (!isPlain(word)) bytes += escapesAtMost(text.substr(0, sizeof word));
  }
  return isPlain(shortWord(text)) ? bytes : bytes + escapesAtMost(text);
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
