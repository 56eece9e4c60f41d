// SPDX-License-Identifier: Apache-2.0
// What is absent or not known, as a value that JSON writes as null.
#pragma once

#include <limits>

#include "base/value.h"

namespace veltrad {

inline Value nullValue() {
  return std::numeric_limits<double>::quiet_NaN();
}

// What it points to, or null.
template <typename T>
Value orNull(const T& value) {
  return value ? Value(*value) : nullValue();
}

}  // namespace veltrad
