// Takes two locks in the order of their ranks; with WRONG_ORDER defined, in the other one, and must not
// compile.
#include "base/mutex.h"

namespace {

struct Families {
  veltrad::Mutex lock FAMILIES_LOCK{veltrad::LockRank::families};
};
struct Session {
  veltrad::Mutex lock SESSION_LOCK{veltrad::LockRank::session};
};
struct Leaf {
  veltrad::Mutex lock LEAF_LOCK{veltrad::LockRank::leaf};
};

}  // namespace

#ifndef WRONG_ORDER
void inOrder(Families& families, Session& session, Leaf& leaf) {
  const veltrad::Lock first(families.lock);
  const veltrad::Lock second(session.lock);
  const veltrad::Lock third(leaf.lock);
}
#elif WRONG_ORDER == 1
void sessionThenFamilies(Families& families, Session& session) {
  const veltrad::Lock first(session.lock);
  const veltrad::Lock second(families.lock);
}
#else
void leafThenFamilies(Families& families, Leaf& leaf) {
  const veltrad::Lock first(leaf.lock);
  const veltrad::Lock second(families.lock);
}
#endif
