// Reads one line of `veltractl session`. Pure functions; any thread.
#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <string_view>

#include "base/result.h"
#include "base/value.h"
#include "tools/ctl/operation.h"

namespace veltrad::ctl {

// Bytes of a line without its line break, as many as the largest call has; a longer one is malformed.
inline constexpr std::size_t kLongestLine = 64u << 20;
inline constexpr std::chrono::milliseconds kLongestSleep = std::chrono::hours(1);

struct SessionLine {
  Operation operation = Operation::flush;  // never start
  Dictionary message;                      // send: the line without "op"
  std::optional<Dictionary> userInfo;      // states
  std::string path;                        // uploadFile
  Array data;                              // uploadLogData
  std::chrono::milliseconds duration{0};   // sleep
};

// Nothing but blanks: the session skips it.
bool isBlankLine(std::string_view line);

// A JSON object such as {"op":"send","category":5,"type":1,"payload":{"codec":"opus"},"flag":0}. "category"
// and "type" of a send are the daemon's to judge and stay as they are; every other field must have its type.
// Fields that no operation knows are ignored. The failure says in one line what is wrong and what was
// expected.
Result<SessionLine, std::string> parseSessionLine(std::string_view line);

}  // namespace veltrad::ctl
