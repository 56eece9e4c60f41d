// SPDX-License-Identifier: Apache-2.0
// Small fleets of two thousand devices: the load of each incident on the servers, and the settings that
// spread it.
#include <gtest/gtest.h>

#include <algorithm>
#include <string>

#include "formats/json.h"
#include "simulate/fleet.h"

namespace veltrad {
namespace {

constexpr double kDevices = 2'000;
constexpr const char* kBag =
    R"("release": {"dashboard": {"ip": "10.0.0.1", "port": 7007, "reliable": 500},
        "httppost": {"clients": [{"locale_whitelist": ["US"], "filters": [], "event_threshold": 9,
                                  "post_url": "https://collector.example/events", "sampling_threshold": )";

// A bag with this cycle and share.
std::string bag(int cycle, double threshold = 1) {
  return R"({"refresh_cycle": )" + std::to_string(cycle) + ", " + kBag + std::to_string(threshold) + "}]}}}";
}

Dictionary dictionaryOf(const std::string& more) {
  const auto parsed = formats::parseJSON(R"({"devices": 2000, )" + more + "}");
  EXPECT_TRUE(parsed.ok()) << parsed.error().detail << more;
  return *parsed.value().asDictionary();
}

struct Outcome {
  explicit Outcome(const std::string& more, double threshold = 1)
      : Outcome(dictionaryOf(more + R"(, "bag": )" + bag(3600, threshold))) {}
  explicit Outcome(const Dictionary& given) {
    const auto scenario = simulate::scenarioFrom(given);
    if (!scenario) {
      ADD_FAILURE() << scenario.error();
      return;
    }
    simulate::Fleet fleet(scenario.value());
    fleet.run();
    report = fleet.report();
  }

  // Requests from one second to another, at a server.
  double sent(const char* server, std::size_t from, std::size_t to) const {
    const Array& seconds = *report.dictionary("servers")->dictionary(server)->array("sent");
    double sum = 0;
    for (std::size_t at = from; at < std::min(to, seconds.size()); ++at) sum += *seconds[at].toDouble();
    return sum;
  }
  // The most within five minutes from that second on, as a rate.
  double peak(const char* server, std::size_t from, std::size_t to) const {
    double most = 0;
    for (std::size_t at = from; at < to; at += 60) most = std::max(most, sent(server, at, at + 300) / 300);
    return most;
  }
  double total(const char* name) const { return *report.dictionary("totals")->real(name); }
  double minute(const char* name, std::size_t at) const {
    return *(*report.dictionary("minutes")->array(name))[at].toDouble();
  }

  Dictionary report;
};

constexpr std::size_t kHour = 3'600;
const std::string kOutage =
    R"("hours": 8, "incidents": [{"what": "storebagsDown", "at": 7200, "lasts": 3600}], "settings": )";

TEST(Simulation, AHerdFormsAfterAnOutageAndJitterSpreadsIt) {
  const Outcome herd(kOutage + R"({"storebags": {"openSessions": "follow"}})");
  const double mean = kDevices / kHour;
  EXPECT_NEAR(herd.sent("storebags", 0, 2 * kHour) / (2 * kHour), mean, mean / 10);
  EXPECT_GT(herd.peak("storebags", 3 * kHour, 4 * kHour), 3 * mean);
  EXPECT_GT(herd.peak("storebags", 6 * kHour, 8 * kHour), 3 * mean);  // and it stays
  for (const char* jitter : {"0.5", "1"}) {
    const Outcome spread(kOutage + R"({"storebags": {"openSessions": "follow"}, "jitter": )" + jitter + "}");
    const double its = spread.sent("storebags", 0, 2 * kHour) / (2 * kHour);
    EXPECT_NEAR(its, mean / (1 - std::stod(jitter) / 2), its / 10) << jitter;
    EXPECT_LT(spread.peak("storebags", 3 * kHour, 8 * kHour), 2 * its) << jitter;
    EXPECT_EQ(spread.minute("without", 479), 0);
  }
  // Where only sessions that begin ask, they are spread by themselves.
  const Outcome asked(kOutage + "{}");
  EXPECT_LT(asked.peak("storebags", 3 * kHour, 8 * kHour), mean);
}

TEST(Simulation, WhatACollectorRefusesIsLostOrKeptAndComesLater) {
  const std::string incident =
      R"("hours": 6, "incidents": [{"what": "collectorAnswers", "at": 3600, "lasts": 600, "status": 503}], "settings": )";
  const Outcome lost(incident + "{}");
  EXPECT_GT(lost.total("lost"), 1'000);
  EXPECT_GT(lost.minute("silenced", 75), kDevices / 20);
  EXPECT_EQ(lost.minute("silenced", 359), lost.minute("silenced", 75));  // until their sessions end
  const Outcome kept(incident + R"({"spool": {}})");
  EXPECT_EQ(kept.total("lost"), 0);
  EXPECT_EQ(kept.total("kept"), 0);
  EXPECT_EQ(kept.minute("silenced", 75), 0);
  EXPECT_GT(kept.minute("keptPosts", 69), kDevices / 10);
  EXPECT_EQ(kept.minute("keptPosts", 100), 0);
  // All is there in the end, and a wait was kept after "Retry-After".
  const Outcome calm(R"("hours": 6, "settings": {"spool": {}})");
  EXPECT_NEAR(kept.total("delivered"), calm.total("delivered"), calm.total("delivered") / 20);
  const Outcome later(
      R"("hours": 6, "settings": {"spool": {}}, "incidents": [)"
      R"({"what": "collectorAnswers", "at": 3600, "lasts": 600, "status": 429, "retryAfter": 1800}])");
  EXPECT_GT(later.minute("keptPosts", 85), later.minute("keptPosts", 69));
  EXPECT_EQ(later.total("kept"), 0);
}

TEST(Simulation, DatagramsWithoutAcknowledgementComeFiveTimes) {
  const std::string calm = R"("hours": 2, "lossOfDatagrams": 0)";
  const double sent = Outcome(calm).sent("dashboards", 0, 2 * kHour);
  const Outcome down(calm + R"(, "incidents": [{"what": "dashboardsDown", "at": 0, "lasts": 7000}])");
  EXPECT_NEAR(down.sent("dashboards", 0, 2 * kHour), 5 * sent - 4 * sent * 200 / 7'200, sent / 10);
  const Outcome lossy(R"("hours": 2, "lossOfDatagrams": 0.1)");
  EXPECT_NEAR(lossy.sent("dashboards", 0, 2 * kHour), sent * (1 + 0.19 + 0.19 * 0.19), sent / 20);
}

TEST(Simulation, AShortCycleCountsUntilTheServerSaysNotModified) {
  const std::string push =
      R"("hours": 4, "settings": {"storebags": {"openSessions": "follow"}}, "incidents": [)"
      R"({"what": "push", "at": 3600, "bag": )" +
      bag(60) + "}]";
  const Outcome conditional(push);
  EXPECT_EQ(conditional.minute("newest", 125), kDevices);
  EXPECT_LT(conditional.peak("storebags", kHour, 4 * kHour), 3 * kDevices / kHour);
  const Outcome whole(push + R"(, "conditional": false)");
  EXPECT_NEAR(whole.sent("storebags", 3 * kHour, 4 * kHour), kDevices * 60, kDevices * 3);
}

TEST(Simulation, ADrawnFactorIsTheSameOnAllDevicesAfterAStart) {
  const std::string cut =
      R"("hours": 3, "incidents": [{"what": "powerCut", "at": 3600, "lasts": 120, "bootsWithin": 600}], )"
      R"("settings": {"storebags": {"persist": true}, "sampling": )";
  const Outcome stable(cut + R"("stable"})", 0.1);
  const Outcome drawn(cut + R"("drawn"})", 0.1);
  for (const std::size_t at : {30u, 90u, 179u}) {
    EXPECT_NEAR(stable.minute("reporting", at), kDevices / 10, kDevices / 50) << at;
    EXPECT_EQ(drawn.minute("reporting", at), kDevices) << at;
  }
  EXPECT_EQ(stable.minute("on", 61), 0);
  EXPECT_EQ(stable.minute("on", 90), kDevices);
}

TEST(Simulation, TheSameSeedGivesTheSame) {
  const std::string all =
      R"("hours": 1, "settings": {"jitter": 0.5, "spool": {}, "storebags": {"openSessions": "follow"}}, "seed": )";
  EXPECT_EQ(Outcome(all + "7").report, Outcome(all + "7").report);
  EXPECT_NE(Outcome(all + "7").report, Outcome(all + "8").report);
}

TEST(Simulation, AScenarioThatIsWrongIsRefused) {
  const std::pair<const char*, const char*> table[] = {
      {R"("speed": 1)", R"("speed": unknown key)"},
      {R"("hours": 0)", R"("hours": expected a number from 0.01 to 1000)"},
      {R"("hours": "8")", R"("hours": expected a number from 0.01 to 1000)"},
      {R"("incidents": [{"what": "flood"}])",
       R"("incidents": "what": expected storebagsDown, collectorAnswers, dashboardsDown, powerCut or push)"},
      {R"("incidents": [{"what": "push", "bag": {}}])",
       R"("bag": expected "release", "httppost", "clients" with an entry)"}};
  for (const auto& [text, why] : table) {
    const auto scenario = simulate::scenarioFrom(dictionaryOf(std::string(text) + R"(, "bag": )" + bag(60)));
    ASSERT_FALSE(scenario.ok()) << text;
    EXPECT_EQ(scenario.error(), why);
  }
}

}  // namespace
}  // namespace veltrad
