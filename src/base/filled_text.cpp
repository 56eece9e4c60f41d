// SPDX-License-Identifier: Apache-2.0
// Fills in parts, and writes numbers.
#include "base/filled_text.h"

#include <charconv>
#include <cmath>
#include <cstdlib>

namespace veltrad {

std::string filled(std::string_view pattern, std::initializer_list<std::string> parts) {
  std::string text;
  for (const std::string& part : parts) {
    const std::size_t place = pattern.find("{}");
    if (place == std::string_view::npos) break;
    text.append(pattern.substr(0, place)).append(part);
    pattern.remove_prefix(place + 2);
  }
  return text.append(pattern);
}

std::string textOf(double number) {
  constexpr int kFirstWithExponent = 16;
  constexpr int kLastWithExponent = -5;
  char bytes[40];
  const auto write = [&bytes, number](std::chars_format format) {
    return std::string(bytes, std::to_chars(bytes, bytes + sizeof bytes, number, format).ptr);
  };
  std::string text = write(std::chars_format::scientific);
  if (!std::isfinite(number)) return text;
  const long exponent = std::strtol(text.c_str() + text.find('e') + 1, nullptr, 10);
  if (exponent > kLastWithExponent && exponent < kFirstWithExponent) return write(std::chars_format::fixed);
  return text;
}

}  // namespace veltrad
