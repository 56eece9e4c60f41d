// SPDX-License-Identifier: Apache-2.0
// The time of day.
#pragma once

#include <cstdint>

namespace veltrad::platform {

// Since 1970-01-01 00:00:00 UTC.
struct TimeValue {
  std::int64_t seconds = 0;
  // 0 to 999,999
  std::int32_t microseconds = 0;
  bool operator==(const TimeValue&) const = default;
};

// Seconds since 1970, with fraction.
double timevalToSeconds(TimeValue time);

class Clock {
 public:
  virtual ~Clock() = default;
  virtual TimeValue now() const = 0;
};

class SystemClock final : public Clock {
 public:
  TimeValue now() const override;
};

}  // namespace veltrad::platform
