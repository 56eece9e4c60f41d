// SPDX-License-Identifier: Apache-2.0
// Computes the wait for a storebag and compares it with the age.
#include "daemon/storebag_age.h"

#include <algorithm>
#include <cmath>

namespace veltrad::daemon {

namespace {
// In seconds. Servers may state longer lifetimes than a storebag, which a device should not wait out for a
// server that is back.
constexpr std::int32_t kLongestSpread = 86'400;
}  // namespace

void StorebagAge::ended(bool successful, std::int32_t told, double now, double drawn) {
  attempted = true;
  fetchSuccessful = successful;
  fetchTime = now;
  maxAge = told;
  if (successful) lifetime = told;
  draw = drawn;
}

double StorebagAge::wait(double jitter) const {
  if (fetchSuccessful) return maxAge * (1 - jitter * draw);
  const int spread = std::clamp(lifetime, kSecondsBetweenAttempts, kLongestSpread);
  return kSecondsBetweenAttempts + jitter * draw * spread;
}

CacheVerdict verdictOfAge(const StorebagAge& age, double now, double jitter) {
  if (!age.attempted) return CacheVerdict::fetch;
  if (std::abs(now - age.fetchTime) >= age.wait(jitter)) return CacheVerdict::fetch;
  return age.fetchSuccessful ? CacheVerdict::serve : CacheVerdict::wait;
}

}  // namespace veltrad::daemon
