// SPDX-License-Identifier: Apache-2.0
// Takes two locks in the order of their ranks; with WRONG_ORDER defined, in the other one, and must not
// compile.
#include "daemon/lock_ranks.h"
#include "session/lock_ranks.h"

namespace {

struct Cache {
  veltrad::Mutex lock STOREBAG_CACHE_LOCK;
};
struct Families {
  veltrad::Mutex lock FAMILIES_LOCK;
};
struct Session {
  veltrad::Mutex lock SESSION_LOCK;
};
struct Leaf {
  veltrad::Mutex lock LEAF_LOCK{veltrad::LockRank::leaf};
};

}  // namespace

#ifndef WRONG_ORDER
void inOrder(Cache& cache, Families& families, Session& session, Leaf& leaf) {
  const veltrad::Lock first(cache.lock);
  const veltrad::Lock second(families.lock);
  const veltrad::Lock third(session.lock);
  const veltrad::Lock fourth(leaf.lock);
}
#elif WRONG_ORDER == 1
void familiesThenCache(Cache& cache, Families& families) {
  const veltrad::Lock first(families.lock);
  const veltrad::Lock second(cache.lock);
}
#else
void leafThenSession(Session& session, Leaf& leaf) {
  const veltrad::Lock first(leaf.lock);
  const veltrad::Lock second(session.lock);
}
#endif
