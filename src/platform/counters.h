// Counts by reason what happens to messages, from any thread and without locks.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <string>

#include "wire/reasons.h"

namespace veltrad::platform {

class FileStore;

// The file run/veltrad/counters.json is {"pid": n, "started": seconds since 1970, "counts": {text: n}}, with
// the texts of wire/reasons.def. Counts of 0 are left out.
class Counters {
 public:
  void count(wire::Reason reason, std::uint64_t times = 1) {
    _counts[static_cast<std::size_t>(reason)].fetch_add(times, std::memory_order_relaxed);
  }
  std::uint64_t value(wire::Reason reason) const {
    return _counts[static_cast<std::size_t>(reason)].load(std::memory_order_relaxed);
  }
  // Of all counts.
  std::uint64_t total() const;
  // Since the last time that they were written.
  bool changed() const { return total() != _sumWritten.load(std::memory_order_relaxed); }

  // Replaces the file (mode 0644) if changed(). After a failure the next call tries again; only the first
  // failure in a row is logged. One thread at a time.
  void writeIfChanged(FileStore& files, const std::string& path, double startedAt);

 private:
  static constexpr std::uint64_t kNever = UINT64_MAX;

  std::array<std::atomic<std::uint64_t>, wire::kReasonCount> _counts{};
  // Counts only grow, so equal sums mean equal counts.
  std::atomic<std::uint64_t> _sumWritten{kNever};
  // Used only by the thread that writes.
  bool _failed = false;
};

}  // namespace veltrad::platform
