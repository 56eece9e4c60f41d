// SPDX-License-Identifier: Apache-2.0
// The system's real-time clock.
#include "platform/clock.h"

#include <time.h>

namespace veltrad::platform {

double timevalToSeconds(TimeValue time) {
  return static_cast<double>(time.seconds) + static_cast<double>(time.microseconds) / 1'000'000;
}

TimeValue SystemClock::now() const {
  timespec time{};
  ::clock_gettime(CLOCK_REALTIME, &time);
  return {time.tv_sec, static_cast<std::int32_t>(time.tv_nsec / 1'000)};
}

}  // namespace veltrad::platform
