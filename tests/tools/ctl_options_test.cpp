// veltractl's command line: what it asks for, what it refuses, what the help says.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tools/ctl/key_value.h"
#include "tools/ctl/options.h"

namespace veltrad::ctl {
namespace {

using testing::HasSubstr;
using testing::Not;

std::variant<Options, Ending> parse(std::vector<const char*> words) {
  words.insert(words.begin(), "veltractl");
  return parseOptions(static_cast<int>(words.size()), words.data());
}

Options accepted(std::vector<const char*> words) {
  const auto parsed = parse(std::move(words));
  if (const auto* ending = std::get_if<Ending>(&parsed)) {
    ADD_FAILURE() << ending->errorOutput;
    return {};
  }
  return std::get<Options>(parsed);
}

Ending ended(std::vector<const char*> words) {
  const auto parsed = parse(std::move(words));
  if (std::holds_alternative<Options>(parsed)) {
    ADD_FAILURE() << "accepted";
    return {};
  }
  return std::get<Ending>(parsed);
}

TEST(Options, sessionSaysWhoTheClientIs) {
  const Options options = accepted({"--root",
                                    "/r",
                                    "session",
                                    "--client-type",
                                    "17",
                                    "--session-id",
                                    "4294967295",
                                    "--client-version",
                                    "65535",
                                    "--client",
                                    "123",
                                    "--service",
                                    "ringer",
                                    "--user-info",
                                    "build=7",
                                    "region=EU",
                                    "--require-user-info",
                                    "--batch-events",
                                    "--aggregate",
                                    "--input",
                                    "lines.jsonl"});
  EXPECT_EQ(options.command, Command::session);
  EXPECT_EQ(options.root, "/r");
  EXPECT_EQ(options.input, "lines.jsonl");
  EXPECT_EQ(options.identity.clientType, 17);
  EXPECT_EQ(options.identity.sessionID, 4294967295u);
  EXPECT_EQ(options.identity.clientVersion, 65535);
  EXPECT_TRUE(options.identity.requireUserInfo);
  EXPECT_TRUE(options.identity.batchEvents);
  EXPECT_TRUE(options.aggregate);
  // A name is a text whatever it looks like.
  EXPECT_EQ(options.identity.userInfo,
            Dictionary({{"clientName", "123"}, {"serviceName", "ringer"}, {"build", 7}, {"region", "EU"}}));
}

TEST(Options, whatIsNotSaidIsLeftOut) {
  const Options options = accepted({"session"});
  EXPECT_FALSE(options.root);
  EXPECT_FALSE(options.input);
  EXPECT_FALSE(options.identity.clientType);
  EXPECT_FALSE(options.identity.sessionID);
  EXPECT_FALSE(options.identity.clientVersion);
  EXPECT_FALSE(options.identity.userInfo);
  EXPECT_FALSE(options.identity.requireUserInfo);
  EXPECT_FALSE(options.identity.batchEvents);
  EXPECT_FALSE(options.aggregate);
  EXPECT_FALSE(accepted({"send", "--category", "1", "--type", "2"}).payload);
}

TEST(Options, sendTakesItsPayloadFromTheCommandLine) {
  const Options options = accepted({"send", "--category", "65535", "codec=opus", "--type", "0", "--flag", "3",
                                    "--user-info", "region=EU", "seconds=12.5", "--client-type=7"});
  EXPECT_EQ(options.command, Command::send);
  EXPECT_EQ(options.category, 65535);
  EXPECT_EQ(options.type, 0);
  EXPECT_EQ(options.flag, 3u);
  EXPECT_EQ(options.payload, Dictionary({{"codec", "opus"}, {"seconds", 12.5}}));
  EXPECT_EQ(options.identity.userInfo, Dictionary({{"region", "EU"}}));
}

TEST(Options, globalOptionsStandOnEitherSideOfTheCommand) {
  EXPECT_TRUE(accepted({"--json", "stats"}).json);
  const Options options = accepted({"stats", "--json", "--root", "there"});
  EXPECT_EQ(options.command, Command::stats);
  EXPECT_TRUE(options.json);
  EXPECT_EQ(options.root, "there");
  EXPECT_EQ(accepted({"states"}).command, Command::states);
  EXPECT_EQ(accepted({"display-url"}).command, Command::displayURL);
}

TEST(Options, wrongUsageSaysWhatWasExpected) {
  const struct {
    std::vector<const char*> words;
    const char* text;
  } cases[] = {
      {{}, "veltractl: no command: expected session, send, states, display-url or stats"},
      {{"explode"}, "unknown command \"explode\": expected session, send, states, display-url or stats"},
      {{"--explode"}, "unknown option \"--explode\""},
      {{"one-shot"}, "unknown command \"one-shot\""},
      {{"upload", "x"}, "unknown command \"upload\""},
      {{"session", "stats"}, "\"stats\" is not expected here"},
      {{"states", "--aggregate"}, "\"--aggregate\" is not expected here"},
      {{"session", "--client-type", "18"}, "--client-type: expected an integer from 0 to 17, found \"18\""},
      {{"session", "--client-type", "0x7"}, "from 0 to 17, found \"0x7\""},
      {{"session", "--client-type=-1"}, "from 0 to 17, found \"-1\""},
      {{"session", "--session-id", "4294967296"}, "from 0 to 4294967295, found \"4294967296\""},
      {{"session", "--client-version", "65536"}, "from 0 to 65535, found \"65536\""},
      {{"session", "--user-info", "novalue"}, "\"novalue\": expected KEY=VALUE"},
      {{"session", "--client", "\xff"}, "expected UTF-8"},
      {{"session", "--root", ""}, "--root: expected a directory"},
      {{"send", "--type", "1"}, "--category is required"},
      {{"send", "--category", "1"}, "--type is required"},
      {{"send", "--category", "x", "--type", "1"},
       "--category: expected an integer from 0 to 65535, found \"x\""},
      {{"send", "--category", "1", "--type", "1", "=x"}, "\"=x\": expected KEY=VALUE"},
      {{"stats", "--client-type", "1"}, "\"--client-type\" is not expected here"},
  };
  for (const auto& c : cases) {
    const Ending ending = ended(c.words);
    EXPECT_EQ(ending.status, 2) << c.text;
    EXPECT_THAT(ending.errorOutput, HasSubstr(c.text));
    EXPECT_EQ(ending.output, "");
  }
}

TEST(Options, helpHasAnExampleAndOffersWhatThereIs) {
  const struct {
    std::vector<const char*> words;
    const char* text;
  } cases[] = {
      {{"--help"}, "veltractl send --client-type 7"},
      {{"session", "--help"}, "| veltractl session"},
      {{"send", "--help"}, "veltractl send --client-type"},
      {{"states", "--help"}, "veltractl states --client-type"},
      {{"display-url", "--help"}, "veltractl display-url"},
      {{"stats", "--help"}, "veltractl --json stats"},
  };
  for (const auto& c : cases) {
    const Ending ending = ended(c.words);
    EXPECT_EQ(ending.status, 0);
    EXPECT_EQ(ending.errorOutput, "");
    EXPECT_THAT(ending.output, HasSubstr("Example"));
    EXPECT_THAT(ending.output, HasSubstr(c.text));
    EXPECT_THAT(ending.output, Not(HasSubstr("one-shot")));
    EXPECT_THAT(ending.output, Not(HasSubstr("upload")));
  }
}

TEST(Options, versionIsTheLibrarys) {
  const Ending ending = ended({"--version"});
  EXPECT_EQ(ending.status, 0);
  EXPECT_EQ(ending.output, "veltractl 8.0\n");
}

TEST(KeyValue, numbersAndBooleansAreToldFromTexts) {
  const struct {
    const char* text;
    Value value;
  } cases[] = {
      {"k=12", 12},         {"k=-3", -3},       {"k=18446744073709551615", 18446744073709551615ull},
      {"k=-0.5", -0.5},     {"k=1e3", 1000.0},  {"k=true", true},
      {"k=false", false},   {"k=True", "True"}, {"k=007", "007"},
      {"k=+5", "+5"},       {"k= 5", " 5"},     {"k=1.", "1."},
      {"k=8.0.1", "8.0.1"}, {"k=-", "-"},       {"k=", ""},
      {"k=a=b", "a=b"},     {"k=null", "null"}, {"k={\"a\":1}", "{\"a\":1}"},
      {"k=NaN", "NaN"},     {"k=0x10", "0x10"}, {"k=2026-11-24", "2026-11-24"},
  };
  for (const auto& c : cases) {
    const auto entry = parseKeyValue(c.text);
    ASSERT_TRUE(entry.ok()) << c.text << ": " << entry.error();
    EXPECT_EQ(entry.value().first, "k");
    EXPECT_EQ(entry.value().second.type(), c.value.type()) << c.text;
    EXPECT_EQ(entry.value().second, c.value) << c.text;
  }
  EXPECT_EQ(parseKeyValues({"a=1", "b=2", "a=3"}).value(), Dictionary({{"a", 3}, {"b", 2}}));
  for (const char* text : {"", "k", "=v", "k=\xff"}) EXPECT_FALSE(parseKeyValue(text).ok()) << text;
}

}  // namespace
}  // namespace veltrad::ctl
