// A joinable thread with a stack of a chosen size. Owned by one thread at a time.
#pragma once

#include <pthread.h>

#include <functional>

namespace veltrad {

class Thread {
 public:
  Thread() = default;
  Thread(Thread&& other) noexcept;
  Thread& operator=(Thread&& other) noexcept;  // the one replaced must have been joined
  ~Thread() { join(); }

  // Runs `body` on a new thread, all signals blocked there. False when the system gives none; `body` is then
  // gone. `name` as debuggers and `ps` show it, 15 characters at most.
  bool start(const char* name, std::size_t stackBytes, std::function<void()> body);
  void join();
  bool running() const { return _running; }

 private:
  pthread_t _thread{};
  bool _running = false;
};

// The stack of a connection's thread: room for property lists 64 levels deep and for what a call does; only
// the pages that were touched cost memory. Sanitizers make frames several times larger.
extern const std::size_t kConnectionStackBytes;

}  // namespace veltrad
