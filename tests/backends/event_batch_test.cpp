// SPDX-License-Identifier: Apache-2.0
// The bounds and sums of a batch, and what happens to it while the session ID changes or memory runs out.
#include "backends/https/event_batch.h"

#include <gtest/gtest.h>

#include "backends/https/held_events.h"
#include "platform/counters.h"

namespace veltrad {
namespace {

backends::EventText event(int number, const std::string& sessionID = "old") {
  return backends::eventText({{"_sessionID", sessionID}, {"number", number}});
}

TEST(EventBatch, IsFullAtItsBoundsAndReachesThresholdsByMethod) {
  backends::EventBatch batch;
  const backends::EventSize half{backends::EventBatch::kMostBytes / 2, 10};
  EXPECT_FALSE(batch.full({backends::EventBatch::kMostBytes, 0}));
  EXPECT_TRUE(batch.full({backends::EventBatch::kMostBytes + 1, 0}));
  batch.add(5, {event(0), half, 7});
  EXPECT_FALSE(batch.full(half));
  EXPECT_TRUE(batch.full({half.json + 1, 0}));
  batch.dropOldest();
  batch.dropOldest();  // of none
  EXPECT_EQ(batch.chargedBytes(), 0u);
  const backends::EventSize small = backends::sizeOfEvent(event(1));
  for (std::size_t i = 0; i < backends::EventBatch::kMostEvents; ++i) {
    ASSERT_FALSE(batch.full(small));
    batch.add(i % 2 == 0 ? 5 : 6, {event(1), small, i});
  }
  EXPECT_TRUE(batch.full({}));
  EXPECT_TRUE(batch.thresholdReached(5, 2048) && !batch.thresholdReached(5, 2049));  // one was dropped
  EXPECT_TRUE(batch.thresholdReached(6, 2047) && !batch.thresholdReached(6, 2048));
  EXPECT_TRUE(batch.thresholdReached(7, -1) && !batch.thresholdReached(7, 0));
  batch.restartCount(5);
  EXPECT_FALSE(batch.thresholdReached(5, 0));
  batch.dropOldest();
  EXPECT_EQ(batch.oldestTurn(), 1u);
  batch.setSessionID("a much longer one than before");
  const std::size_t sum = batch.chargedBytes();
  batch.discard();
  EXPECT_TRUE(batch.thresholdReached(6, 2047) && batch.chargedBytes() == 0);
  batch.add(6, {event(2), small, 9, true});
  batch.unsettle();
  const auto taken = batch.take();
  EXPECT_TRUE(taken.size() == 1 && taken[0].text == event(2) && !taken[0].settled);
  EXPECT_TRUE(!batch.thresholdReached(6, 0) && batch.size() == 0 && !batch.oldestTurn());
  const auto renamed = backends::sizeOfEvent(event(1, "a much longer one than before"));
  EXPECT_EQ(sum, (backends::EventBatch::kMostEvents - 1) * renamed.charged);
}

TEST(HeldEvents, FollowTheSessionIDAndPayForWhatTheyHold) {
  platform::Counters counters;
  const backends::EventSize size = backends::sizeOfEvent(event(1));
  platform::MemoryBounds bounds;
  bounds.userKept = 3 * size.charged;
  platform::MemoryBudget budget(bounds);
  const auto account = budget.accountOf(1);
  const auto held = std::make_shared<backends::HeldEvents>(counters, platform::FateWriter());
  account->add(held);
  const auto add = [&](int number, std::uint64_t built) {
    auto charge = account->keep(size.charged);
    ASSERT_TRUE(charge);
    held->add(5, {event(number), size, account->nextTurn()}, std::move(*charge), built, wire::Step::batched,
              {});
  };
  const auto built = held->sessionIDChanges();
  for (int number : {1, 2, 3, 4}) add(number, built);  // the first makes room for the fourth
  EXPECT_EQ(counters.value(wire::Reason::event_over_share), 1u);
  EXPECT_EQ(account->used(), 3 * size.charged);
  held->setSessionID(std::string(size.charged / 6, 'n'));  // longer ones keep more: not all of them fit
  EXPECT_EQ(counters.value(wire::Reason::event_over_share), 2u);
  EXPECT_LE(account->used(), bounds.userKept);
  held->setSessionID("new");
  add(5, built);  // built before, added after
  auto taken = held->take();
  EXPECT_EQ(taken.charge.bytes(), account->used());
  std::size_t charged = 0;
  for (int number = 3; const auto& one : taken.events) {
    EXPECT_EQ(one.text, event(number++, "new"));
    charged += backends::sizeOfEvent(one.text).charged;
  }
  EXPECT_TRUE(taken.events.size() == 3 && account->used() == charged);
  taken.charge.release();
  add(6, held->sessionIDChanges());
  EXPECT_EQ(held->needOf(5, 0, size), backends::HeldEvents::Need::flush);
  EXPECT_EQ(held->needOf(5, 1, size), backends::HeldEvents::Need::room);
  EXPECT_EQ(held->needOf(5, 1, {backends::EventBatch::kMostBytes, 0}), backends::HeldEvents::Need::bound);
  held->add(5, {event(7), {backends::EventBatch::kMostBytes, size.charged}, 9}, *account->keep(size.charged),
            2, wire::Step::batched, {});
  EXPECT_EQ(counters.value(wire::Reason::batch_full), 1u);
  held->discard(wire::Reason::refused_by_owner);
  EXPECT_EQ(counters.value(wire::Reason::refused_by_owner), 1u);
  EXPECT_EQ(account->used(), 0u);
}

}  // namespace
}  // namespace veltrad
