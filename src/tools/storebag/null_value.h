// SPDX-License-Identifier: Apache-2.0
// What is absent or unknown, as a value that JSON writes as null.
#pragma once

#include <limits>
#include <optional>

#include "base/value.h"

namespace veltrad::storebag {

inline Value unknownValue() {
  return std::numeric_limits<double>::quiet_NaN();
}

template <typename T>
Value orNull(const std::optional<T>& value) {
  return value ? Value(*value) : unknownValue();
}

}  // namespace veltrad::storebag
