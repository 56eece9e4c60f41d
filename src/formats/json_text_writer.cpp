// SPDX-License-Identifier: Apache-2.0
// Writes numbers and texts, and escapes what needs it.
#include "formats/json_text_writer.h"

#include <rapidjson/internal/dtoa.h>
#include <rapidjson/internal/itoa.h>

#include "base/text.h"

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

}  // namespace

void JSONTextWriter::Int64(std::int64_t number) {
  begin(kNumber);
  _at = rapidjson::internal::i64toa(number, _at);
}

void JSONTextWriter::Uint64(std::uint64_t number) {
  begin(kNumber);
  _at = rapidjson::internal::u64toa(number, _at);
}

void JSONTextWriter::Double(double number) {
  begin(kNumber);
  _at = rapidjson::internal::dtoa(number, _at);
}

// Uses up the capacity before it allocates, so that a text whose length was foreseen keeps its buffer.
void JSONTextWriter::grow(std::size_t bytes) {
  constexpr std::size_t kStep = 1024;  // resize() fills with zeros, so no more than is needed soon
  const std::size_t before = used(), step = std::max(bytes, kStep);
  const bool fits = before + bytes <= _out.capacity();
  _out.resize(fits ? std::min(before + step, _out.capacity()) : before + step);
  _at = _out.data() + before;
}

// There is room for the text if nothing in it needs an escape, which is tested for eight characters at a
// time.
void JSONTextWriter::putText(std::string_view text) {
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

void JSONTextWriter::putEscaped(std::string_view text) {
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

}  // namespace veltrad::formats
