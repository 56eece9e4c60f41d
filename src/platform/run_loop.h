// The main run loop: waits for SIGTERM or SIGINT. Main thread; blockSignals() before any other thread exists.
#pragma once

#include <chrono>
#include <functional>

namespace veltrad::platform {

class RunLoop {
 public:
  RunLoop();
  ~RunLoop();
  RunLoop(const RunLoop&) = delete;
  RunLoop& operator=(const RunLoop&) = delete;

  // Blocks SIGTERM, SIGINT, SIGHUP for the process (they arrive through the loop), ignores SIGPIPE and
  // SIGXFSZ.
  void blockSignals();
  // Calls `tick` every `interval`, and `hangUp` after SIGHUP, until SIGTERM, SIGINT or stop(). Returns the
  // signal's number, 0 after stop(). After it has returned, a second signal ends the process at once with
  // status 1.
  int run(std::chrono::milliseconds interval, const std::function<void()>& tick,
          const std::function<void()>& hangUp);
  // Any thread.
  void stop();

 private:
  int _signals = -1;
  int _wakeup = -1;
};

}  // namespace veltrad::platform
