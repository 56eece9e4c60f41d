// SPDX-License-Identifier: Apache-2.0
// When a held message is published, how long it is held, and the bounds; and when the stream may be purged.
#include "gateway/held_messages.h"

#include <gmock/gmock.h>

#include "fakes/scarce_memory.h"
#include "gateway/drain.h"
#include "gateway/refusals.h"
#include "gateway/stream.h"

namespace veltrad::gateway {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;

class Held : public testing::Test {
 protected:
  bool add(const std::string& id, std::size_t bytes = 10) {
    HeldMessages::Completion completion = [this, id](Outcome outcome) { told.emplace_back(id, outcome); };
    return held.add({"events", id, {}, std::string(bytes, 'x')}, completion, now);
  }
  std::vector<std::string> due() {
    std::vector<std::string> ids;
    while (const auto one = held.due(now)) ids.push_back(one->message->id);
    return ids;
  }
  void tell(const std::vector<HeldMessages::Waiter>& waiters, Outcome outcome) {
    for (const auto& waiter : waiters) waiter.completion(outcome);
  }

  HeldMessages::Time now{1h};
  // Of the second message that is added.
  std::uint64_t token = 2;
  HeldMessages held{{.bytes = 2'000, .messages = 3, .hold = 15s, .again = 1s, .afterRefusal = 250ms}};
  std::vector<std::pair<std::string, Outcome>> told;
};

TEST_F(Held, ArePublishedAgainUntilTheyAreTakenOrTooLate) {
  ASSERT_TRUE(add("a"));
  EXPECT_THAT(due(), ElementsAre("a"));
  EXPECT_THAT(due(), IsEmpty());
  // One second, then twice as long each time.
  for (const auto& [wait, published] : {std::pair(999ms, false), {1ms, true}, {1999ms, false}, {1ms, true}}) {
    now += wait;
    EXPECT_EQ(!due().empty(), published) << wait.count();
  }
  held.refused(1, now);
  EXPECT_EQ(held.next(), now + 250ms);
  for (const auto wait : {500ms, 1000ms, 2000ms, 4000ms, 4000ms}) {
    held.refused(1, now);
    EXPECT_EQ(held.next(), now + wait);
  }
  held.allDue(now);
  EXPECT_THAT(due(), ElementsAre("a"));
  now += 11'999ms;
  EXPECT_THAT(held.expired(now), IsEmpty());
  now += 1ms;
  tell(held.expired(now), Outcome::late);
  EXPECT_THAT(told, ElementsAre(std::pair("a", Outcome::late)));
  EXPECT_THAT(held.taken(1), IsEmpty()) << "an answer that comes too late";
  EXPECT_EQ(held.bytes(), 0u);
  EXPECT_EQ(held.next(), std::nullopt);
}

TEST_F(Held, OfOneIDArePublishedOnceAndAllAreTold) {
  ASSERT_TRUE(add("a"));
  ASSERT_TRUE(add("a"));
  EXPECT_THAT(due(), ElementsAre("a"));
  tell(held.taken(1), Outcome::taken);
  EXPECT_THAT(told, ElementsAre(std::pair("a", Outcome::taken), std::pair("a", Outcome::taken)));
  ASSERT_TRUE(add("a")) << "it is new again";
  EXPECT_THAT(due(), ElementsAre("a"));
}

TEST_F(Held, AreBoundedByNumberAndBytes) {
  ASSERT_TRUE(add("a") && add("b") && add("c"));
  EXPECT_FALSE(add("d")) << "a fourth message";
  EXPECT_TRUE(add("a")) << "one that joins takes no room";
  tell(held.taken(2), Outcome::taken);
  EXPECT_FALSE(add("e", 1'300)) << "more bytes than are left";
  EXPECT_TRUE(add("f", 900));
}

TEST_F(Held, AreAddedAsAWholeOrNotAtAll) {
  ASSERT_TRUE(add("a"));
  forEachShortage([this](const auto& whenShort) {
    for (const char* id : {"a", "b"}) {  // one that joins, one that is new
      Message message{"events", id, {}, "x"};
      bool called = false, added = false;
      HeldMessages::Completion completion = [&called](Outcome) { called = true; };
      const std::size_t before = held.bytes();
      whenShort([&] { added = held.add(std::move(message), completion, now); });
      EXPECT_EQ(static_cast<bool>(completion), !added);
      const bool isNew = added && *id == 'b';
      EXPECT_EQ(held.messages(), isNew ? 2u : 1u);
      EXPECT_EQ(held.bytes() > before, isNew);
      if (!isNew) continue;
      tell(held.taken(std::exchange(token, token + 1)), Outcome::taken);
      EXPECT_TRUE(called);
      EXPECT_THAT(due(), testing::Not(testing::Contains("b")));
    }
  });
}

TEST_F(Held, EndWhenTheProcessEnds) {
  ASSERT_TRUE(add("a"));
  held.endBy(now + 2s);
  now += 2s;
  tell(held.expired(now), Outcome::late);
  EXPECT_EQ(told.size(), 1u);
}

TEST(Answers, OfTheStreamSayWhetherItHasTheMessage) {
  const std::pair<const char*, const char*> rows[] = {
      {R"({"stream":"VELTRA","seq":7})", ""},
      {R"({"stream":"VELTRA","seq":7,"duplicate":true})", ""},
      {R"({"stream":"VELTRA","seq":0,"duplicate":true})", "an answer without a place in the stream"},
      {R"({"stream":"VELTRA"})", "an answer without a place in the stream"},
      {R"({"error":{"code":503,"description":"maximum bytes exceeded"},"seq":0})", "maximum bytes exceeded"},
      {R"({"error":{"code":503}})", "an error without a description"},
      {"[]", "an answer that is no object"},
      {"+OK", "an answer that is no object"},
  };
  for (const auto& [answer, why] : rows) EXPECT_EQ(refusalInAnswer(answer), why) << answer;
}

TEST(PurgePlan, WaitsForTheIDsToBeForgotten) {
  PurgePlan plan(150s);
  PurgePlan::Time now{1h};
  plan.reached(10, now);
  plan.reached(20, now + 100s);
  EXPECT_EQ(plan.due(now + 149s), std::nullopt);
  EXPECT_EQ(plan.due(now + 150s), 10u);
  EXPECT_EQ(plan.due(now + 200s), std::nullopt);
  EXPECT_EQ(plan.due(now + 250s), 20u);
}

TEST(LostTail, IsCertainWhenTheStreamStaysBehindTheTables) {
  LostTail lost;
  const LostTail::Time now{1h};
  const std::tuple<std::chrono::seconds, std::uint64_t, bool> rows[] = {
      {0s, 10, false}, {5s, 9, false},  {24s, 9, false}, {24s, 10, false},
      {25s, 9, false}, {44s, 8, false}, {45s, 9, true},
  };
  for (const auto& [after, last, certain] : rows)
    EXPECT_EQ(lost.isCertain(10, last, now + after), certain) << after.count();
}

TEST(KeepingRate, IsTenASecond) {
  KeepingRate rate;
  const KeepingRate::Time now{1h};
  int kept = 0;
  for (int i = 0; i < 30; ++i) kept += rate.allows(now + i * 50ms);
  EXPECT_EQ(kept, 20);
}

}  // namespace
}  // namespace veltrad::gateway
