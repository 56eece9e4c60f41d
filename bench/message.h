// SPDX-License-Identifier: Apache-2.0
// The message that every benchmark sends: eight texts, a real and an integer.
#pragma once

#include <cstdint>
#include <string>

namespace bench {

constexpr int kTexts = 8;
constexpr double kSeconds = 12.5;
constexpr std::int64_t kCount = 42;
constexpr std::uint16_t kCategory = 5;
constexpr std::uint16_t kType = 2;

inline std::string keyOfText(int number) {
  return "field" + std::to_string(number);
}
inline std::string textOf(int number) {
  return "value number " + std::to_string(number);
}

}  // namespace bench
