// A clock that stands still until the test moves it. Any thread.
#pragma once

#include <atomic>
#include <cstdint>

#include "platform/clock.h"

namespace veltrad {

class FakeClock final : public platform::Clock {
 public:
  explicit FakeClock(platform::TimeValue time = {1'700'000'000, 250'000}) { set(time); }

  platform::TimeValue now() const override {
    const std::int64_t time = _microseconds;
    return {time / 1'000'000, static_cast<std::int32_t>(time % 1'000'000)};
  }
  void set(platform::TimeValue time) { _microseconds = time.seconds * 1'000'000 + time.microseconds; }
  void advance(double seconds) { _microseconds += static_cast<std::int64_t>(seconds * 1'000'000); }

 private:
  std::atomic<std::int64_t> _microseconds{0};
};

}  // namespace veltrad
