// SPDX-License-Identifier: Apache-2.0
// Which thread reads a connection's socket. Used under its connection's lock.
#pragma once

#include <vector>

#include "client/call_table.h"

namespace veltrad::client {

// One thread at a time reads. A thread that waits for its own answer reads itself if nobody does, which makes
// such a call as fast as an exchange on the bare socket; the others park here until they have their answers
// or the role is passed to them. If nobody waits, the connection's thread reads.
class ReaderRole {
 public:
  enum class Holder { nobody, waiter, ownThread };

  Holder holder() const { return _holder; }
  bool take(Holder by) {
    if (_holder != Holder::nobody) return false;
    _holder = by;
    return true;
  }
  void release() { _holder = Holder::nobody; }

  void park(Waiter& waiter) { _parked.push_back(&waiter); }
  void unpark(Waiter& waiter) { std::erase(_parked, &waiter); }
  // False if nobody is parked.
  bool wakeOne() {
    if (_parked.empty()) return false;
    _parked.front()->changed.notifyOne();
    return true;
  }
  void wakeAll() {
    for (Waiter* waiter : _parked) waiter->changed.notifyOne();
  }

 private:
  Holder _holder = Holder::nobody;
  std::vector<Waiter*> _parked;
};

}  // namespace veltrad::client
