// SPDX-License-Identifier: Apache-2.0
// Takes samples and writes the report.
#include "census.h"

#include <utility>

namespace veltrad::simulate {

void Census::sample(std::uint8_t newest) {
  samples.push_back({on, reporting, silenced, held, keptPosts, keptEvents, withBag[newest], withBag[0],
                     std::exchange(sessions, 0), std::exchange(sessionsReporting, 0)});
}

Dictionary Census::report() const {
  static constexpr std::pair<const char*, std::int64_t Sample::*> kNumbers[] = {
      {"on", &Sample::on},
      {"reporting", &Sample::reporting},
      {"silenced", &Sample::silenced},
      {"held", &Sample::held},
      {"keptPosts", &Sample::keptPosts},
      {"keptEvents", &Sample::keptEvents},
      {"newest", &Sample::newest},
      {"without", &Sample::without},
      {"sessions", &Sample::sessions},
      {"sessionsReporting", &Sample::sessionsReporting}};
  Dictionary minutes;
  for (const auto& [name, number] : kNumbers) {
    Array values;
    for (const Sample& one : samples) values.emplace_back(one.*number);
    minutes.set(name, std::move(values));
  }
  return {
      {"minutes", std::move(minutes)},
      {"totals", Dictionary{{"delivered", delivered}, {"lost", lost}, {"held", held}, {"kept", keptEvents}}}};
}

}  // namespace veltrad::simulate
