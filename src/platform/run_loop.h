// SPDX-License-Identifier: Apache-2.0
// The main run loop: waits for SIGTERM or SIGINT. Main thread; blockSignals() before any other thread exists.
#pragma once

#include <chrono>
#include <functional>

#include "base/file_descriptor.h"

namespace veltrad::platform {

class RunLoop {
 public:
  // Blocks SIGTERM, SIGINT and SIGHUP, which then arrive through the loop, and ignores SIGPIPE and SIGXFSZ.
  void blockSignals();
  // Calls `tick` every `interval`, and `hangUp` after SIGHUP, until SIGTERM or SIGINT, whose number it
  // returns. After it has returned, a second signal ends the process at once with status 1.
  int run(std::chrono::milliseconds interval, const std::function<void()>& tick,
          const std::function<void()>& hangUp);

 private:
  FileDescriptor _signals;
};

}  // namespace veltrad::platform
