// SPDX-License-Identifier: Apache-2.0
// Writes OpenMetrics.
#include "gateway/metrics.h"

#include <fmt/format.h>

#include <algorithm>

#include "base/version.h"

namespace veltrad::gateway {

void LabelledCounter::add(std::string_view label, std::uint64_t count) {
  const Lock hold(_mutex);
  const auto found = _values.find(label);
  if (found == _values.end())
    _values.emplace(label, count);
  else
    found->second += count;
}

std::map<std::string, std::uint64_t> LabelledCounter::values() const {
  const Lock hold(_mutex);
  return {_values.begin(), _values.end()};
}

std::string metricHead(std::string_view name, std::string_view type, std::string_view help) {
  const std::string unit = name.ends_with("_seconds") ? fmt::format("# UNIT {} seconds\n", name) : "";
  return fmt::format("# TYPE {} {}\n{}# HELP {} {}\n", name, type, unit, name, help);
}

std::string counterText(std::string_view name, std::string_view help, std::uint64_t value) {
  return metricHead(name, "counter", help) + fmt::format("{}_total {}\n", name, value);
}

std::string counterText(std::string_view name, std::string_view label, std::string_view help,
                        const LabelledCounter& counter) {
  std::string text = metricHead(name, "counter", help);
  for (const auto& [key, value] : counter.values())
    text += fmt::format("{}_total{{{}=\"{}\"}} {}\n", name, label, key, value);
  return text;
}

std::string gaugeText(std::string_view name, std::string_view help, double value) {
  return metricHead(name, "gauge", help) + fmt::format("{} {}\n", name, value);
}

void Metrics::published(std::chrono::steady_clock::duration took) {
  const double seconds = std::chrono::duration<double>(took).count();
  const auto bucket = std::lower_bound(kBounds.begin(), kBounds.end(), seconds) - kBounds.begin();
  _buckets[static_cast<std::size_t>(bucket)].fetch_add(1, std::memory_order_relaxed);
  _microseconds.fetch_add(static_cast<std::uint64_t>(seconds * 1e6), std::memory_order_relaxed);
}

std::string Metrics::text(std::size_t connections, std::size_t held) const {
  std::string text = metricHead("veltra_gateway_build", "info", "The running program.") +
                     fmt::format("veltra_gateway_build_info{{version=\"{}\"}} 1\n", kVersion);
  text += counterText("veltra_gateway_events", "Events of posts that were answered 200.", events);
  text += counterText("veltra_gateway_posts", "Posts of events that were answered 200.", posts);
  text += counterText("veltra_gateway_files", "Files that were answered 200.", files);
  text += counterText("veltra_gateway_log_data", "Log data that was answered 200.", logData);
  text += counterText("veltra_gateway_datagrams", "result", "Datagrams, by what became of them.", datagrams);
  text +=
      counterText("veltra_gateway_refused", "reason", "Requests that were refused, by the reason.", refused);
  text += gaugeText("veltra_gateway_connections", "Open connections.", static_cast<double>(connections));
  text += gaugeText("veltra_gateway_held", "Messages that the stream has not taken yet.",
                    static_cast<double>(held));
  text += metricHead("veltra_gateway_publish_seconds", "histogram",
                     "From the end of a request to the stream's answer.");
  std::uint64_t count = 0;
  for (std::size_t at = 0; at <= kBounds.size(); ++at) {
    count += _buckets[at];
    text += fmt::format("veltra_gateway_publish_seconds_bucket{{le=\"{}\"}} {}\n",
                        at < kBounds.size() ? fmt::format("{:#}", kBounds[at]) : "+Inf", count);
  }
  text += fmt::format("veltra_gateway_publish_seconds_count {}\nveltra_gateway_publish_seconds_sum {}\n",
                      count, static_cast<double>(_microseconds) / 1e6);
  return text + kEndOfMetrics;
}

}  // namespace veltrad::gateway
