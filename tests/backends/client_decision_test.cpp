// SPDX-License-Identifier: Apache-2.0
// The edge cases of the decision on a client entry and of its filters; tests with real processes cover the
// rest.
#include "backends/https/client_decision.h"

#include <gtest/gtest.h>

#include "backends/backend.h"
#include "backends/https/filter_table.h"
#include "formats/json.h"

namespace veltrad {
namespace {

TEST(ClientDecision, HoldsAtItsBorders) {
  const backends::ClientFacts facts{true, "DE", "Desktop", "Workbench 3", 0.3};
  backends::ClientFacts nowhere = facts, nothing = facts;
  nowhere.country.reset();
  nothing.hardwareType.reset();
  const Value equal(0.3), below(0.25);
  const auto country = [](Value threshold) {
    return Array{Dictionary{{"country", Array{"FR"}}, {"threshold", 0.0}},
                 Dictionary{{"country", Array{"AT", "DE"}}, {"threshold", std::move(threshold)}},
                 Dictionary{{"country", Array{"DE"}}, {"threshold", 0.0}}};
  };
  using enum wire::Reason;
  constexpr auto none = std::nullopt;
  const std::tuple<Dictionary, backends::ClientFacts, std::int32_t, std::optional<wire::Reason>> cases[] = {
      {{}, nowhere, 2, none},
      {{{"device_blacklist", Array{"x"}}}, nothing, 1, device_refused},
      {{{"sampling_threshold", equal}}, facts, 2, none},
      {{{"sampling_threshold", below}}, facts, 3, held_by_sampling},
      {{{"sampling_threshold", below}, {"override_sampling", 0.29}}, facts, 1, sampled_out},
      {{{"sampling_threshold", below}, {"override_sampling", equal}}, facts, 3, held_by_sampling},
      {{{"per_country_sampling_thresholds", country(0.1)}}, facts, 3, held_by_sampling},
      {{{"per_country_sampling_thresholds", country("x")}}, facts, 1, no_threshold}};
  for (const auto& [changes, who, state, reason] : cases) {
    Dictionary entry{{"locale_whitelist", Array{"de"}}, {"filters", Array{}}, {"sampling_threshold", 0.5}};
    entry.merge(changes);
    const backends::ClientVerdict verdict =
        backends::decideOnClient(config::parsed<config::ClientEntry>(entry), who);
    EXPECT_EQ(verdict.state, state) << formats::writeJSON(changes);
    EXPECT_TRUE(verdict.reason == reason) << formats::writeJSON(changes);
  }
}

config::Filters parsed(const Array& filters) {
  return *config::parsed<config::ClientEntry>({{"filters", filters}}).filters;
}

TEST(FilterTable, TheFirstRecordThatFitsDecidesAndAnEmptyArrayChangesNothing) {
  const auto filter = [](const char* key, const char* action, Dictionary more = {}) {
    more.merge({{"key", key}, {"action", action}});
    return more;
  };
  const Dictionary event{{"_method", 3}, {"_status", 0}, {"Mac", "m"}};
  const Dictionary without{{"_method", 3}, {"_status", 0}};
  const std::tuple<Array, Dictionary, Dictionary> rows[] = {
      {{filter("mac", "keep", {{"status", 0}}), filter("mac", "remove")}, event, event},
      {{filter("mac", "", {{"status", 1}}), filter("mac", "remove")}, event, without},
      {{filter("_STATUS", "remove")}, event, {{"_method", 3}, {"Mac", "m"}}},
      {{Dictionary{{"action", "remove"}}, "junk"}, event, event},
      {{filter("n", "remove", {{"method", 0}, {"status", 0}})}, {{"n", 1}}, {}}};
  for (const auto& [filters, before, after] : rows) {
    const auto given = parsed(filters);
    backends::FilterTable table;
    table.createFiltersFromArray(given);
    table.createFiltersFromArray({});
    Dictionary filtered = before;
    config::EditedFields edits;
    const auto outcome = table.filterEvent(filtered, edits);
    EXPECT_EQ(filtered, after) << formats::writeJSON(filters);
    EXPECT_EQ(outcome.removed, edits.removed.size());
    for (const std::string& name : edits.removed) EXPECT_TRUE(before.contains(name) && !after.contains(name));
  }
  const auto first = parsed({filter("mac", "remove")}), second = parsed({filter("other", "remove")});
  backends::FilterTable table;
  table.createFiltersFromArray(first);
  table.createFiltersFromArray(second);
  Dictionary kept = event;
  config::EditedFields edits;
  EXPECT_EQ(table.filterEvent(kept, edits).removed, 0u);
  EXPECT_TRUE(edits.empty());
}

}  // namespace
}  // namespace veltrad
