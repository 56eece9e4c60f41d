// SPDX-License-Identifier: Apache-2.0
// The run-time check of the lock order: each thread keeps a list of the ranks that it holds.
#include "base/mutex.h"

#include <cstdio>
#include <cstdlib>

namespace veltrad::lock_order {

namespace {
constexpr int kMostHeld = 32;
struct Held {
  int ranks[kMostHeld];
  int count = 0;
};
thread_local Held held;
}  // namespace

void taking(LockRank rank) {
  const int wanted = static_cast<int>(rank);
  int highest = 0;
  for (int i = 0; i < held.count; ++i) {
    if (held.ranks[i] > highest) highest = held.ranks[i];
  }
  if (wanted <= highest || held.count == kMostHeld) {
    std::fprintf(stderr, "lock order: a lock of rank %d is wanted while one of rank %d is held\n", wanted,
                 highest);
    std::abort();
  }
  held.ranks[held.count++] = wanted;
}

void released(LockRank rank) {
  for (int i = held.count - 1; i >= 0; --i) {
    if (held.ranks[i] != static_cast<int>(rank)) continue;
    for (int j = i + 1; j < held.count; ++j) held.ranks[j - 1] = held.ranks[j];
    --held.count;
    return;
  }
}

}  // namespace veltrad::lock_order
