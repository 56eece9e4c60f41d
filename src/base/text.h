// UTF-8, letter case and the escaping of log lines. Pure functions; any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

namespace veltrad {

// Eight bytes at a time; the last word overlaps the one before it.
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
  std::size_t length;  // in bytes; 0: the byte begins no valid sequence
  char32_t code;
};
// `i` is below the size.
UTF8Character characterAt(std::string_view bytes, std::size_t i);
// `code` is a Unicode scalar value.
void appendUTF8(std::string& text, char32_t code);

// RFC 3629: no surrogates, no overlong forms, nothing above U+10FFFF.
bool isUTF8(std::string_view bytes);
// Each byte that belongs to no valid sequence becomes U+FFFD.
std::string toUTF8(std::string_view bytes);
// Loses an incomplete sequence at the end, nothing else.
std::string_view withoutIncompleteEnd(std::string_view text);

// Unicode's simple lower-case mapping, character by character. Bytes that are no UTF-8 stay as they are.
std::string lowerCase(std::string_view text);
bool equalIgnoringCase(std::string_view a, std::string_view b);
bool containsIgnoringCase(std::string_view text, std::string_view part);

// Both from 1; the column counts characters.
struct TextPlace {
  std::size_t line = 1;
  std::size_t column = 1;
};
// Of the byte at `offset`; of the end for one beyond it. Lines end at "\n".
TextPlace placeInText(std::string_view text, std::size_t offset);

// Keeps letters, digits, "-._~" and what `kept` holds, all ASCII; each other byte becomes "%" and two digits.
std::string percentEncoded(std::string_view text, std::string_view kept);

inline constexpr const char* kUpperCaseDigits = "0123456789ABCDEF";
// Two hexadecimal digits a byte: "0a3f".
std::string hex(std::string_view bytes, const char* digits = "0123456789abcdef");

// For one log line: valid UTF-8 stays; controls, DEL, C1 controls, U+2028, U+2029 and bytes that are no UTF-8
// become \xNN for each byte; a backslash is doubled.
std::string escapedForLog(std::string_view text);

}  // namespace veltrad
