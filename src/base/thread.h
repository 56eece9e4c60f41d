// SPDX-License-Identifier: Apache-2.0
// A joinable thread with a stack of a given size. The object is used by one thread at a time.
#pragma once

#include <pthread.h>

#include <functional>

namespace veltrad {

class Thread {
 public:
  Thread() = default;
  Thread(Thread&& other) noexcept;
  // The thread that is replaced must have been joined.
  Thread& operator=(Thread&& other) noexcept;
  ~Thread() { join(); }

  // Runs `body` on a new thread in which all signals are blocked. False if the system cannot start one;
  // `body` is then destroyed. `name` is shown by debuggers and `ps`; at most 15 characters.
  bool start(const char* name, std::size_t stackBytes, std::function<void()> body);
  void join();
  // In a forked child, in which the thread does not exist.
  void forget() { _running = false; }
  bool running() const { return _running; }

 private:
  pthread_t _thread{};
  bool _running = false;
};

// The stack of a connection's thread, large enough for property lists 64 levels deep. Only pages that were
// touched take memory. Sanitizers need frames several times larger.
extern const std::size_t kConnectionStackBytes;

}  // namespace veltrad
