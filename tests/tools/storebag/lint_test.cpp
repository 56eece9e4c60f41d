// SPDX-License-Identifier: Apache-2.0
// What lint says of each key by the tables that the daemon reads with, and of what no key says alone.
#include "storebag/lint.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <map>

#include "config/storebag_content.h"

namespace veltrad {
namespace {

using config::KeyType;
using storebag::lintStorebag;
using testing::Contains;
using testing::Not;
using testing::StartsWith;

const Dictionary kGood{{"client", "phone"},         {"locale_whitelist", Array{"US"}},
                       {"filters", Array{}},        {"sampling_threshold", 0.5},
                       {"override_dnu", true},      {"post_url", "https://c.example/e"},
                       {"custom_clientId", Array{}}};

Dictionary storebagWith(const Value& section) {
  return {{"version", "1"}, {"refresh_cycle", 60}, {"release", section}};
}
Dictionary clients(const Value& entries) {
  return storebagWith(
      Dictionary{{"httppost", Dictionary{{"clients", entries}}}, {"mivo", Dictionary{{"active", true}}}});
}

// Of each type.
const std::map<KeyType, Value> kRight{{KeyType::text, "remove"},
                                      {KeyType::url, "https://c.example/e"},
                                      {KeyType::names, "a,b"},
                                      {KeyType::texts, Array{"US"}},
                                      {KeyType::integer, 1},
                                      {KeyType::real, 1},
                                      {KeyType::presence, "anything"},
                                      {KeyType::dictionary, Dictionary{}},
                                      {KeyType::dictionaries, Array{Dictionary{}}}};

// `storebagAround` puts a dictionary of the table at its place in a storebag.
void everyKeyIsKnown(const config::KeyTable& table, const std::string& place,
                     const std::function<Dictionary(const Dictionary&)>& storebagAround) {
  for (const config::Key& key : table) {
    const std::string name = '"' + std::string(key.name) + '"', at = place + ": ";
    SCOPED_TRACE(at + name);
    const auto findings = [&](const Value& value, const std::string& more = "") {
      return lintStorebag(storebagAround({{key.name + more, value}}));
    };
    const Value& right = kRight.at(key.type);
    EXPECT_THAT(findings(right), Not(Contains(testing::ContainsRegex(at + "(unknown .*|no )?" + name))));
    EXPECT_THAT(findings(right, "x"), Contains(testing::ContainsRegex(at + "unknown .*" + key.name +
                                                                      "x.*: expected .*" + key.name)));
    const Value wrong = key.type == KeyType::dictionaries ? Value(1) : Value(Array{});
    if (!config::fits(wrong, key.type))
      EXPECT_THAT(findings(wrong),
                  Contains(testing::MatchesRegex(at + name + " is not an? .*: counts as absent")));
    if (key.range.least < key.range.most && key.type != KeyType::presence)
      EXPECT_THAT(findings(key.range.most + 1),
                  Contains(testing::ContainsRegex(at + name + " is .*: expected ")));
    if (key.need == config::Need::required)
      EXPECT_THAT(lintStorebag(storebagAround({})),
                  Contains(testing::ContainsRegex(at + "no .*" + name + ": ")));
    if (key.inner == nullptr) continue;
    const bool isArray = key.type == KeyType::dictionaries;
    const std::string inside = place == "storebag" ? key.name : place + "." + key.name;
    everyKeyIsKnown(*key.inner, inside + (isArray ? "\\[0\\]" : ""), [&](const Dictionary& inner) {
      return storebagAround({{key.name, isArray ? Value(Array{inner}) : Value(inner)}});
    });
  }
}

TEST(StorebagLint, KnowsEveryKeyOfTheTables) {
  everyKeyIsKnown(config::Storebag::kKeys, "storebag", [](const Dictionary& all) { return all; });
}

TEST(StorebagLint, SaysWhatAnEntryWouldDo) {
  const auto none = std::nullopt;
  const Array hash{Dictionary{{"key", "k"}, {"action", "Hash"}}},
      noThreshold{Dictionary{{"country", Array{"US"}}}};
  const struct {
    const char* key;
    std::optional<Value> value;  // none: the key goes
    const char* finding;         // how it begins, after the entry's place
  } table[] = {
      {"locale_whitelist", Array{}, R"(: no country in "locale_whitelist": refuses every client)"},
      {"device_whitelist", Array{"Elm", 4}, R"(: "device_whitelist" holds 4, which is no text)"},
      {"filters", Array{Dictionary{}}, R"(.filters[0]: no "key": matches nothing)"},
      {"filters", Array{7}, R"(.filters[0]: is not a dictionary: passed over)"},
      {"filters", hash, R"(.filters[0]: unknown "action" "Hash": the field is kept)"},
      {"sampling_threshold", none, R"(: no "sampling_threshold", not even for a country: refuses)"},
      {"per_country_sampling_thresholds", noThreshold, R"(.per_country_sampling_thresholds[0]: no "thr)"},
      {"post_url", "http://c.example", R"(: "post_url" does not begin with https://: )"},
      {"realtime_post_url", "c.example", R"(: "realtime_post_url" does not begin with https://: )"},
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

}  // namespace
}  // namespace veltrad
