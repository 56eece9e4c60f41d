// SPDX-License-Identifier: Apache-2.0
// The decisions of the spool: which results keep a post, which posts may still leave, and when an address is
// tried.
#include <gtest/gtest.h>
#include <malloc.h>

#include "backends/https/spool_backlog.h"
#include "backends/https/spool_verdicts.h"
#include "backends/https/spool_waits.h"
#include "config/owner_gate.h"
#include "formats/json.h"
#include "support/spool_entry.h"

namespace veltrad {
namespace {

using backends::SpoolWait;
using http::HTTPError;

TEST(SpoolVerdicts, WhatMayComeThroughLaterIsKept) {
  for (const int status : {408, 425, 429, 500, 502, 503, 504, 507, 599})
    EXPECT_TRUE(backends::isToBeKept(http::HTTPResponse{status, {}, {}})) << status;
  for (const int status : {200, 204, 301, 400, 401, 403, 404, 410, 413, 501, 505, 600})
    EXPECT_FALSE(backends::isToBeKept(http::HTTPResponse{status, {}, {}})) << status;
  using Kind = HTTPError::Kind;
  // Kept; tells of the server.
  const std::tuple<Kind, bool, bool> kinds[] = {
      {Kind::transport, true, true}, {Kind::tooMany, true, false},   {Kind::stopping, true, false},
      {Kind::tooLarge, false, true}, {Kind::shortage, false, false}, {Kind::refused, false, false}};
  for (const auto& [kind, kept, tells] : kinds) {
    const http::HTTPResult ended = Failure{HTTPError{kind, "text", 200}};
    EXPECT_TRUE(backends::isToBeKept(ended) == kept && backends::tellsOfServer(ended) == tells)
        << static_cast<int>(kind);
  }
}

TEST(SpoolVerdicts, ATryIsEachTimeThatThePostWentOutOrFoundNoServer) {
  http::HTTPResponse answer{200, {}, {}};
  EXPECT_EQ(backends::triesOf(answer), 1);
  answer.transmissions = 2;
  EXPECT_EQ(backends::triesOf(answer), 2);
  HTTPError waiting{HTTPError::Kind::tooMany, "full"}, unresolved{HTTPError::Kind::transport, "no such host"};
  unresolved.begun = true;
  HTTPError cut = unresolved, limited = unresolved;
  cut.transmissions = 3;
  limited.refusal = wire::Reason::over_daily_limit;
  const std::pair<HTTPError, int> rows[] = {{waiting, 0}, {unresolved, 1}, {cut, 3}, {limited, 0}};
  for (const auto& [error, tries] : rows) EXPECT_EQ(backends::triesOf(Failure{error}), tries);
}

TEST(SpoolVerdicts, TheOwnerThenTheEntryThenConsentDecideWhatMayLeave) {
  const Dictionary entry{{"client", "phone"}, {"locale_whitelist", Array{"US"}}, {"filters", Array{}}};
  const auto section = [&](const Dictionary& changes) {
    Dictionary changed = entry;
    changed.merge(changes);
    return config::parseSection({{"httppost", Dictionary{{"clients", Array{changed}}}}});
  };
  const auto decision = [](config::PolicyRules rules, std::optional<wire::Reason> refusal = std::nullopt) {
    return config::OwnerDecision{std::make_shared<const config::Policy>(std::move(rules)), refusal, nullptr,
                                 0};
  };
  config::PolicyRules hosts, names;
  hosts.hosts = {{"other.test"}, Array{"other.test"}};
  names.backends = {{"dashboard"}, Array{"dashboard"}};
  const auto open = decision({});
  using Facts = std::optional<backends::ClientFacts>;
  const Facts yes = backends::ClientFacts{true, "US", "Desktop", "Workbench 3", 0.9}, unknown;
  Facts no = yes, abroad = yes;
  no->consent = false;
  abroad->country = "DE";
  support::SpoolEntry asks, free, hidden;
  asks.url = "https://h.test:1/events";
  asks.asksEntry = true;
  asks.client = {{"client", "phone"}};
  asks.about = {{"backend", "httppost"}};
  free = hidden = asks;
  free.asksEntry = false;
  hidden.namesHidden = true;
  hidden.client = {};
  const auto good = section({}), over = section({{"override_dnu", 1}}), other = section({{"client", "lamp"}}),
             unfiltered = section({{"filters", 0}}), withoutBackend = config::parseSection({});
  using enum wire::Reason;
  constexpr auto none = std::nullopt;
  const struct {
    const support::SpoolEntry& post;
    const config::OwnerDecision& decision;
    const config::StorebagSection* section;
    const Facts& facts;
    std::optional<wire::Reason> reason;
    bool waits = false;
  } rows[] = {{asks, open, good.get(), yes, none},  // whatever the draw
              {asks, open, good.get(), no, no_consent},
              {asks, open, over.get(), no, none},
              {asks, open, good.get(), abroad, country_not_listed},
              {asks, open, other.get(), yes, no_entry},
              {asks, open, withoutBackend.get(), yes, no_entry},
              {asks, open, unfiltered.get(), yes, no_filters},
              {asks, open, nullptr, yes, none},
              {asks, open, nullptr, no, no_consent},
              {hidden, open, over.get(), no, no_consent},
              {hidden, open, other.get(), yes, none},
              {free, open, other.get(), no, none},
              {free, open, nullptr, no, none},
              {free, decision({}, privacy_off), nullptr, yes, privacy_off},
              {free, decision({}, policy_consent), nullptr, no, policy_consent},
              {free, decision(hosts), nullptr, yes, policy_hosts},
              {asks, decision(names), good.get(), yes, policy_backends},
              {asks, open, good.get(), unknown, none, true},
              {free, open, nullptr, unknown, none},
              {asks, decision({}, privacy_off), nullptr, unknown, privacy_off}};
  for (const auto& row : rows) {
    const auto [reason, waits] = backends::verdictOnLeaving(row.post, row.decision, row.section, row.facts);
    EXPECT_TRUE(reason == row.reason && waits == row.waits) << &row - rows;
    if (reason) {
      const std::string_view text = wire::entryOf(backends::countedFromSpool(*reason)).text;
      EXPECT_TRUE(text.ends_with(": " + std::string(wire::entryOf(*reason).name))) << text;
    }
  }
}

// The list of a full spool takes 1.5 MiB.
TEST(SpoolBacklog, GivesTheMemoryOfItsListBackOnceAllOfItIsReadOrTaken) {
  const auto held = [] {
    const auto of = ::mallinfo2();
    return of.uordblks + of.hblkhd;
  };
  constexpr std::size_t kNames = 65'536, kBytes = kNames * sizeof(support::SpoolFolder::Name);
  for (const bool reads : {true, false}) {
    backends::SpoolBacklog backlog;
    ASSERT_TRUE(backlog.isToBeListed());
    const std::size_t before = held();
    backlog.listed(std::vector<support::SpoolFolder::Name>(kNames));
    if (held() < before + kBytes) GTEST_SKIP() << "a sanitizer's allocator tells nothing";
    while (reads && backlog.next()) backlog.wasRead(true);
    if (!reads) EXPECT_EQ(backlog.takeAll(std::chrono::steady_clock::now())->size(), kNames);
    EXPECT_TRUE(backlog.isDone());
    EXPECT_LT(held(), before + kBytes / 2) << reads;
  }
}

TEST(SpoolWait, DoublesUntilASuccess) {
  const backends::SpoolPace pace{4, 30, 100};
  SpoolWait wait(pace);
  EXPECT_TRUE(wait.next() <= 1000 && !wait.refuses(1000));
  wait.failed(1000, false, 0, 0.5, "HTTP 503");
  EXPECT_TRUE(wait.refuses(1000) && wait.next() == 1015 && wait.lastError() == "HTTP 503");
  wait.failed(1001, false, 0, 0.9, "cut");  // others that were under way
  wait.failed(1002, true, 0, 0.9, "cut");
  EXPECT_EQ(wait.next(), 1015);
  const std::pair<double, double> tries[] = {
      {0.5, 30}, {0.5, 50}, {0, 0}, {0.99, 99}};  // waits of 60, 100, 100
  double now = 1015;
  for (const auto& [draw, later] : tries) {
    wait.failed(now, true, 0, draw, "HTTP 503");
    EXPECT_DOUBLE_EQ(wait.next(), now + later);
    now += later;
  }
  wait.succeeded();
  EXPECT_TRUE(!wait.refuses(now) && wait.next() <= now);
  wait.failed(now, false, 0, 0.5, "HTTP 503");
  EXPECT_EQ(wait.next(), now + 15);
}

TEST(SpoolWait, HeedsWhatTheServerAsksForAndWakesSooner) {
  const backends::SpoolPace pace{4, 30, 900};
  SpoolWait wait(pace);
  wait.failed(1000, false, 20, 0.5, "HTTP 429");
  EXPECT_EQ(wait.next(), 1020);
  wait.failed(1005, false, 5, 0.5, "HTTP 429");  // no sooner
  EXPECT_EQ(wait.next(), 1020);
  wait.woken(1006, 0.1);
  EXPECT_EQ(wait.next(), 1020);  // not above the server's word
  wait.emptied();
  EXPECT_TRUE(wait.refuses(1019) && !wait.refuses(1020) && wait.nextTry() == 1020);
  wait.hurried();
  EXPECT_TRUE(!wait.refuses(1007) && wait.nextTry() == 0);
  wait.failed(1010, false, 0, 0.9, "a");
  double tried = 0;
  for (int i = 0; i < 5; ++i) wait.failed(tried = wait.next(), true, 0, 0.9, "a");
  EXPECT_DOUBLE_EQ(wait.next(), tried + 0.9 * 900);
  wait.woken(tried + 100, 0.5);
  EXPECT_DOUBLE_EQ(wait.next(), tried + 115);
  wait.woken(tried + 101, 0.1);  // routes that come and go do not hurry it
  EXPECT_DOUBLE_EQ(wait.next(), tried + 115);
  wait.failed(tried + 115, true, 0, 0.5, "a");
  EXPECT_DOUBLE_EQ(wait.next(), tried + 145);  // doubles from the first wait again
  wait.succeeded();
  wait.left(1200);
  EXPECT_EQ(wait.next(), 1200.25);
  wait.left(1200.35);  // late, which the pace makes up for
  EXPECT_EQ(wait.next(), 1200.5);
  wait.left(1203);  // what was not used is gone
  EXPECT_EQ(wait.next(), 1203.25);
  wait.postponed(1204);
  EXPECT_TRUE(wait.next() == 1204 && !wait.refuses(1203) && wait.nextTry() == 0);
  wait.failed(1300, false, 20, 0.5, "HTTP 429");
  wait.succeeded();  // of a post that had begun before
  EXPECT_TRUE(wait.refuses(1319) && !wait.refuses(1320));
}

}  // namespace
}  // namespace veltrad
