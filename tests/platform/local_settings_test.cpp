// SPDX-License-Identifier: Apache-2.0
// Settings files in their two forms: which counts, what is wrong with them and where.
#include "platform/local_settings.h"

#include <gtest/gtest.h>

#include "base/property_list.h"
#include "fakes/fake_file_store.h"

namespace veltrad::platform {
namespace {

using Read = LocalContent::Kind;
constexpr const char* kJSON = "/etc/x.json";
constexpr const char* kList = "/etc/x.plist";

std::string plist(const std::string& inside) {
  return "<?xml version=\"1.0\"?>\n<plist version=\"1.0\">\n" + inside + "</plist>\n";
}

TEST(LocalSettings, SayWhatTheFileHoldsOrThePlaceWhereItIsBroken) {
  const std::string both = "/etc/x.json and /etc/x.plist: both are there, the first counts";
  const struct {
    std::string json, list;  // empty: no such file
    Read kind;
    Value value;
    std::string said;  // the error, or else the warning
  } table[] = {{"", "", Read::absent, false, ""},
               {"// a comment\n{ /* another // one\n*/ \"a\": 1 } // at the end", "", Read::good,
                Dictionary{{"a", 1}}, ""},
               {"[{\"$date\": 1.5}, {\"$data\": \"AAE=\"}, \"//\"]", "", Read::good,
                Array{Date{1.5}, Data{std::string("\0\1", 2)}, "//"}, ""},
               {"", plist("<array><true/></array>"), Read::good, Array{true}, ""},
               {"", writeBinaryPropertyList(Array{5}), Read::good, Array{5}, ""},
               {"[1]", plist("<true/>"), Read::good, Array{1}, both},
               {"{\"a\" 1}", "", Read::broken, false,
                "/etc/x.json:1:6: Missing a colon after a name of object member."},
               {"{\n  \"é\": 1,\n  \"é\" 1}", plist("<true/>"), Read::broken, false,
                "/etc/x.json:3:7: Missing a colon after a name of object member."},
               {"[1,]", "", Read::broken, false, "/etc/x.json:1:4: Invalid value."},
               {"[1 /* no end", "", Read::broken, false, "/etc/x.json:1:13: Unspecific syntax error."},
               {"[1]\n\n x", "", Read::broken, false,
                "/etc/x.json:3:2: The document root must not be followed by other values."},
               {"", plist("<array>\n  <true/>\n  <null/>\n</array>"), Read::broken, false,
                "/etc/x.plist:5:3: unknown element <null>"},
               {"", plist("<array><true/>"), Read::broken, false, "/etc/x.plist:3:17: mismatched tag"},
               {"", "bplist00", Read::broken, false, "/etc/x.plist:1:1: "},
               {"", "rubbish", Read::broken, false,
                "/etc/x.plist:1:1: neither \"bplist00\" nor XML at its beginning"}};
  for (const auto& c : table) {
    FakeFileStore files;
    if (!c.json.empty()) files.put(kJSON, c.json);
    if (!c.list.empty()) files.put(kList, c.list);
    for (const char* path : {kJSON, kList}) {
      const auto content = LocalSettings(files, path).content().value();
      EXPECT_EQ(content->kind, c.kind) << c.json << c.list;
      EXPECT_TRUE(content->value == c.value) << c.json << c.list;
      const std::string said = content->kind == Read::broken ? content->error : content->warning.value_or("");
      EXPECT_EQ(said.substr(0, c.said.size()), c.said);
      EXPECT_EQ(said.empty(), c.said.empty()) << said;
    }
  }
}

TEST(LocalSettings, AreOneContentUntilItChangesAndNoShortageChangesIt) {
  FakeFileStore files;
  LocalSettings settings(files, kList);
  files.put(kList, plist("<integer>1</integer>"));
  const auto list = settings.content().value();
  files.put(kList, plist("<integer>1</integer>"));
  EXPECT_EQ(settings.content().value(), list);
  settings.readAgain();
  EXPECT_EQ(settings.content().value(), list);
  files.put(kJSON, "2");
  for (const bool stampsFail : {true, false}) {
    files.runShort(true, stampsFail);
    EXPECT_FALSE(settings.content());
  }
  files.runShort(false);
  const auto json = settings.content().value();
  EXPECT_TRUE(json->value == Value(2));
  EXPECT_TRUE(json->warning);
  files.put(kList, "rubbish that nobody reads");
  EXPECT_EQ(settings.content().value(), json);
  files.failReads(kJSON, FakeFileStore::Kind::noAccess);
  settings.readAgain();
  EXPECT_EQ(settings.content().value()->error, "/etc/x.json: Permission denied");
  files.failReads(kJSON, {});
  files.remove(kJSON);
  files.remove(kList);
  EXPECT_EQ(settings.content().value()->kind, Read::absent);
}

TEST(LocalSettings, NameThePlacesOfKeysAndElementsInJSON) {
  FakeFileStore files;
  files.put(kJSON,
            "{ // {\"a\": [\n  \"a\": {\"b\": 1, \"a\\\"\\\\\": [10, {\"c\": \"a\"}, \"x\"]},\n"
            "  \"é\": [null, []], \"b\": true }");
  const auto content = LocalSettings(files, kJSON).content().value();
  const std::pair<std::vector<std::string>, std::string> table[] = {{{}, ":1:1"},
                                                                    {{"a"}, ":2:3"},
                                                                    {{"a", "b"}, ":2:9"},
                                                                    {{"a", "a\"\\"}, ":2:17"},
                                                                    {{"a", "a\"\\", "0"}, ":2:27"},
                                                                    {{"a", "a\"\\", "1"}, ":2:31"},
                                                                    {{"a", "a\"\\", "1", "c"}, ":2:32"},
                                                                    {{"a", "a\"\\", "2"}, ":2:43"},
                                                                    {{"é", "1"}, ":3:15"},
                                                                    {{"b"}, ":3:20"},
                                                                    {{"c"}, ""},
                                                                    {{"a", "c"}, ""},
                                                                    {{"b", "b"}, ""}};
  for (const auto& [keys, place] : table)
    EXPECT_EQ(content->placeOf(keys), kJSON + place) << ::testing::PrintToString(keys);
}

}  // namespace
}  // namespace veltrad::platform
