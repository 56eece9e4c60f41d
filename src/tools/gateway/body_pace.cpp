// SPDX-License-Identifier: Apache-2.0
// Counts a body's time.
#include "gateway/body_pace.h"

#include <algorithm>

namespace veltrad::gateway {

void BodyPace::passed(Duration waited, std::size_t bytes) {
  const auto earned = Duration(std::chrono::seconds(1)) * static_cast<Duration::rep>(bytes) /
                      static_cast<Duration::rep>(kLeastASecond);
  _left = std::min(_most, std::max(_left - waited, Duration::zero()) + earned);
}

}  // namespace veltrad::gateway
