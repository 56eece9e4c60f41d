// What lint says of a storebag with one thing wrong in it, and that it says no more.
#include "storebag/lint.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace veltrad {
namespace {

const Dictionary kGood{{"client", "phone"},         {"locale_whitelist", Array{"US"}},
                       {"filters", Array{}},        {"sampling_threshold", 0.5},
                       {"override_dnu", true},      {"post_url", "https://c.example/e"},
                       {"custom_clientId", Array{}}};

Dictionary storebag(const Value& section) {
  return {{"version", "1"}, {"refresh_cycle", 60}, {"release", section}};
}
Dictionary clients(const Value& entries) {
  return storebag(Dictionary{{"httppost", Dictionary{{"clients", entries}}}, {"mivo", Dictionary{{"x", 1}}}});
}

TEST(StorebagLint, LooksThroughEveryEntry) {
  const auto none = std::nullopt;
  const Array hash{Dictionary{{"key", "k"}, {"action", "Hash"}}},
      noThreshold{Dictionary{{"country", Array{"US"}}}};
  const struct {
    const char* key;
    std::optional<Value> value;  // none: the key goes
    const char* finding;         // how it begins, after the entry's place
  } table[] = {
      {"locale_whitelist", none, R"(: no country in "locale_whitelist": refuses every client)"},
      {"locale_whitelist", Array{}, R"(: no country in "locale_whitelist": refuses every client)"},
      {"device_whitelist", Array{"Elm", 4}, R"(: "device_whitelist" holds 4, which is no text)"},
      {"filters", none, R"(: no "filters": refuses every client that requires user info)"},
      {"filters", Array{Dictionary{}}, R"(.filters[0]: no "key": matches nothing)"},
      {"filters", Array{7}, R"(.filters[0]: is not a dictionary: passed over)"},
      {"filters", hash, R"(.filters[0]: unknown "action" "Hash": the field is kept)"},
      {"sampling_threshold", none, R"(: no "sampling_threshold", not even for a country: refuses)"},
      {"per_country_sampling_thresholds", noThreshold, R"(.per_country_sampling_thresholds[0]: no "thr)"},
      {"post_url", none, R"(: no "post_url": nothing can be posted)"},
      {"post_url", "http://c.example", R"(: "post_url" does not begin with https://: )"},
      {"realtime_post_url", "c.example", R"(: "realtime_post_url" does not begin with https://: )"},
      {"event_threshold", "50", R"(: "event_threshold" is not a number: counts as absent)"},
      {"post\nurl", "x", R"(: unknown key "post\nurl": expected one of client, )"},
  };
  for (const auto& c : table) {
    Dictionary entry = kGood;
    entry.erase(c.key);
    entry.setIfPresent(c.key, c.value);
    const std::string finding = std::string("release.httppost.clients[0]") + c.finding;
    EXPECT_THAT(lintStorebag(clients(Array{entry})), testing::ElementsAre(testing::StartsWith(finding)));
  }
}

TEST(StorebagLint, LooksThroughWhatIsAroundThem) {
  Dictionary everyone = kGood;
  everyone.erase("client");
  Dictionary oneService = everyone;
  oneService.set("service", "ringer");
  const std::pair<Dictionary, const char*> table[] = {
      {{{"release", Dictionary{}}}, R"(storebag: no "version": )"},
      {{{"version", "1"}}, R"(storebag: no "release": )"},
      {{{"version", "1"}, {"release", Dictionary{}}, {"relaese", 1}},
       R"(storebag: unknown section or key "rel)"},
      {storebag("x"), R"(storebag: "release" is not a dictionary: counts as absent)"},
      {storebag(Dictionary{{"httpost", 1}}), R"(release: unknown back end "httpost": expected one of dash)"},
      {storebag(Dictionary{{"httppost2", Dictionary{}}}), R"(release.httppost2: no "clients": )"},
      {storebag(Dictionary{{"uploadserver", Dictionary{}}}), R"(release.uploadserver: no "post_url": )"},
      {storebag(Dictionary{{"uploadserver", Dictionary{{"post_url", "u.example"}}}}),
       R"(release.uploadserver: "post_url" does not begin with https://: )"},
      {clients(Array{}), R"(release.httppost: "clients" is empty: refuses every client)"},
      {clients(Array{everyone, kGood}), "release.httppost.clients[1]: never used for a client that requires"},
  };
  for (const auto& [bag, finding] : table)
    EXPECT_THAT(lintStorebag(bag), testing::ElementsAre(testing::StartsWith(finding)));
  EXPECT_THAT(lintStorebag(clients(Array{kGood, oneService, everyone})), testing::IsEmpty());
}

}  // namespace
}  // namespace veltrad
