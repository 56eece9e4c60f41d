// SPDX-License-Identifier: Apache-2.0
// What is absent or unknown, as a value that JSON writes as null.
#pragma once

#include <limits>
#include <optional>

#include "base/value.h"

namespace veltrad::tools {

inline Value nullValue() {
  return std::numeric_limits<double>::quiet_NaN();
}

template <typename T>
Value orNull(const std::optional<T>& value) {
  return value ? Value(*value) : nullValue();
}

inline Value orNull(const Value* value) {
  return value ? *value : nullValue();
}

}  // namespace veltrad::tools
