// SPDX-License-Identifier: Apache-2.0
// Lets what finds no memory fail alone.
#pragma once

#include <new>

namespace veltrad::gateway {

// False: there was no memory for the step, which has ended where it wanted some.
template <typename Step>
bool attempt(const Step& step) {
  try {
    step();
    return true;
  } catch (const std::bad_alloc&) {
    return false;
  }
}

}  // namespace veltrad::gateway
