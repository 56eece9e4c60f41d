// Waits that the user can end. Own thread only; every other thread must have the signals blocked, as the
// library's do.
#pragma once

#include <chrono>
#include <optional>

#include "base/file_descriptor.h"

namespace veltrad::ctl {

// Until begin(), SIGINT and SIGTERM end the process as ever. From then on the first one ends a wait, and
// after it both end the process again.
class Interrupt {
 public:
  void begin();

  enum class Wake { ready, timeout, interrupted };
  // Until `descriptor` can be read (or has ended or failed), the time is over, or a signal has come. No time:
  // for ever. A descriptor of -1 is never ready. Once interrupted it says so always.
  Wake wait(int descriptor, std::optional<std::chrono::milliseconds> time = std::nullopt);

 private:
  FileDescriptor _signals;
  bool _interrupted = false;
};

}  // namespace veltrad::ctl
