// SPDX-License-Identifier: Apache-2.0
// The counted reasons for messages, posts, datagrams and files: one table for the daemon and its tools.
#pragma once

#include <cstddef>
#include <cstdint>
#include <iterator>
#include <string_view>

namespace veltrad::wire {

// Spelt as the names that other programs rely on, so that a search finds all uses.
enum class Reason : std::uint8_t {
#define VELTRA_REASON(concern, name, text) name,
#include "wire/reasons.def"
#undef VELTRA_REASON
};

struct ReasonEntry {
  // The kind of thing that is counted: "message", "log data".
  std::string_view concern;
  // [a-z][a-z0-9_]*, for programs.
  std::string_view name;
  // The event, then its cause; the key in run/veltrad/counters.json.
  std::string_view text;
};

inline constexpr ReasonEntry kReasons[] = {
#define VELTRA_REASON(concern, name, text) {concern, #name, text},
#include "wire/reasons.def"
#undef VELTRA_REASON
};
inline constexpr std::size_t kReasonCount = std::size(kReasons);

constexpr const ReasonEntry& entryOf(Reason reason) {
  return kReasons[static_cast<std::size_t>(reason)];
}

// The part of its text that says why.
constexpr std::string_view causeOf(Reason reason) {
  const std::string_view text = entryOf(reason).text;
  const std::size_t colon = text.find(": ");
  return colon == std::string_view::npos ? text : text.substr(colon + 2);
}

}  // namespace veltrad::wire
