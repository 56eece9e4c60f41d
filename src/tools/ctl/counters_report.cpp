// SPDX-License-Identifier: Apache-2.0
// Formats the daemon's counters.
#include "tools/ctl/counters_report.h"

#include <fmt/chrono.h>
#include <fmt/format.h>

#include <algorithm>
#include <ctime>

#include "base/text.h"
#include "formats/json.h"

namespace veltrad::ctl {
namespace {

std::string formatTime(double secondsSince1970) {
  // Years with more than four digits are not formatted.
  if (!(secondsSince1970 >= 0 && secondsSince1970 < 253402300800.0))
    return fmt::format("{}", secondsSince1970);
  const auto seconds = static_cast<std::time_t>(secondsSince1970);
  std::tm parts{};
  gmtime_r(&seconds, &parts);
  return fmt::format("{:%Y-%m-%d %H:%M:%S} UTC", parts);
}

}  // namespace

std::optional<CountersReport> readCounters(std::string_view json) {
  const auto parsed = formats::parseJSON(json);
  const Dictionary* file = parsed ? parsed.value().asDictionary() : nullptr;
  const Value* pid = file ? file->find("pid") : nullptr;
  const Dictionary* counts = file ? file->dictionary("counts") : nullptr;
  const auto number = pid ? pid->toInt64() : std::nullopt;
  const auto started = file ? file->real("started") : std::nullopt;
  if (!number || !started || !counts) return std::nullopt;
  return CountersReport{*number, *started, *counts};
}

std::string formatCounters(const CountersReport& report) {
  std::string text = fmt::format("veltrad, process {}, started {}", report.pid, formatTime(report.started));
  if (report.counts.empty()) return text + "\nnothing counted yet";
  std::size_t width = std::string_view("count").size();
  for (const auto& [reason, count] : report.counts) width = std::max(width, formats::writeJSON(count).size());
  text += fmt::format("\n\n{:>{}}  reason", "count", width);
  for (const auto& [reason, count] : report.counts) {
    text += fmt::format("\n{:>{}}  {}", formats::writeJSON(count), width, escapedForLog(reason));
  }
  return text;
}

}  // namespace veltrad::ctl
