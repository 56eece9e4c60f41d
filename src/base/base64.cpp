// SPDX-License-Identifier: Apache-2.0
// Base64 encoding and decoding with lookup tables.
#include "base/base64.h"

#include <array>
#include <cstdint>

namespace veltrad {

namespace {

constexpr std::string_view kAlphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr std::uint8_t kSkipped = 64;

constexpr std::array<std::uint8_t, 256> makeDigits() {
  std::array<std::uint8_t, 256> digits{};
  for (auto& digit : digits) digit = kSkipped;
  for (std::size_t i = 0; i < kAlphabet.size(); ++i) {
    digits[static_cast<std::uint8_t>(kAlphabet[i])] = static_cast<std::uint8_t>(i);
  }
  return digits;
}
constexpr std::array<std::uint8_t, 256> kDigits = makeDigits();

char digit(std::uint32_t group, int shift) {
  return kAlphabet[(group >> shift) & 0x3F];
}

}  // namespace

std::string encodeBase64(std::string_view bytes) {
  std::string out;
  out.reserve((bytes.size() + 2) / 3 * 4);
  const auto at = [&](std::size_t i) { return std::uint32_t{static_cast<std::uint8_t>(bytes[i])}; };
  std::size_t i = 0;
  for (; i + 3 <= bytes.size(); i += 3) {
    const std::uint32_t group = at(i) << 16 | at(i + 1) << 8 | at(i + 2);
    const char digits[] = {digit(group, 18), digit(group, 12), digit(group, 6), digit(group, 0)};
    out.append(digits, 4);
  }
  const std::size_t left = bytes.size() - i;
  if (left > 0) {
    const std::uint32_t group = at(i) << 16 | (left == 2 ? at(i + 1) << 8 : 0);
    const char digits[] = {digit(group, 18), digit(group, 12), left == 2 ? digit(group, 6) : '=', '='};
    out.append(digits, 4);
  }
  return out;
}

std::optional<std::string> decodeBase64(std::string_view text) {
  std::string out;
  out.reserve(text.size() / 4 * 3 + 3);
  std::uint32_t group = 0;
  int digits = 0;
  int padding = 0;
  for (const char c : text) {
    if (c == '=') {
      ++padding;
      if (digits < 2 || digits + padding > 4) return std::nullopt;
      continue;
    }
    const std::uint8_t value = kDigits[static_cast<std::uint8_t>(c)];
    if (value == kSkipped) continue;
    if (padding > 0) return std::nullopt;
    group = group << 6 | value;
    if (++digits < 4) continue;
    const char bytes[] = {static_cast<char>(group >> 16), static_cast<char>(group >> 8),
                          static_cast<char>(group)};
    out.append(bytes, 3);
    group = 0;
    digits = 0;
  }
  if (digits == 0) return out;
  if (digits + padding != 4) return std::nullopt;
  group <<= 6 * padding;
  out.push_back(static_cast<char>(group >> 16));
  if (digits == 3) out.push_back(static_cast<char>(group >> 8));
  return out;
}

}  // namespace veltrad
