// SPDX-License-Identifier: Apache-2.0
// Functions on texts: UTF-8, letter case, trimming and escaping.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

namespace veltrad {

// Reads eight bytes at a time; the last word overlaps the one before it.
inline bool isASCII(std::string_view bytes) {
  constexpr std::uint64_t kHighBits = 0x8080808080808080u;
  const std::size_t size = bytes.size();
  std::uint64_t seen = 0;
  std::uint64_t word;
  if (size >= 8) {
    for (std::size_t i = 0; i + 8 <= size; i += 8) {
      std::memcpy(&word, bytes.data() + i, 8);
      seen |= word;
    }
    std::memcpy(&word, bytes.data() + size - 8, 8);
    seen |= word;
  } else {
    for (const char c : bytes) seen |= static_cast<unsigned char>(c);
  }
  return (seen & kHighBits) == 0;
}

struct UTF8Character {
  // In bytes; 0 if no valid sequence begins here.
  std::size_t length;
  char32_t code;
};
// `i` must be less than the size.
UTF8Character characterAt(std::string_view bytes, std::size_t i);
// `code` is a Unicode scalar value.
void appendUTF8(std::string& text, char32_t code);

bool isUTF8(std::string_view bytes);
// Replaces each byte that belongs to no valid sequence by U+FFFD.
std::string toUTF8(std::string_view bytes);
// Removes an incomplete sequence at the end.
std::string_view withoutIncompleteEnd(std::string_view text);

// Unicode's simple lower-case mapping of each character. Bytes that are not valid UTF-8 are kept.
std::string lowerCase(std::string_view text);
bool equalIgnoringCase(std::string_view a, std::string_view b);
bool containsIgnoringCase(std::string_view text, std::string_view part);

// Both from 1; the column counts characters.
struct TextPlace {
  std::size_t line = 1;
  std::size_t column = 1;
};
// The place of the byte at `offset`, or of the end if `offset` is beyond it. Lines end at "\n".
TextPlace placeInText(std::string_view text, std::size_t offset);

// Without the characters of `blanks` at either end.
std::string_view trimmed(std::string_view text, std::string_view blanks = " \t\r\n");

// Keeps ASCII letters and digits, "-._~" and the characters of `kept`; every other byte becomes "%" and two
// digits.
std::string percentEncoded(std::string_view text, std::string_view kept);

inline constexpr const char* kUpperCaseDigits = "0123456789ABCDEF";
// Two hexadecimal digits for each byte: "0a3f".
std::string hex(std::string_view bytes, const char* digits = "0123456789abcdef");

// Escapes a text for one log line: control characters (C0, DEL, C1), U+2028, U+2029 and bytes that are not
// valid UTF-8 become \xNN, byte by byte, and a backslash is doubled.
std::string escapedForLog(std::string_view text);

}  // namespace veltrad
