// SPDX-License-Identifier: Apache-2.0
// Formats texts without a library, because every library that libveltra links is loaded into every program
// that reports.
#pragma once

#include <concepts>
#include <initializer_list>
#include <string>
#include <string_view>

namespace veltrad {

inline std::string textOf(std::string_view text) {
  return std::string(text);
}
template <std::integral T>
std::string textOf(T number) {
  return std::to_string(number);
}
// The shortest text that reads back as the same number: "12.5", "1e+16", "-nan".
std::string textOf(double number);

// `pattern` with each "{}" replaced by the next part.
std::string filled(std::string_view pattern, std::initializer_list<std::string> parts);
template <typename... Parts>
std::string filled(std::string_view pattern, const Parts&... parts) {
  return filled(pattern, {textOf(parts)...});
}

}  // namespace veltrad
