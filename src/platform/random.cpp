// SPDX-License-Identifier: Apache-2.0
// The 48-bit linear congruential sequence, starting from zero.
#include "platform/random.h"

#include <stdlib.h>

namespace veltrad::platform {

double UnseededSequence::uniform() {
  Lock lock(_mutex);
  return ::erand48(_state);
}

}  // namespace veltrad::platform
