// SPDX-License-Identifier: Apache-2.0
// When a storebag is asked for again. Values in, verdicts out: all times are seconds of one clock. The owner
// guards it.
#pragma once

#include <cstdint>

namespace veltrad::daemon {

enum class CacheVerdict { serve, wait, fetch };

inline constexpr int kSecondsBetweenAttempts = 900;

// How the last attempt to fetch a storebag has ended.
struct StorebagAge {
  bool attempted = false;
  bool fetchSuccessful = false;
  double fetchTime = 0;
  // In seconds: what this attempt was told, and what the last successful one was told; 0: there was none.
  std::int32_t maxAge = 0;
  std::int32_t lifetime = 0;
  // In [0, 1), drawn for this attempt: where between its bounds the wait lies.
  double draw = 0;

  void ended(bool successful, std::int32_t told, double now, double drawn);
  // Seconds from its end to the next attempt. With a jitter of 0 the max age, or 900 after a failure. With
  // one up to 1, a success is followed up to that share of its max age sooner, and a failure up to that share
  // of the lifetime later (of 900 s at least, of a day at most): what failed together does not come back
  // together.
  double wait(double jitter) const;
};

// Serve a fresh storebag; wait if the last attempt failed a short time ago; otherwise fetch. The age is
// absolute, so a storebag also becomes old if the clock is set back.
CacheVerdict verdictOfAge(const StorebagAge& age, double now, double jitter);

}  // namespace veltrad::daemon
