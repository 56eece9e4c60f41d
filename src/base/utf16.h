// SPDX-License-Identifier: Apache-2.0
// Conversion between big-endian UTF-16 and UTF-8, character by character and without a copy.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "base/text.h"

namespace veltrad {

// Calls `take(char32_t)` for every character of a UTF-16 text. A lone surrogate becomes U+FFFD; an odd byte
// at the end is ignored.
template <typename Take>
void forEachUTF16Character(std::string_view bytes, Take take) {
  const auto byte = [&](std::size_t i) { return char32_t{static_cast<std::uint8_t>(bytes[i])}; };
  const auto unitAt = [&](std::size_t i) { return byte(2 * i) << 8 | byte(2 * i + 1); };
  const std::size_t units = bytes.size() / 2;
  for (std::size_t i = 0; i < units; ++i) {
    const char32_t unit = unitAt(i);
    if (unit < 0xD800 || unit > 0xDFFF) {
      take(unit);
      continue;
    }
    const char32_t next = i + 1 < units ? unitAt(i + 1) : 0;
    if (unit <= 0xDBFF && next >= 0xDC00 && next <= 0xDFFF) {
      take(0x10000 + ((unit - 0xD800) << 10) + (next - 0xDC00));
      ++i;
    } else {
      take(char32_t{0xFFFD});
    }
  }
}

inline std::size_t utf8LengthOfUTF16(std::string_view bytes) {
  std::size_t length = 0;
  forEachUTF16Character(bytes, [&](char32_t code) {
    length += code < 0x80 ? 1u : code < 0x800 ? 2u : code < 0x10000 ? 3u : 4u;
  });
  return length;
}

// Calls `take(char16_t)` for every UTF-16 unit of a UTF-8 text. An invalid byte becomes U+FFFD.
template <typename Take>
void forEachUTF16Unit(std::string_view text, Take take) {
  for (std::size_t i = 0; i < text.size();) {
    const UTF8Character character = characterAt(text, i);
    const char32_t code = character.length == 0 ? char32_t{0xFFFD} : character.code;
    if (code >= 0x10000) {
      take(static_cast<char16_t>(0xD800 + ((code - 0x10000) >> 10)));
      take(static_cast<char16_t>(0xDC00 + ((code - 0x10000) & 0x3FF)));
    } else {
      take(static_cast<char16_t>(code));
    }
    i += character.length == 0 ? 1 : character.length;
  }
}

inline std::size_t utf16UnitCount(std::string_view text) {
  std::size_t count = 0;
  forEachUTF16Unit(text, [&](char16_t) { ++count; });
  return count;
}

}  // namespace veltrad
