// SPDX-License-Identifier: Apache-2.0
// The counters of gateway and drain, and their OpenMetrics text. Any thread.
#pragma once

#include <array>
#include <atomic>
#include <chrono>
#include <cstdint>
#include <initializer_list>
#include <map>
#include <string>
#include <string_view>

#include "base/mutex.h"

namespace veltrad::gateway {

// A counter whose values are told apart by one label, of which there are few values. Only the first time that
// a value is counted wants memory.
class LabelledCounter {
 public:
  // Those that are known are counted without memory from the first time on.
  LabelledCounter(std::initializer_list<const char*> known) {
    for (const char* label : known) _values.emplace(label, 0);
  }
  void add(std::string_view label, std::uint64_t count = 1);
  std::map<std::string, std::uint64_t> values() const;

 private:
  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::map<std::string, std::uint64_t, std::less<>> _values GUARDED_BY(_mutex);
};

// The metrics of a gateway.
class Metrics {
 public:
  void published(std::chrono::steady_clock::duration took);

  std::atomic<std::uint64_t> events{0};
  std::atomic<std::uint64_t> posts{0};
  std::atomic<std::uint64_t> files{0};
  std::atomic<std::uint64_t> logData{0};
  LabelledCounter datagrams{"acknowledged", "taken", "held_too_long", "no_room", "no_memory"};
  LabelledCounter refused{"no_memory"};

  // OpenMetrics. `connections`: those that are open; `held`: messages that the stream has not taken yet.
  std::string text(std::size_t connections, std::size_t held) const;

 private:
  // In seconds; what took longer is in the last bucket.
  static constexpr std::array<double, 8> kBounds{0.001, 0.003, 0.01, 0.03, 0.1, 0.3, 1, 5};
  std::array<std::atomic<std::uint64_t>, kBounds.size() + 1> _buckets{};
  std::atomic<std::uint64_t> _microseconds{0};
};

// Parts of an OpenMetrics text.
std::string metricHead(std::string_view name, std::string_view type, std::string_view help);
std::string counterText(std::string_view name, std::string_view help, std::uint64_t value);
std::string counterText(std::string_view name, std::string_view label, std::string_view help,
                        const LabelledCounter& counter);
std::string gaugeText(std::string_view name, std::string_view help, double value);
inline constexpr const char* kEndOfMetrics = "# EOF\n";
inline constexpr const char* kMetricsType = "application/openmetrics-text; version=1.0.0; charset=utf-8";

}  // namespace veltrad::gateway
