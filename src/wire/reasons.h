// Why a message, or what carries it, fared as it did: one table for counters, tools and both ends.
#pragma once

#include <cstddef>
#include <cstdint>
#include <iterator>
#include <string_view>

namespace veltrad::wire {

// Spelt as their machine names, which other programs rely on: a search for one finds all its places.
enum class Reason : std::uint8_t {
#define VELTRA_REASON(concern, name, text) name,
#include "wire/reasons.def"
#undef VELTRA_REASON
};

struct ReasonEntry {
  std::string_view concern;  // what is counted: "message", "log data"
  std::string_view name;     // [a-z][a-z0-9_]*, for programs
  std::string_view text;     // what happened, then why; the key in run/veltrad/counters.json
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

}  // namespace veltrad::wire
