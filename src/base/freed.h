// SPDX-License-Identifier: Apache-2.0
// Owners of what C libraries allocate.
#pragma once

#include <memory>

namespace veltrad {

template <auto Free>
struct Freed {
  template <typename T>
  void operator()(T* object) const {
    Free(object);
  }
};

// Calls `Free` for an object that is not null.
template <typename T, auto Free>
using Owned = std::unique_ptr<T, Freed<Free>>;

}  // namespace veltrad
