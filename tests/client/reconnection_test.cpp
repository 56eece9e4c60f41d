// SPDX-License-Identifier: Apache-2.0
// The time of the next attempt to connect, and which calls of the last connection are known to have been run.
#include "client/reconnection.h"

#include <gmock/gmock.h>

#include "client/written_calls.h"

namespace {

using std::chrono::milliseconds;
using veltrad::client::Reconnection;
using veltrad::client::WrittenCalls;
using Phase = Reconnection::Phase;

TEST(Reconnection, WaitsLongerAfterEachFailureAndBeginsAnewAfterAGreeting) {
  const Reconnection::TimePoint now{std::chrono::hours(1)};
  constexpr milliseconds kPatience{5'000};
  Reconnection wish(Phase::waiting, kPatience);
  EXPECT_TRUE(wish.due(now));  // the first attempt is not put off
  const struct {
    double draw;
    milliseconds wait;
  } failures[] = {{0, milliseconds(100)},    {1, milliseconds(400)},     {0.5, milliseconds(600)},
                  {0, milliseconds(800)},    {1, milliseconds(3'200)},   {1, milliseconds(6'400)},
                  {1, milliseconds(12'800)}, {1, milliseconds(25'600)},  {1, milliseconds(30'000)},
                  {0, milliseconds(15'000)}, {-1, milliseconds(15'000)}, {2, milliseconds(30'000)}};
  for (const auto& [draw, wait] : failures) {
    wish.ended(now, draw);
    EXPECT_EQ(wish.phase(), Phase::waiting);
    EXPECT_EQ(*wish.nextStep() - now, wait);
    EXPECT_FALSE(wish.due(now + wait - milliseconds(1)));
    EXPECT_TRUE(wish.due(now + wait));
  }
  for (const bool starts : {true, false}) {
    wish.started();  // said too early, which means nothing
    wish.attempted(now);
    EXPECT_EQ(wish.phase(), Phase::greeting);
    EXPECT_EQ(*wish.nextStep() - now, kPatience);
    wish.greeted(starts);
    EXPECT_EQ(wish.phase(), starts ? Phase::starting : Phase::open);
    EXPECT_FALSE(wish.nextStep());
    wish.started();
    EXPECT_EQ(wish.phase(), Phase::open);
    wish.ended(now, 0);
    EXPECT_EQ(*wish.nextStep() - now, Reconnection::kShortestWait);
  }
  wish.giveUp();
  wish.ended(now, 0);
  EXPECT_EQ(wish.phase(), Phase::over);
  EXPECT_FALSE(wish.due(now + std::chrono::hours(1)));
}

// Calls 1 to 6; 2 and 5 are not counted when lost, 1, 4 and 6 have these IDs.
TEST(Reconnection, WhatAConnectionHasRunIsKnownFromAnswersAndAGoodbye) {
  constexpr std::uint32_t kFirst = 0xffffffff, kFourth = 2, kSixth = 3;  // the IDs wrap
  const struct {
    std::vector<std::uint32_t> answers;
    std::optional<std::uint64_t> goodbye;
    std::uint64_t uncertain;
    bool more;
  } cases[] = {{{}, {}, 4, true},
               {{kFirst}, {}, 3, true},
               {{kFirst, 17}, {}, 3, true},
               {{kFourth, kFirst}, {}, 1, true},
               {{kSixth}, {}, 0, false},
               {{}, 0, 4, true},
               {{}, 2, 3, true},
               {{kFourth}, 2, 1, true},
               {{kFirst}, 5, 1, true},
               {{}, 99, 0, false}};
  WrittenCalls calls;
  for (const auto& one : cases) {
    const std::uint32_t ids[] = {kFirst, 0, 0, kFourth, 0, kSixth};
    for (int i = 0; i < 6; ++i) calls.add(ids[i], i != 1 && i != 4);
    for (const std::uint32_t callID : one.answers) calls.answered(callID);
    if (one.goodbye) calls.ran(*one.goodbye);
    EXPECT_EQ(calls.uncertain(), one.uncertain);
    EXPECT_EQ(calls.awaitsAnswer(), one.more);
    calls.clear();
  }
  const WrittenCalls::TimePoint now{std::chrono::hours(1)};
  for (unsigned i = 0; i < WrittenCalls::kAskedInPeriod; ++i) EXPECT_TRUE(calls.shouldAsk(now));
  for (unsigned i = 1; i < WrittenCalls::kMostUnasked; ++i) EXPECT_FALSE(calls.shouldAsk(now));
  EXPECT_TRUE(calls.shouldAsk(now));
  EXPECT_FALSE(calls.shouldAsk(now));
  EXPECT_TRUE(calls.shouldAsk(now + WrittenCalls::kPeriod));
}

}  // namespace
