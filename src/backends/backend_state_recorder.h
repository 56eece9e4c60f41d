// SPDX-License-Identifier: Apache-2.0
// Writes the state of a back end into the record of fates. The session's thread.
#pragma once

#include <cstdint>

#include "platform/fate_writer.h"

namespace veltrad::backends {

// One entry serves many messages, until the back end's state changes, or until the entry is so old that it
// would be overwritten before the entries that refer to it.
class BackendStateRecorder {
 public:
  wire::FateRef of(const platform::FateWriter& pen, const wire::StandingEntry& now) {
    if (!pen.writes()) return 0;
    const wire::FateWords words = wire::wordsOf(now);
    if (words != _last || !pen.ring()->fresh(_position)) {
      _last = words;
      _position = pen.ring()->write(now);
    }
    return platform::FateRing::refTo(_position);
  }

 private:
  std::uint64_t _position = 0;  // 0: nowhere
  wire::FateWords _last{};
};

}  // namespace veltrad::backends
