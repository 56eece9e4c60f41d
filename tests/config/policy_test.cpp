// SPDX-License-Identifier: Apache-2.0
// The owner's policy: each verdict, broken files, and the treatment of fields.
#include "config/owner_policy.h"

#include <gtest/gtest.h>

#include <cmath>
#include <tuple>
#include <vector>

#include "config/daily_allowance.h"
#include "config/destinations.h"
#include "config/field_rules.h"
#include "config/owner_gate.h"
#include "configuration.h"
#include "fakes/scarce_memory.h"
#include "formats/json.h"
#include "platform/device_secret.h"

namespace veltrad {
namespace {

using enum wire::Reason;

const std::string kPath = "/etc/veltrad/policy.json";

struct Owner {
  FakeFileStore files;
  config::OwnerPolicy policy{files, kPath};

  const config::Policy& says(const std::string& text) {
    files.put(kPath, text);
    held = policy.readAgain();
    return *held;
  }
  std::shared_ptr<const config::Policy> held;
};

TEST(Policy, RefusesOrLetsReport) {
  const std::tuple<const char*, std::optional<wire::Reason>, std::optional<wire::Reason>> rows[] = {
      // with consent, without
      {"{}", {}, {}},
      {R"({"reporting": "on", "consent": "storebag"})", {}, {}},
      {R"({"reporting": "off"})", policy_reporting, policy_reporting},
      {R"({"consent": "always"} // here too)", {}, policy_consent},
      {R"({"reporting": "off", "consent": "always"})", policy_reporting, policy_reporting}};
  Owner owner;
  EXPECT_EQ(owner.policy.current()->refusal(false), std::nullopt);  // no file
  for (const auto& [text, with, without] : rows) {
    const config::Policy& policy = owner.says(text);
    EXPECT_EQ(policy.refusal(true), with) << text;
    EXPECT_EQ(policy.refusal(false), without) << text;
  }
}

TEST(Policy, ABrokenFileClosesEverythingAndNamesItsPlace) {
  const std::pair<const char*, const char*> rows[] = {
      {"{\n \"reporting\" \"off\"}", ":2:14: "},
      {"[]", ":1:1: the outermost value is not a dictionary"},
      {R"({"reporting": "of"})", R"(:1:2: "reporting" is "of": expected "on" or "off")"},
      {R"({"reportin": "off"})", R"(:1:2: unknown key "reportin": expected one of reporting, consent, )"},
      {R"({"hosts": "a.example"})", R"(:1:2: "hosts" is "a.example": expected an array of texts)"},
      {R"({"dailyEvents": -1})", R"(:1:2: "dailyEvents" is -1: expected an integer from 0 to )"},
      {R"({"history": {"days": 0}})", R"(:1:14: "days" is 0: expected an integer from 1 to )"},
      {R"({"history": {"day": 1}})", R"(:1:14: unknown key "day")"}};
  for (const auto& [text, said] : rows) {
    const ExpectedLog log({"3 Policy could not be read, nothing leaves: " + kPath + said});
    Owner owner;
    const config::Policy& policy = owner.says(text);
    EXPECT_EQ(policy.refusal(true), policy_broken) << text;
    EXPECT_FALSE(policy.reaches("a.example"));
    EXPECT_EQ(owner.policy.current().get(), &policy);  // said once
    EXPECT_EQ(owner.says(R"({"backends": ["later"]})").refusal(false), std::nullopt);
  }
}

TEST(Policy, AShortageKeepsWhatHeldAndClosesBeforeTheFirstReading) {
  const ExpectedLog log({});
  Owner owner;
  owner.files.runShort(true);
  EXPECT_EQ(owner.policy.current()->refusal(true), policy_broken);
  owner.files.runShort(false);
  EXPECT_EQ(owner.says("{}").refusal(true), std::nullopt);
  owner.files.runShort(true);
  EXPECT_EQ(owner.says(R"({"reporting": "off"})").refusal(true), std::nullopt);
  owner.files.runShort(false);
  EXPECT_EQ(owner.policy.current()->refusal(true), policy_reporting);
}

TEST(Policy, IsReadAgainForWantOfMemoryAndNeverTakenForBroken) {
  const std::pair<const char*, std::string> forms[] = {
      {"/etc/veltrad/policy.json", R"({"reporting": "off", "remove": ["a long name of a field", "b"]})"},
      {"/etc/veltrad/policy.plist", formats::writeXMLPropertyList(Dictionary{
                                        {"reporting", "off"}, {"remove", Array{"a long name of a field"}}})}};
  for (const auto& form : forms) {
    forEachShortage([&](const auto& shortOfMemory) {
      Owner owner;
      EXPECT_EQ(owner.policy.current()->refusal(true), std::nullopt);
      owner.files.put(form.first, form.second);
      std::optional<wire::Reason> meanwhile;
      shortOfMemory([&] { meanwhile = owner.policy.current()->refusal(true); });
      EXPECT_NE(meanwhile, policy_broken);
      EXPECT_EQ(owner.policy.current()->refusal(true), policy_reporting) << form.first;
    });
  }
}

TEST(Policy, MakesTheBackendsAndReachesTheHostsThatItNames) {
  Owner owner;
  EXPECT_TRUE(owner.says("{}").makes("httppost"));
  EXPECT_FALSE(owner.says(R"({"backends": []})").makes("httppost"));
  EXPECT_TRUE(owner.says(R"({"backends": ["ampery", "httppost"]})").makes("httppost"));
  EXPECT_FALSE(owner.says(R"({"backends": ["ampery"]})").makes("httppost"));
  const std::tuple<const char*, const char*, bool> rows[] = {
      {R"({})", "any.example", true},
      {R"({"hosts": []})", "any.example", false},
      {R"({"hosts": ["A.example"]})", "a.EXAMPLE", true},
      {R"({"hosts": ["a.example"]})", "a.example.", true},
      {R"({"hosts": ["a.example"]})", "b.a.example", false},
      {R"({"hosts": ["a.example"]})", "xa.example", false},
      {R"({"hosts": ["*.a.example"]})", "b.a.example", true},
      {R"({"hosts": ["*.a.example"]})", "c.B.a.example", true},
      {R"({"hosts": ["*.a.example"]})", "a.example", false},
      {R"({"hosts": ["*.a.example"]})", ".a.example", false},
      {R"({"hosts": ["*.a.example"]})", "ba.example", false},
      {R"({"hosts": ["*"]})", "a.example", false},
      {R"({"hosts": ["192.0.2.1"]})", "192.0.2.1", true},
      {R"({"hosts": ["192.0.2.1"]})", "192.0.2.10", false},
      {R"({"hosts": ["::1"]})", "[::1]", true},
      {R"({"hosts": ["[::1]"]})", "::1", true}};
  for (const auto& [text, host, reached] : rows) {
    EXPECT_EQ(owner.says(text).reaches(host), reached) << text << ' ' << host;
  }
}

TEST(DailyAllowance, CountsADayAndKeepsItOverARestart) {
  struct : platform::Clock {
    double seconds = 20'000 * 86'400.0;
    platform::TimeValue now() const override { return {static_cast<std::int64_t>(seconds), 0}; }
  } clock;
  FakeFileStore files;
  config::PolicyRules events, bytes, both;
  events.dailyEvents = 3;
  bytes.dailyBytes = 100;
  both.dailyEvents = 9;
  both.dailyBytes = 120;
  config::DailyAllowance day(files, clock, "/daily");
  EXPECT_TRUE(day.take({}, 1, 10));
  EXPECT_FALSE(day.take(events, 1, 0));  // not read yet
  files.runShort(true);
  day.load();
  EXPECT_FALSE(day.take(events, 1, 0));
  files.runShort(false);
  day.load();
  EXPECT_TRUE(day.take(events, 2, 80));
  EXPECT_FALSE(day.take(events, 1, 0));
  EXPECT_TRUE(day.take(events, 0, 10));
  EXPECT_FALSE(day.take(bytes, 0, 1));
  day.giveBack(0, 5);
  EXPECT_FALSE(day.take(bytes, 0, 6));
  EXPECT_TRUE(day.take(bytes, 0, 5));
  files.put("/daily", day.text());
  config::DailyAllowance next(files, clock, "/daily");
  EXPECT_TRUE(next.take({}, 4, 10));
  next.load();
  EXPECT_FALSE(next.take(both, 3, 0));
  EXPECT_TRUE(next.take(both, 2, 10));
  EXPECT_FALSE(next.take(both, 0, 1));
  clock.seconds += 86'400;
  next.giveBack(1, 10);  // of the day before
  EXPECT_TRUE(next.take(both, 9, 120));
  for (const char* text : {"", "[]", R"({"day": "x"})", R"({"day": 19999, "events": 9})"}) {
    files.put("/daily", text);
    config::DailyAllowance fresh(files, clock, "/daily");
    fresh.load();
    EXPECT_TRUE(fresh.take(both, 9, 120)) << text;
  }
}

TEST(DailyAllowance, GoesOnWithTheRecordOfADaemonThatWasKilled) {
  FakeClock clock;
  FakeFileStore files;
  const std::int64_t today = clock.now().seconds / 86'400;
  config::PolicyRules rules;
  rules.dailyEvents = 9;
  const auto file = [today](int events) {
    return R"({"day": )" + std::to_string(today) + R"(, "events": )" + std::to_string(events) + "}";
  };
  const std::tuple<platform::DayAccount, std::string, std::uint64_t> rows[] = {
      // what stands in the record, in the file, and what may still leave
      {{today, 6, 1}, file(4), 3},
      {{today, 6, 1}, "", 3},
      {{today, 4, 1}, file(6), 3},
      {{today - 1, 9, 1}, file(2), 7},
      {{}, file(9), 0}};
  for (auto [record, text, left] : rows) {
    files.put("/daily", text);
    config::DailyAllowance day(files, clock, "/daily");
    day.countIn(record);
    day.load();
    EXPECT_FALSE(day.take(rules, left + 1, 0)) << text;
    EXPECT_TRUE(day.take(rules, left, 0)) << text;
    EXPECT_EQ(record.events, 9u) << text;  // where the next one finds it
  }
}

TEST(Destinations, FitAFrameAndTheirFileWhateverStorebagsName) {
  FakeClock clock;
  FakeFileStore files;
  config::Destinations destinations(files, clock, "/destinations");
  constexpr std::uint64_t kHours = 24, kServers = 300;
  for (std::uint64_t hour = 0; hour < kHours; ++hour) {
    if (hour > 0) clock.advance(3'600);
    for (std::uint64_t i = 0; i < kServers; ++i) {
      const std::string url = "https://" + std::to_string(hour * 1'000 + i) + std::string(5'000, '\1') + "/x";
      destinations.count(http::Departure::Kind::post, url, 1, hour == 0 ? 2 : 1);
    }
  }
  files.put("/destinations", destinations.text());
  config::Destinations next(files, clock, "/destinations");
  next.load();
  const Array all = next.lastDay();
  EXPECT_LT(writeBinaryPropertyList(all).size(), 1'000'000u);
  std::int64_t events = 0;
  std::size_t ofMost = 0;
  for (const Value& one : all) {
    events += one.asDictionary()->find("events")->toInt64().value();
    ofMost += one.asDictionary()->find("bytes")->toInt64() == 2 ? 1u : 0u;
  }
  EXPECT_EQ(events, kHours * kServers);
  EXPECT_EQ(ofMost, config::Destinations::kMost);
}

TEST(DropReceipt, FitsAFrameWhateverProgramsCallThemselves) {
  using Kind = http::Departure::Kind;
  config::DropReceipt receipt;
  receipt.begin();
  constexpr std::int64_t kClients = 5'000;
  for (std::int64_t i = 0; i < kClients; ++i) {
    std::string name;
    for (int n = 0; n < 500; ++n) name += "é";
    receipt.add(
        Kind::post,
        std::make_shared<const Dictionary>(Dictionary{{"sessionID", i}, {"client", name}, {"service", name}}),
        2);
  }
  const Dictionary dropped = receipt.end();
  EXPECT_LT(writeBinaryPropertyList(dropped).size(), 1'000'000u);
  std::int64_t events = 0;
  for (const Value& line : *dropped.array("byClient"))
    events += line.asDictionary()->find("events")->toInt64().value();
  EXPECT_EQ(events, 2 * kClients);
  EXPECT_EQ(dropped.find("events")->toInt64(), events);
}

TEST(OwnerGate, TakesAPolicyOverAtOnceAlsoWhileTheSecretCannotBeRead) {
  const ExpectedLog log({});
  Owner owner;
  FakeClock clock;
  FakePreferences preferences;
  platform::DeviceSecret secret(owner.files, "/secret");
  config::DailyAllowance day(owner.files, clock, "/daily");
  config::OwnerGate gate(owner.policy, preferences, secret, day);
  EXPECT_TRUE(gate.refresh());
  const auto sent = [&gate] {
    Dictionary message{{"kept", 1}, {"number", "0170"}, {"secret", 2}};
    config::EditedFields changes;
    if (const auto& fields = gate.decision()->fields) fields->apply(message, changes);
    return message;
  };
  owner.files.failReads("/secret", platform::FileFailure::Kind::shortage);
  owner.says(R"({"remove": ["secret"]})");
  EXPECT_TRUE(gate.refresh());
  EXPECT_EQ(sent(), (Dictionary{{"kept", 1}, {"number", "0170"}}));
  owner.says(R"({"reporting": "off", "remove": ["secret"], "hash": ["number"]})");
  EXPECT_TRUE(gate.refresh());
  EXPECT_FALSE(gate.refresh());
  EXPECT_EQ(gate.decision()->refusal, policy_reporting);
  EXPECT_EQ(sent(), (Dictionary{{"kept", 1}}));  // what cannot be hashed yet is removed
  owner.files.failReads("/secret", std::nullopt);
  EXPECT_TRUE(gate.refresh());
  EXPECT_EQ(sent().string("number")->size(), 64u);
}

TEST(FieldRules, RemoveAndHashAtAnyDepth) {
  config::PolicyRules rules;
  rules.remove.texts = {"Secret", "both"};
  rules.hash.texts = {"NUMBER", "both"};
  const config::FieldRules fields(rules, std::string(32, 'k'));
  const auto digest = [&fields](Value value) { return Value(fields.digest(value).value()); };
  const Dictionary deep{{"secret", 1}, {"kept", 2}};
  Dictionary message{{"Both", 1},
                     {"SECRET", Array{1}},
                     {"number", "0170"},
                     {"list", Array{deep, Array{Dictionary{{"Number", 7}}}, 3}},
                     {"inner", Dictionary{{"number", Data{"raw"}}, {"plain", true}}}};
  config::EditedFields changes;
  EXPECT_TRUE(fields.apply(message, changes));
  Dictionary plain{{"plain", Array{Dictionary{{"kept", 1}}}}};
  config::EditedFields none;
  EXPECT_FALSE(fields.apply(plain, none));
  EXPECT_TRUE(none.removed.empty() && none.hashed.empty());
  EXPECT_EQ(formats::writeJSON(message),
            formats::writeJSON(Dictionary{
                {"number", digest("0170")},
                {"list", Array{Dictionary{{"kept", 2}}, Array{Dictionary{{"Number", digest(7)}}}, 3}},
                {"inner", Dictionary{{"plain", true}}}}));
  EXPECT_EQ(changes.removed, (std::set<std::string>{"Both", "SECRET", "number", "secret"}));
  EXPECT_EQ(changes.hashed, (std::set<std::string>{"Number", "number"}));
}

TEST(FieldRules, DigestTheTextOfAScalarWithTheSecret) {
  config::PolicyRules rules;
  rules.hash.texts = {"n"};
  const config::FieldRules fields(rules, "key"), others(rules, "other");
  // RFC 2104 with SHA-256 over "The quick brown fox jumps over the lazy dog", a published example.
  EXPECT_EQ(fields.digest("The quick brown fox jumps over the lazy dog"),
            "f7bc83f430538424b13298e6aa6fb143ef4d59a14946175997479dbc2d1a3cd8");
  EXPECT_NE(others.digest("x"), fields.digest("x"));
  EXPECT_EQ(fields.digest(12), fields.digest("12"));
  EXPECT_EQ(fields.digest(true), fields.digest("true"));
  EXPECT_EQ(fields.digest(0.5), fields.digest("0.5"));
  for (const Value& value :
       {Value(std::nan("")), Value(Date{1}), Value(Data{"x"}), Value(Array{}), Value(Dictionary{})})
    EXPECT_EQ(fields.digest(value), std::nullopt);
}

}  // namespace
}  // namespace veltrad
