// SPDX-License-Identifier: Apache-2.0
// UTF-8 (RFC 3629), lower case, percent-encoding, hexadecimal digits and log lines.
#include "base/text.h"

#include <algorithm>
#include <cstdint>

namespace veltrad {

namespace {

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";

std::uint8_t byteAt(std::string_view text, std::size_t i) {
  return static_cast<std::uint8_t>(text[i]);
}

bool isContinuation(std::uint8_t byte) {
  return (byte & 0xC0) == 0x80;
}

// Length of the sequence that begins with this byte; 0 if none does.
std::size_t sequenceLength(std::uint8_t first) {
  if (first < 0x80) return 1;
  if (first >= 0xC2 && first <= 0xDF) return 2;
  if ((first & 0xF0) == 0xE0) return 3;
  if (first >= 0xF0 && first <= 0xF4) return 4;
  return 0;
}

// In sequences of three or four bytes, the second one excludes overlong forms, surrogates and values above
// U+10FFFF.
bool isSecond(std::uint8_t first, std::uint8_t second) {
  switch (first) {
    case 0xE0:
      return second >= 0xA0 && second <= 0xBF;
    case 0xED:
      return second >= 0x80 && second <= 0x9F;
    case 0xF0:
      return second >= 0x90 && second <= 0xBF;
    case 0xF4:
      return second >= 0x80 && second <= 0x8F;
    default:
      return isContinuation(second);
  }
}

bool isControl(char32_t code) {
  return code < 0x20 || (code >= 0x7F && code <= 0x9F) || code == 0x2028 || code == 0x2029;
}

}  // namespace

UTF8Character characterAt(std::string_view text, std::size_t i) {
  const std::uint8_t first = byteAt(text, i);
  if (first < 0x80) return {1, first};
  const std::size_t length = sequenceLength(first);
  if (length == 0 || text.size() - i < length || !isSecond(first, byteAt(text, i + 1))) return {0, 0};
  std::uint32_t code = first & (0xFFu >> (length + 1));
  for (std::size_t k = 1; k < length; ++k) {
    const std::uint8_t next = byteAt(text, i + k);
    if (!isContinuation(next)) return {0, 0};
    code = code << 6 | (next & 0x3Fu);
  }
  return {length, code};
}

void appendUTF8(std::string& text, char32_t code) {
  const auto put = [&text](char32_t byte) { text += static_cast<char>(byte); };
  if (code < 0x80) return put(code);
  if (code < 0x800) {
    put(0xC0 | code >> 6);
  } else if (code < 0x10000) {
    put(0xE0 | code >> 12);
    put(0x80 | (code >> 6 & 0x3F));
  } else {
    put(0xF0 | code >> 18);
    put(0x80 | (code >> 12 & 0x3F));
    put(0x80 | (code >> 6 & 0x3F));
  }
  put(0x80 | (code & 0x3F));
}

bool isUTF8(std::string_view bytes) {
  if (isASCII(bytes)) return true;
  for (std::size_t i = 0; i < bytes.size();) {
    const std::size_t length = characterAt(bytes, i).length;
    if (length == 0) return false;
    i += length;
  }
  return true;
}

std::string toUTF8(std::string_view bytes) {
  std::string out;
  out.reserve(bytes.size());
  for (std::size_t i = 0; i < bytes.size();) {
    const std::size_t length = characterAt(bytes, i).length;
    out += length == 0 ? kReplacement : bytes.substr(i, length);
    i += length == 0 ? 1 : length;
  }
  return out;
}

std::string_view withoutIncompleteEnd(std::string_view text) {
  const std::size_t farthest = std::min<std::size_t>(text.size(), 3);
  for (std::size_t back = 1; back <= farthest; ++back) {
    const std::size_t start = text.size() - back;
    const std::uint8_t first = byteAt(text, start);
    if (isContinuation(first)) continue;
    const bool incomplete =
        sequenceLength(first) > back && (back == 1 || isSecond(first, byteAt(text, start + 1)));
    return incomplete ? text.substr(0, start) : text;
  }
  return text;
}

TextPlace placeInText(std::string_view text, std::size_t offset) {
  TextPlace place;
  for (const char c : text.substr(0, offset)) {
    if (c == '\n') {
      ++place.line;
      place.column = 1;
    } else if ((static_cast<unsigned char>(c) & 0xc0) != 0x80) {  // no continuation byte
      ++place.column;
    }
  }
  return place;
}

std::string_view trimmed(std::string_view text, std::string_view blanks) {
  const std::size_t first = text.find_first_not_of(blanks);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(blanks) - first + 1);
}

std::string percentEncoded(std::string_view text, std::string_view kept) {
  constexpr std::string_view kUnreserved =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-._~";
  std::string encoded;
  for (const char c : text) {
    if (kUnreserved.find(c) != std::string_view::npos || kept.find(c) != std::string_view::npos) {
      encoded += c;
    } else {
      encoded += '%' + hex({&c, 1}, kUpperCaseDigits);
    }
  }
  return encoded;
}

std::string hex(std::string_view bytes, const char* digits) {
  std::string text;
  text.reserve(2 * bytes.size());
  for (std::size_t i = 0; i < bytes.size(); ++i) {
    text += digits[byteAt(bytes, i) >> 4];
    text += digits[byteAt(bytes, i) & 0xF];
  }
  return text;
}

std::string escapedForLog(std::string_view text) {
  const auto plain = [](char c) { return c >= 0x20 && c < 0x7F && c != '\\'; };
  if (std::all_of(text.begin(), text.end(), plain)) return std::string(text);  // the most frequent case
  std::string out;
  out.reserve(text.size());
  for (std::size_t i = 0; i < text.size();) {
    const UTF8Character character = characterAt(text, i);
    const std::size_t length = std::max<std::size_t>(character.length, 1);
    const std::string_view bytes = text.substr(i, length);
    if (character.length == 0 || isControl(character.code)) {
      for (const char& byte : bytes) out += "\\x" + hex({&byte, 1}, kUpperCaseDigits);
    } else {
      out += bytes;
      if (character.code == '\\') out += '\\';
    }
    i += length;
  }
  return out;
}

}  // namespace veltrad
