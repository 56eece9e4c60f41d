// The decision on a client entry, and the lists and filters that it rests on, as tables.
#include "backends/https/client_decision.h"

#include <gtest/gtest.h>

#include "backends/backend.h"
#include "backends/https/filter_table.h"
#include "backends/https/text_lists.h"

namespace veltrad {
namespace {

Dictionary with(Dictionary entry, Dictionary more) {
  entry.merge(more);
  return entry;
}

// An entry that lets this client report.
Dictionary goodEntry() {
  return {{"locale_whitelist", Array{"de"}}, {"filters", Array{}}, {"sampling_threshold", 0.5}};
}

ClientFacts goodFacts() {
  return {true, "DE", "Desktop", "Workbench 3", 0.3};
}

struct Case {
  const char* name;
  Dictionary changes;
  std::function<void(ClientFacts&)> facts;
  std::int32_t state;
  ClientRefusal refusal;
  std::int32_t dnuType = 0;
};

TEST(ClientDecision, FollowsTheTable) {
  const auto same = [](ClientFacts&) {};
  const auto noConsent = [](ClientFacts& facts) { facts.consent = false; };
  const auto thresholds = [](const char* country, Value threshold) {
    return Array{Dictionary{{"country", Array{"FR"}}, {"threshold", 0.0}},
                 Dictionary{{"country", Array{"AT", country}}, {"threshold", std::move(threshold)}},
                 Dictionary{{"country", Array{country}}, {"threshold", 0.0}}};
  };
  using enum ClientRefusal;
  const std::vector<Case> cases{
      {"as it is", {}, same, 2, none},
      {"no consent", {}, noConsent, 1, consentMissing},
      {"override 2 is no override", {{"override_dnu", 2}}, noConsent, 1, consentMissing},
      {"override without consent", {{"override_dnu", 1}}, noConsent, 2, none, 1},
      {"override with consent", {{"override_dnu", true}}, same, 2, none, 2},
      {"an override that is a text is none", {{"override_dnu", "1"}}, noConsent, 1, consentMissing},
      {"an empty country list refuses everyone", {{"locale_whitelist", Array{}}}, same, 1, countryNotListed},
      {"no country passes a list", {}, [](ClientFacts& facts) { facts.country.reset(); }, 2, none},
      {"another country", {{"locale_whitelist", Array{"fr", "at"}}}, same, 1, countryNotListed},
      {"device in the list", {{"device_whitelist", Array{"desk"}}}, same, 2, none},
      {"device not in the list", {{"device_whitelist", Array{"phone"}}}, same, 1, deviceNotListed},
      {"device denied", {{"device_blacklist", Array{"BENCH"}}}, same, 1, deviceListed},
      {"no hardware type counts as denied",
       {{"device_blacklist", Array{"x"}}},
       [](ClientFacts& facts) { facts.hardwareType.reset(); },
       1,
       deviceListed},
      {"filters that are no array", {{"filters", "none"}}, same, 1, filtersMissing},
      {"threshold that is a text", {{"sampling_threshold", "1"}}, same, 1, thresholdMissing},
      {"factor equal to the threshold", {{"sampling_threshold", 0.3}}, same, 2, none},
      {"above, no override", {{"sampling_threshold", 0.25}}, same, 3, none},
      {"above, override below",
       {{"sampling_threshold", 0.25}, {"override_sampling", 0.29}},
       same,
       1,
       sampledOut},
      {"above, override equal", {{"sampling_threshold", 0.25}, {"override_sampling", 0.3}}, same, 3, none},
      {"the country's own threshold",
       {{"per_country_sampling_thresholds", thresholds("DE", 0.1)}},
       same,
       3,
       none},
      {"letter case counts there",
       {{"per_country_sampling_thresholds", thresholds("de", 0.1)}},
       same,
       2,
       none},
      {"the country's own threshold is missing",
       {{"per_country_sampling_thresholds", thresholds("DE", "x")}},
       same,
       1,
       thresholdMissing},
  };
  for (const Case& one : cases) {
    ClientFacts facts = goodFacts();
    one.facts(facts);
    const Dictionary entry = with(goodEntry(), one.changes);
    const ClientVerdict verdict = decideOnClient(entry, facts);
    EXPECT_EQ(verdict.state, one.state) << one.name;
    EXPECT_EQ(verdict.refusal, one.refusal) << one.name;
    EXPECT_EQ(verdict.dnuType, one.dnuType) << one.name;
  }
}

TEST(ClientDecision, ACountryReplacesAThresholdThatIsAbsent) {
  Dictionary entry = goodEntry();
  entry.erase("sampling_threshold");
  entry.set("per_country_sampling_thresholds", Array{Dictionary{{"country", Array{"DE"}}, {"threshold", 1}}});
  const ClientVerdict verdict = decideOnClient(entry, goodFacts());
  EXPECT_EQ(verdict.state, kBackendReporting);
  EXPECT_EQ(verdict.threshold, 1.0);
  EXPECT_TRUE(verdict.countryThreshold);
  EXPECT_EQ(verdict.thresholdBefore, std::nullopt);
}

TEST(TextLists, MatchNamesAsClientEntriesDo) {
  const auto entry = [](Value client, Value service) {
    return Dictionary{{"client", std::move(client)}, {"service", std::move(service)}};
  };
  using Name = std::optional<std::string>;
  const std::vector<std::tuple<Dictionary, Name, Name, bool>> cases{
      {Dictionary{}, std::nullopt, std::nullopt, true},
      {entry("a,b", 0), "A", "x", true},
      {entry("a,b", 0), "b", std::nullopt, true},
      {entry("a,b", 0), "ab", "x", false},
      {entry("a, b", 0), "b", "x", false},  // items are not trimmed
      {entry("a", 0), std::nullopt, "x", false},
      {entry(0, "cam"), "a", "FrontCamera", true},
      {entry(0, "camera front"), "a", "cam", false},
      {entry("ÄPFEL", "öl"), "äpfel", "HEIZÖL", true},
      {entry("a", "cam"), "a", "screen", false},
  };
  for (const auto& [row, client, service, expected] : cases) {
    EXPECT_EQ(matchClientNameAndServiceID(row, client, service), expected)
        << client.value_or("(none)") << " " << service.value_or("(none)");
  }
}

Dictionary filter(const char* key, const char* action, Dictionary more = {}) {
  return with({{"key", key}, {"action", action}}, std::move(more));
}

TEST(FilterTable, TheFirstRecordThatFitsDecides) {
  const std::string digest = VeltraBackend::convertIntoSHA256("pad");
  struct Row {
    const char* name;
    Array filters;
    Dictionary event, expected;
  };
  const Dictionary event{{"_method", 3}, {"_status", 0}, {"deviceName", "pad"}, {"Mac", "m"}};
  const std::vector<Row> rows{
      {"removed whatever its case",
       {filter("mac", "remove")},
       event,
       {{"_method", 3}, {"_status", 0}, {"deviceName", "pad"}}},
      {"hashed for its method",
       {filter("deviceName", "sha256", {{"method", 3}})},
       event,
       with(event, {{"deviceName", digest}})},
      {"not for another method", {filter("deviceName", "sha256", {{"method", 4}})}, event, event},
      {"a keep shields", {filter("mac", "keep", {{"status", 0}}), filter("mac", "remove")}, event, event},
      {"a keep of another status does not",
       {filter("mac", "", {{"status", 1}}), filter("mac", "remove")},
       event,
       {{"_method", 3}, {"_status", 0}, {"deviceName", "pad"}}},
      {"the action respects case", {filter("mac", "Remove")}, event, event},
      {"own fields too",
       {filter("_STATUS", "remove")},
       event,
       {{"_method", 3}, {"deviceName", "pad"}, {"Mac", "m"}}},
      {"no key, no match", {Dictionary{{"action", "remove"}}, "junk"}, event, event},
      {"a number's digest",
       {filter("n", "sha256")},
       {{"n", 12}},
       {{"n", VeltraBackend::convertIntoSHA256("12")}}},
      {"what has no text is removed", {filter("n", "sha256")}, {{"n", Array{1}}}, {}},
      {"without a method 0 counts", {filter("n", "remove", {{"method", 0}, {"status", 0}})}, {{"n", 1}}, {}},
  };
  for (const Row& row : rows) {
    FilterTable table;
    table.createFiltersFromArray(row.filters);
    Dictionary filtered = row.event;
    table.filterEvent(filtered);
    EXPECT_EQ(filtered, row.expected) << row.name;
  }
}

TEST(FilterTable, AnEmptyArrayLeavesTheEarlierTableInForce) {
  FilterTable table;
  table.createFiltersFromArray({filter("a", "remove")});
  table.createFiltersFromArray({});
  Dictionary event{{"a", 1}};
  EXPECT_EQ(table.filterEvent(event).removed, 1u);
  table.createFiltersFromArray({filter("b", "remove")});
  event.set("a", 1);
  EXPECT_EQ(table.filterEvent(event).removed, 0u);
}

}  // namespace
}  // namespace veltrad
