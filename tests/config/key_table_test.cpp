// SPDX-License-Identifier: Apache-2.0
// Every key of the storebag tables: how values of its type, of another type and beyond its range are read.
#include "config/key_table.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <set>
#include <string>

#include "config/storebag_content.h"

namespace veltrad {
namespace {

using config::KeyType;

template <typename Parsed>
class KeyTable : public testing::Test {};
using Tables =
    testing::Types<config::filterTag, config::CountryThreshold, config::ClientEntry, config::HTTPSPostProfile,
                   config::DashboardProfile, config::UploadProfile, config::Storebag>;
TYPED_TEST_SUITE(KeyTable, Tables);

struct Sample {
  KeyType type;
  std::vector<Value> right, wrong;
};
const Value kNone(Dictionary{}), kNaN(std::nan("")), kInfinite(std::numeric_limits<double>::infinity());
const Sample kSamples[] = {
    {KeyType::text, {"remove"}, {1, true, Array{"remove"}, kNone}},
    {KeyType::url, {"https://a"}, {1, Array{}}},
    {KeyType::names, {"a", "a,b", ""}, {1, Array{"a"}}},
    {KeyType::texts, {Value(Array{"a", 1})}, {"a", 1, kNone, Array{}, Array{1}}},
    {KeyType::integer, {3, 3.9, true}, {"3", kNaN, kInfinite, 1e300, Array{3}}},
    {KeyType::real, {3, 0.5, true, 1e300}, {"0.5", kNaN, kInfinite, Array{}}},
    {KeyType::presence, {"", 0, false, Array{}, kNone, kNaN}, {}},
    {KeyType::dictionary, {kNone}, {Array{}, "x", 1}},
    {KeyType::dictionaries, {Array{}, Array{1}, Array{kNone}}, {kNone, "x", 1}},
};
const Sample& sampleOf(KeyType type) {
  return *std::find_if(std::begin(kSamples), std::end(kSamples),
                       [&](const Sample& s) { return s.type == type; });
}

TYPED_TEST(KeyTable, ReadsEachKeyByItsType) {
  std::set<std::string> names;
  std::vector<TypeParam> others;
  const TypeParam absent = config::parsed<TypeParam>({});
  for (const config::Key& key : TypeParam::kKeys) {
    SCOPED_TRACE(key.name);
    EXPECT_TRUE(names.insert(key.name).second);
    if (key.read == nullptr) continue;
    const auto read = [&key](Value value) { return config::parsed<TypeParam>({{key.name, value}}); };
    for (const Value& value : sampleOf(key.type).right) EXPECT_FALSE(read(value) == absent);
    for (const Value& value : sampleOf(key.type).wrong) EXPECT_TRUE(read(value) == absent);
    const TypeParam alone = read(sampleOf(key.type).right.front());  // no other key has its field
    EXPECT_EQ(std::find(others.begin(), others.end(), alone), others.end());
    others.push_back(alone);
    if (key.type == KeyType::real) {  // stands as it is
      EXPECT_FALSE(read(key.range.most + 1) == read(key.range.most));
    } else if (key.type == KeyType::integer) {
      EXPECT_TRUE(read(true) == read(1) && read(3.9) == read(3));
      const bool capped = key.name == std::string("refresh_cycle") || key.name == std::string("serial");
      const auto most = static_cast<std::int64_t>(key.range.most),
                 least = static_cast<std::int64_t>(key.range.least);
      EXPECT_TRUE(read(most + 1) == read(capped ? most : least));
      EXPECT_TRUE(read(least - 1) == read(capped ? least : most));
    }
  }
}

TEST(StorebagContent, KeepsWhatALineOfTheLogPrintsAndHowPresenceDecides) {
  const auto entry = config::parsed<config::ClientEntry>(
      {{"locale_whitelist", "US"}, {"client", "a, b,"}, {"filters", Array{1}}});
  EXPECT_EQ(entry.localeWhitelist.asGiven, Value("US"));
  EXPECT_EQ(entry.deviceWhitelist.asGiven, std::nullopt);
  EXPECT_EQ(entry.client, (std::vector<std::string>{"a", " b", ""}));
  EXPECT_EQ(entry.filters->elements, 1u);
  const auto dashboard = config::parsed<config::DashboardProfile>({{"reliable", "20"}});
  EXPECT_EQ(dashboard.reliable, (config::Reliable{true, 0}));
}

TEST(StorebagContent, HasEveryEntryOfASectionAndWhatItsBackEndReads) {
  const Dictionary section{{"ampery", Dictionary{}},      {"dashboard", "x"},     {"httppost", Dictionary{}},
                           {"httppost2", Dictionary{}},   {"mivo", Dictionary{}}, {"unknown", Dictionary{}},
                           {"uploadserver", Dictionary{}}};
  const auto parsed = config::parseSection(section);
  EXPECT_EQ(parsed->asGiven, section);
  std::string kinds;
  for (const auto& [name, profile] : parsed->backends)
    kinds += name + "=" + (profile ? std::to_string(profile->index()) : "-") + " ";
  EXPECT_EQ(kinds, "ampery=- dashboard=- httppost=0 httppost2=0 mivo=- unknown=- uploadserver=2 ");
}

}  // namespace
}  // namespace veltrad
