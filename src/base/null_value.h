// SPDX-License-Identifier: Apache-2.0
// The value for absent or unknown data, which JSON writes as null.
#pragma once

#include <limits>

#include "base/value.h"

namespace veltrad {

inline Value nullValue() {
  return std::numeric_limits<double>::quiet_NaN();
}

// The value that the pointer refers to, or null.
template <typename T>
Value orNull(const T& value) {
  return value ? Value(*value) : nullValue();
}

}  // namespace veltrad
