// veltractl's command line: what it asks for, what it refuses, what the help says.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "base/json.h"
#include "tools/ctl/key_value.h"
#include "tools/ctl/options.h"

namespace veltrad::ctl {
namespace {

using testing::HasSubstr;

// Words end at each space, so a space at the end gives an empty one.
std::variant<Options, Ending> parse(std::string line) {
  std::vector<const char*> words{"veltractl"};
  if (!line.empty()) words.push_back(line.c_str());
  for (char& c : line) {
    if (c != ' ') continue;
    c = '\0';
    words.push_back(&c + 1);
  }
  return parseOptions(static_cast<int>(words.size()), words.data());
}
// The one that the line gives, or the test fails.
template <typename Parsed>
Parsed parsed(const std::string& line) {
  auto result = parse(line);
  EXPECT_TRUE(std::holds_alternative<Parsed>(result)) << line;
  return std::holds_alternative<Parsed>(result) ? std::get<Parsed>(result) : Parsed();
}

TEST(Options, sessionSaysWhoTheClientIs) {
  const Options options = parsed<Options>(
      "session --client-type=-17 --session-id 4294967295 --client-version 65535 --client 123 "
      "--service ringer --user-info build=7 region=EU --require-user-info --batch-events --aggregate");
  EXPECT_EQ(options.identity.clientType, -17);
  EXPECT_EQ(options.identity.sessionID, 4294967295u);
  EXPECT_EQ(options.identity.clientVersion, 65535);
  EXPECT_TRUE(options.identity.requireUserInfo && options.identity.batchEvents && options.aggregate);
  // A name is a text whatever it looks like.
  EXPECT_EQ(options.identity.userInfo,
            Dictionary({{"clientName", "123"}, {"serviceName", "ringer"}, {"build", 7}, {"region", "EU"}}));
}

TEST(Options, wrongUsageSaysWhatWasExpected) {
  const std::pair<const char*, const char*> cases[] = {
      {"",
       "veltractl: no command: expected session, send, one-shot, states, display-url, "
       "upload, upload-log-data or stats"},
      {"explode",
       "unknown command \"explode\": expected session, send, one-shot, states, display-url, "
       "upload, upload-log-data or stats"},
      {"--explode", "unknown option \"--explode\""},
      {"session stats", "\"stats\" is not expected here"},
      {"session --client-type 2147483648", "from -2147483648 to 2147483647, found \"2147483648\""},
      {"session --session-id=-1", "from 0 to 4294967295, found \"-1\""},
      {"session --client-version 65536", "from 0 to 65535, found \"65536\""},
      {"session --user-info novalue", "\"novalue\": expected KEY=VALUE"},
      {"session --client \xff", "expected UTF-8"},
      {"session --root ", "--root: expected a directory"},
      {"send --type 1", "--category is required"},
      {"send --category x --type 1", "--category: expected an integer from 0 to 65535, found \"x\""},
      {"one-shot --category 1 --type 1 --flag=1", "\"--flag=1\" is not expected here"},
      {"upload-log-data", "file is required"},
      {"send --category 1 --type 1 =x", "\"=x\": expected KEY=VALUE"},
  };
  for (const auto& [line, text] : cases) {
    const Ending ending = parsed<Ending>(line);
    EXPECT_TRUE(ending.status == 2 && ending.output.empty()) << line;
    EXPECT_THAT(ending.errorOutput, HasSubstr(text)) << line;
  }
}

TEST(KeyValue, numbersAndBooleansAreToldFromTexts) {
  Array found;
  for (const char* text : {"12", "-3", "-0.5", "1e3", "18446744073709551615", "true", "false"})
    found.push_back(parseKeyValue(std::string("k=") + text).value().second);
  EXPECT_EQ(writeJSON(found), "[12,-3,-0.5,1000.0,18446744073709551615,true,false]");
  for (const char* text :
       {"True", "007", "+5", " 5", "1.", "8.0.1", "-", "", "a=b", "null", "{}", "NaN", "0x10"})
    EXPECT_EQ(parseKeyValue(std::string("k=") + text).value(), Dictionary::Entry("k", text));
  EXPECT_EQ(parseKeyValues({"a=1", "b=2", "a=3"}).value(), Dictionary({{"a", 3}, {"b", 2}}));
  for (const char* text : {"", "k", "=v", "k=\xff"}) EXPECT_FALSE(parseKeyValue(text).ok()) << text;
}

}  // namespace
}  // namespace veltrad::ctl
