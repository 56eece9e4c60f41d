// SPDX-License-Identifier: Apache-2.0
// The bounds of the accounts, eviction, and limited log lines.
#include "platform/memory_budget.h"

#include <gtest/gtest.h>

#include <thread>

#include "platform/limited_line.h"

namespace veltrad::platform {
namespace {

using enum platform::MemoryUse;

TEST(MemoryBudget, HoldsEachBoundToTheByteAndGetsAllBack) {
  const platform::MemoryBounds alone{100, 90, 80, 190, 180}, crowded{100, 90, 80, 110, 105};
  const struct {
    platform::MemoryBounds bounds;
    platform::MemoryUse use;
    std::size_t mine, others, fits;  // bytes of that use already charged, and what then fits
  } table[] = {{alone, working, 30, 0, 70},    {alone, kept, 30, 0, 60},
               {alone, unfinished, 30, 0, 50}, {crowded, working, 30, 50, 30},
               {crowded, kept, 30, 50, 25},    {crowded, unfinished, 30, 50, 25}};
  for (const auto& c : table) {
    platform::MemoryBudget budget(c.bounds);
    const auto mine = budget.accountOf(1), other = budget.accountOf(2);
    ASSERT_EQ(budget.accountOf(1), mine);
    std::vector<std::optional<platform::Charge>> charges;
    charges.push_back(mine->tryCharge(c.mine, c.use));
    charges.push_back(other->tryCharge(c.others, c.use));
    for (const bool again : {false, true}) {  // a refusal has left nothing behind
      EXPECT_FALSE(mine->tryCharge(c.fits + 1, c.use)) << c.fits << again;
      EXPECT_FALSE(charges[0]->resize(c.mine + c.fits + 1));
    }
    if (c.use == unfinished) EXPECT_TRUE(!mine->unfinishedFull(50) && mine->unfinishedFull(51));
    charges.push_back(mine->tryCharge(c.fits, c.use));
    ASSERT_TRUE(charges.back()) << c.fits;
    EXPECT_EQ(budget.used(), c.mine + c.others + c.fits);
    charges.clear();
    EXPECT_EQ(budget.used() + mine->used() + other->used(), 0u);
    EXPECT_TRUE(mine->tryCharge(80, c.use));
  }
}

TEST(MemoryBudget, ChargesMoveGrowShrinkAndJoin) {
  platform::MemoryBudget budget;
  const auto account = budget.accountOf(1);
  platform::Charge one = *account->tryCharge(10, kept), empty;
  EXPECT_TRUE(empty.resize(0) && !empty.resize(1));
  platform::Charge moved = std::move(one);
  EXPECT_TRUE(moved.resize(30) && moved.resize(25));
  moved.add(*account->tryCharge(5, kept));
  empty.add(std::move(moved));
  EXPECT_EQ(empty.bytes(), 30u);
  EXPECT_EQ(account->used(), 30u);
  empty = *account->tryCharge(7, working);  // what it held is paid back
  EXPECT_EQ(account->used(), 7u);
}

// Parts of ten bytes, each with its turn.
struct Kept final : platform::Evictable {
  std::optional<std::uint64_t> oldestTurn() const override {
    return turns.empty() ? std::nullopt : std::optional(turns.front());
  }
  void dropOldest() override {
    turns.erase(turns.begin());
    ASSERT_TRUE(charge.resize(charge.bytes() - 10));
  }
  std::vector<std::uint64_t> turns;
  platform::Charge charge;
};

TEST(MemoryBudget, TheOldestPartsOfAUserMakeRoomAndNobodyElses) {
  platform::MemoryBudget budget(
      {.user = 100, .userKept = 50, .userUnfinished = 50, .all = 200, .allKept = 200});
  const auto account = budget.accountOf(1), other = budget.accountOf(2);
  const auto first = std::make_shared<Kept>(), second = std::make_shared<Kept>();
  account->add(std::make_shared<Kept>());  // has gone
  account->add(first);
  account->add(second);
  for (const auto& kept : {second, first, second, first, first}) {
    kept->charge.add(*account->keep(10));
    kept->turns.push_back(account->nextTurn());
  }
  EXPECT_FALSE(account->keep(51));  // no use to drop anything for it
  EXPECT_TRUE(other->keep(50));
  EXPECT_EQ(account->used(), 50u);
  auto more = account->keep(15);
  ASSERT_TRUE(more && first->turns == std::vector<std::uint64_t>({3, 4}) && second->turns.size() == 1);
  EXPECT_TRUE(account->keepMore(*more, 25));
  EXPECT_EQ(first->turns, std::vector<std::uint64_t>({4}));
  EXPECT_TRUE(second->turns.empty());
  const auto working = account->tryCharge(50, platform::MemoryUse::working);
  const auto last = account->keep(10);  // the last of them goes
  EXPECT_TRUE(last && first->turns.empty() && !account->dropOldest() && !account->keep(1));
}

TEST(MemoryBudget, WhoWaitsIsWokenByWhatIsPaidBackOrGivesUp) {
  platform::MemoryBudget budget(
      {.user = 100, .userKept = 50, .userUnfinished = 50, .all = 120, .allKept = 100});
  const auto account = budget.accountOf(1), other = budget.accountOf(2);
  EXPECT_FALSE(account->waitToCharge(101, [] { return ADD_FAILURE() << "never fits", true; }));
  auto held = other->tryCharge(60, working);
  int asked = 0;
  EXPECT_FALSE(account->waitToCharge(61, [&] { return ++asked == 3; }));
  EXPECT_EQ(account->used(), 0u);
  std::atomic<bool> waits{false};
  std::thread waiter([&] { EXPECT_TRUE(account->waitToCharge(61, [&] { return waits = true, false; })); });
  while (!waits) std::this_thread::yield();
  held.reset();
  waiter.join();
}

TEST(LimitedLine, IsSaidOnceAndThenCountedOnceASecond) {
  platform::LimitedLine line("posts");
  const platform::LimitedLine::Time begin{};
  using Said = std::optional<std::string>;
  const std::tuple<int, const char*, Said> story[] = {
      {0, "a", "a"},     {1, "b", {}},
      {999, "c", {}},    {1'000, "d", "d (3 posts since the last such line)"},
      {1'999, "e", {}},  {5'000, "f", "f (2 posts since the last such line)"},
      {9'000, "g", "g"}, {9'001, "h", {}}};
  for (const auto& [at, text, said] : story)
    EXPECT_EQ(line.happened(text, begin + std::chrono::milliseconds(at)), said) << text;
  EXPECT_EQ(line.rest(), "h");
  EXPECT_EQ(line.rest(), std::nullopt);
}

}  // namespace
}  // namespace veltrad::platform
