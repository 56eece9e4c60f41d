// SPDX-License-Identifier: Apache-2.0
// Waits that the user can interrupt. Used by one thread; all others must block the signals, as the library's
// do.
#pragma once

#include <chrono>
#include <optional>

#include "base/file_descriptor.h"

namespace veltrad::ctl {

// Before begin(), SIGINT and SIGTERM end the process. After begin(), the first signal ends the wait, and
// further ones end the process.
class Interrupt {
 public:
  void begin();

  enum class Wake { ready, timeout, interrupted };
  // Waits until `descriptor` can be read (or has ended or failed), the time has passed, or a signal arrives.
  // Without a time waits forever. A descriptor of -1 is never ready. After an interruption always returns
  // `interrupted`.
  Wake wait(int descriptor, std::optional<std::chrono::milliseconds> time = std::nullopt);

 private:
  FileDescriptor _signals;
  bool _interrupted = false;
};

}  // namespace veltrad::ctl
