// Writes the counters as JSON.
#include "platform/counters.h"

#include <unistd.h>

#include "formats/json.h"
#include "platform/file_store.h"
#include "platform/log.h"

namespace veltrad::platform {

std::uint64_t Counters::total() const {
  std::uint64_t sum = 0;
  for (const auto& count : _counts) sum += count.load(std::memory_order_relaxed);
  return sum;
}

void Counters::writeIfChanged(FileStore& files, const std::string& path, double startedAt) {
  if (!changed()) return;
  std::uint64_t sum = 0;  // of the counts written: other threads go on counting
  std::vector<Dictionary::Entry> counts;
  for (std::size_t i = 0; i < _counts.size(); ++i) {
    const std::uint64_t times = _counts[i].load(std::memory_order_relaxed);
    if (times > 0) counts.emplace_back(wire::kReasons[i].text, times);
    sum += times;
  }
  const Dictionary all{{"pid", static_cast<int>(::getpid())},
                       {"started", startedAt},
                       {"counts", Dictionary::fromEntries(std::move(counts))}};
  const auto written = files.replace(path, formats::writeJSON(all) + "\n", 0644);
  if (!written && !_failed)
    logError("The counters could not be written: %s", written.error().description.c_str());
  _failed = !written;
  if (written) _sumWritten.store(sum, std::memory_order_relaxed);
}

}  // namespace veltrad::platform
