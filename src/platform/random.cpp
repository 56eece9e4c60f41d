// SPDX-License-Identifier: Apache-2.0
// The 48-bit linear congruential sequence, starting from zero.
#include "platform/random.h"

#include <stdlib.h>

#include "platform/uuid.h"

namespace veltrad::platform {

double UnseededSequence::uniform() {
  Lock lock(_mutex);
  return ::erand48(_state);
}

double kernelUniform() {
  const auto bytes = randomUUID();
  const unsigned number = bytes[0] | unsigned{bytes[1]} << 8 | unsigned{bytes[2]} << 16;
  return number / double{1u << 24};
}

}  // namespace veltrad::platform
