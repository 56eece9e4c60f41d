// SPDX-License-Identifier: Apache-2.0
// Writes JSON directly into a string.
#pragma once

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

#include "base/value.h"

namespace veltrad::formats {

// Writes compact JSON, with the events of RapidJSON's writers, but asks only once for each text or number
// whether there is room, not for each character.
class JSONTextWriter {
 public:
  // Overwrites `out`, whose capacity it uses before it allocates more. The text is complete once the writer
  // has ended.
  explicit JSONTextWriter(std::string& out) : _out(out) {
    _out.clear();
    _at = _out.data();
  }
  JSONTextWriter(const JSONTextWriter&) = delete;
  ~JSONTextWriter() { _out.resize(used()); }

  void Null() { putWord("null"); }
  void Bool(bool value) { putWord(value ? "true" : "false"); }
  void Int64(std::int64_t number);
  void Uint64(std::uint64_t number);
  // Finite.
  void Double(double number);
  // An invalid byte becomes U+FFFD.
  void String(std::string_view text) {
    begin(text.size() + kTextMore);
    putText(text);
  }
  void Key(std::string_view text) {
    String(text);
    *_at++ = ':';
    _follows = false;
  }
  void StartObject() { open('{'); }
  void EndObject() { close('}'); }
  void StartArray() { open('['); }
  void EndArray() { close(']'); }

 private:
  static constexpr std::size_t kNumber = 32, kWord = sizeof(std::uint64_t);
  // The quotes, what follows a key, and up to a word that is written beyond the end.
  static constexpr std::size_t kTextMore = 4 + kWord;

  std::size_t used() const { return static_cast<std::size_t>(_at - _out.data()); }
  void reserve(std::size_t bytes) {
    if (_out.size() - used() < bytes) grow(bytes);
  }
  void grow(std::size_t bytes);
  // Makes room for the next value or key, and writes the comma that precedes it.
  void begin(std::size_t bytes) {
    reserve(bytes + 1);
    if (_follows) *_at++ = ',';
    _follows = true;
  }
  void open(char bracket) {
    begin(1);
    *_at++ = bracket;
    _follows = false;
  }
  void close(char bracket) {
    reserve(1);
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
  char* _at = nullptr;
  // Whether a comma must precede the next value or key.
  bool _follows = false;
};

// Writes a value of any type, as writeJSON does.
void putValue(JSONTextWriter& writer, const Value& value);

}  // namespace veltrad::formats
