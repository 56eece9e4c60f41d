// SPDX-License-Identifier: Apache-2.0
// The daemon's metrics as OpenMetrics text.
#include "daemon/metrics.h"

#include <fmt/format.h>

#include <iterator>
#include <string_view>

#include "base/version.h"
#include "platform/counters.h"

namespace veltrad::daemon {

namespace {

using Output = std::back_insert_iterator<std::string>;

void family(Output out, std::string_view name, std::string_view type, std::string_view help) {
  fmt::format_to(out, "# TYPE {} {}\n", name, type);
  for (const std::string_view unit : {"bytes", "seconds"}) {
    if (name.ends_with(unit)) fmt::format_to(out, "# UNIT {} {}\n", name, unit);
  }
  fmt::format_to(out, "# HELP {} {}\n", name, help);
}

template <typename Number>
void gauge(Output out, std::string_view name, Number value, std::string_view help) {
  family(out, name, "gauge", help);
  fmt::format_to(out, "{} {}\n", name, value);
}

}  // namespace

std::string metricsText(const platform::Counters& counters, const Gauges& gauges,
                        std::uint64_t residentBytes) {
  std::string text;
  const Output out(text);
  family(out, "veltrad_build", "info", "The running program.");
  fmt::format_to(out, "veltrad_build_info{{version=\"{}\"}} 1\n", kVersion);
  family(out, "veltrad_messages", "counter", "Messages taken in.");
  fmt::format_to(out, "veltrad_messages_total {}\n", counters.value(wire::Reason::message_taken_in));
  family(out, "veltrad_outcomes", "counter",
         "What became of messages and of what carries them, by the reasons of veltractl stats.");
  for (std::size_t at = 0; at < wire::kReasonCount; ++at) {
    fmt::format_to(out, "veltrad_outcomes_total{{reason=\"{}\"}} {}\n", wire::kReasons[at].name,
                   counters.value(static_cast<wire::Reason>(at)));
  }
  gauge(out, "veltrad_sessions", gauges.sessions, "Sessions that are open.");
  gauge(out, "veltrad_connections", gauges.connections, "Connections of clients that are open.");
  gauge(out, "veltrad_posts_under_way", gauges.postsUnderWay, "Event posts without an answer yet.");
  gauge(out, "veltrad_spool_posts", gauges.spoolPosts, "Posts that failed and are kept to be sent again.");
  gauge(out, "veltrad_spool_bytes", gauges.spoolBytes, "Their files.");
  gauge(out, "veltrad_charged_memory_bytes", gauges.chargedBytes, "Memory that is kept for clients.");
  gauge(out, "veltrad_resident_memory_bytes", residentBytes, "Resident memory of the process.");
  gauge(out, "veltrad_start_time_seconds", gauges.started, "When the process started, since 1970.");
  text += "# EOF\n";
  return text;
}

}  // namespace veltrad::daemon
