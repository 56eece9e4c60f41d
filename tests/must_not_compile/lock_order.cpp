// Takes two locks in the order of their ranks; with WRONG_ORDER defined, in the other one, and must not
// compile.
#include "base/mutex.h"

namespace {

struct Agent {
  veltrad::Mutex lock AGENT_LOCK{veltrad::LockRank::agent};
};
struct Session {
  veltrad::Mutex lock SESSION_LOCK{veltrad::LockRank::session};
};
struct Leaf {
  veltrad::Mutex lock LEAF_LOCK{veltrad::LockRank::leaf};
};

}  // namespace

#ifndef WRONG_ORDER
void inOrder(Agent& agent, Session& session, Leaf& leaf) {
  const veltrad::Lock first(agent.lock);
  const veltrad::Lock second(session.lock);
  const veltrad::Lock third(leaf.lock);
}
#elif WRONG_ORDER == 1
void sessionThenAgent(Agent& agent, Session& session) {
  const veltrad::Lock first(session.lock);
  const veltrad::Lock second(agent.lock);
}
#else
void leafThenAgent(Agent& agent, Leaf& leaf) {
  const veltrad::Lock first(leaf.lock);
  const veltrad::Lock second(agent.lock);
}
#endif
