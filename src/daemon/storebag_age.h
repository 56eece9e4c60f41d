// SPDX-License-Identifier: Apache-2.0
// Decides when a storebag is fetched again. All times are seconds of one clock. The owner guards it.
#pragma once

#include <cstdint>

namespace veltrad::daemon {

enum class CacheVerdict { serve, wait, fetch };

inline constexpr int kSecondsBetweenAttempts = 900;

// The result of the last attempt to fetch a storebag.
struct StorebagAge {
  bool attempted = false;
  bool fetchSuccessful = false;
  double fetchTime = 0;
  // In seconds: the max age of this attempt, and that of the last successful one; 0 if there was none.
  std::int32_t maxAge = 0;
  std::int32_t lifetime = 0;
  // In [0, 1), drawn for this attempt: where between its bounds the wait lies.
  double draw = 0;

  void ended(bool successful, std::int32_t told, double now, double drawn);
  // Seconds from its end to the next attempt. With a jitter of 0 this is the max age, or 900 after a failure.
  // With a jitter up to 1, it is up to that share of the max age shorter after a success, and up to that
  // share of the lifetime (of 900 s at least, of a day at most) longer after a failure, so that devices that
  // failed together spread out.
  double wait(double jitter) const;
};

// Serve a fresh storebag; wait if the last attempt failed a short time ago; otherwise fetch. The age is
// absolute, so a storebag also becomes old if the clock is set back.
CacheVerdict verdictOfAge(const StorebagAge& age, double now, double jitter);

}  // namespace veltrad::daemon
