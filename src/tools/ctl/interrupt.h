// Waits that the user can end. Own thread only (the one that makes it, before any other starts).
#pragma once

#include <chrono>
#include <optional>

#include "platform/file_descriptor.h"

namespace veltrad::ctl {

// Takes SIGINT and SIGTERM as an event to wait for instead of the end of the process: threads started later
// inherit that. After the first one both end the process again, so a second one always does.
class Interrupt {
 public:
  Interrupt();

  enum class Wake { ready, timeout, interrupted };
  // Until `descriptor` can be read (or has ended or failed), the time is over, or a signal has come. No time:
  // for ever. A descriptor of -1 is never ready. Once interrupted it says so always.
  Wake wait(int descriptor, std::optional<std::chrono::milliseconds> time = std::nullopt);

 private:
  platform::FileDescriptor _signals;
  bool _interrupted = false;
};

}  // namespace veltrad::ctl
