// SPDX-License-Identifier: Apache-2.0
// Writes the counters as JSON.
#include "platform/counters.h"

#include <unistd.h>

#include "formats/json.h"

namespace veltrad::platform {

std::uint64_t Counters::total() const {
  std::uint64_t sum = 0;
  for (const auto& count : _counts->ofReason) sum += count.load(std::memory_order_relaxed);
  return sum;
}

std::string Counters::json(double startedAt) const {
  std::vector<Dictionary::Entry> counts;
  for (std::size_t i = 0; i < _counts->ofReason.size(); ++i) {
    const std::uint64_t times = _counts->ofReason[i].load(std::memory_order_relaxed);
    if (times > 0) counts.emplace_back(wire::kReasons[i].text, times);
  }
  const Dictionary all{{"pid", static_cast<int>(::getpid())},
                       {"started", startedAt},
                       {"counts", Dictionary::fromEntries(std::move(counts))}};
  return formats::writeJSON(all) + "\n";
}

}  // namespace veltrad::platform
