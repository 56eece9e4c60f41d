// SPDX-License-Identifier: Apache-2.0
// The run-time check of the lock order, in debug builds only.
#include "base/mutex.h"

#include <gtest/gtest.h>

namespace veltrad {
namespace {

#ifndef NDEBUG

// Clang refuses the wrong orders where it sees them.
void takeBoth(Mutex& first, Mutex& second) NO_THREAD_SAFETY_ANALYSIS {
  first.lock();
  second.lock();
  second.unlock();
  first.unlock();
}

void takeBoth(LockRank firstRank, LockRank secondRank) {
  Mutex first{firstRank};
  Mutex second{secondRank};
  takeBoth(first, second);
}

TEST(LockOrderDeathTest, aLockOfNoHigherRankAborts) {
  constexpr LockRank kLow{10}, kHigh{20}, kAboveLeaves{101};
  takeBoth(kLow, kHigh);
  takeBoth(kHigh, LockRank::leaf);
  takeBoth(LockRank::leaf, kAboveLeaves);
  EXPECT_DEATH(takeBoth(kHigh, kLow), "lock order: a lock of rank 10 is wanted while one of rank 20 is held");
  EXPECT_DEATH(takeBoth(kLow, kLow), "a lock of rank 10 is wanted while one of rank 10 is held");
  EXPECT_DEATH(takeBoth(kAboveLeaves, LockRank::leaf), "a lock of rank 100 is wanted while one of rank 101");
}

#endif

}  // namespace
}  // namespace veltrad
