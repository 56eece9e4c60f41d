// SPDX-License-Identifier: Apache-2.0
// The error of a failed attempt of the drain to store something.
#pragma once

#include <string>
#include <utility>

#include "base/result.h"

namespace veltrad::gateway {

struct StoreError {
  // data: it can never be stored as it is. passing: it can be stored later, or over another connection.
  enum class Kind { data, passing };
  Kind kind;
  // One line.
  std::string detail;
};

inline Failure<StoreError> dataFailure(std::string detail) {
  return Failure{StoreError{StoreError::Kind::data, std::move(detail)}};
}
inline Failure<StoreError> passingFailure(std::string detail) {
  return Failure{StoreError{StoreError::Kind::passing, std::move(detail)}};
}

}  // namespace veltrad::gateway
