// SPDX-License-Identifier: Apache-2.0
// What gateway and drain count, and its text. Any thread.
#pragma once

#include <array>
#include <atomic>
#include <chrono>
#include <cstdint>
#include <map>
#include <string>
#include <string_view>

#include "base/mutex.h"

namespace veltrad::gateway {

// A counter whose values are told apart by one label, of which there are few values.
class LabelledCounter {
 public:
  void add(std::string_view label, std::uint64_t count = 1);
  std::map<std::string, std::uint64_t> values() const;

 private:
  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::map<std::string, std::uint64_t, std::less<>> _values GUARDED_BY(_mutex);
};

// Of a gateway.
class Metrics {
 public:
  void published(std::chrono::steady_clock::duration took);

  std::atomic<std::uint64_t> events{0};
  std::atomic<std::uint64_t> posts{0};
  std::atomic<std::uint64_t> files{0};
  std::atomic<std::uint64_t> logData{0};
  std::atomic<std::int64_t> connections{0};
  LabelledCounter datagrams;
  LabelledCounter refused;

  // OpenMetrics. `held`: messages that the stream has not taken yet.
  std::string text(std::size_t held) const;

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
