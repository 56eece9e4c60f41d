// SPDX-License-Identifier: Apache-2.0
// Parses the input lines of `veltractl session`.
#pragma once

#include <chrono>
#include <string>
#include <string_view>

#include "base/result.h"
#include "base/value.h"
#include "tools/ctl/operation.h"

namespace veltrad::ctl {

// The largest number of bytes of a line without its line break; the same as for a call.
inline constexpr std::size_t kLongestLine = 64u << 20;
inline constexpr std::chrono::milliseconds kLongestSleep = std::chrono::hours(1);

struct SessionLine {
  Operation operation;
  // The line without "op". Those that the operation reads have the right type.
  Dictionary fields;
  // Of a sleep.
  std::chrono::milliseconds duration{0};
};

// Blank lines are skipped.
bool isBlankLine(std::string_view line);

// Parses a JSON object such as {"op":"send","category":5,"type":1,"payload":{"codec":"opus"},"flag":0}. The
// daemon checks "category" and "type" of a send; other fields must have the right type. Unknown fields are
// ignored. The error is one line that says what is wrong and what was expected.
Result<SessionLine, std::string> parseSessionLine(std::string_view line);

}  // namespace veltrad::ctl
