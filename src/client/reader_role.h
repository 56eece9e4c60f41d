// SPDX-License-Identifier: Apache-2.0
// Assigns the reading of a connection's socket to one thread at a time. Used under its connection's lock.
#pragma once

#include <vector>

#include "client/call_table.h"

namespace veltrad::client {

// One thread at a time reads. A thread that waits for its own answer reads itself if nobody does, which makes
// such a call as fast as an exchange on the bare socket. The other waiting threads block here until they have
// their answers or get the role. If no thread waits, the connection's thread reads.
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
  // False if no thread is blocked here.
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
