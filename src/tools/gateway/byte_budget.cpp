// SPDX-License-Identifier: Apache-2.0
// Moves bytes between a budget and its charges.
#include "gateway/byte_budget.h"

#include <utility>

namespace veltrad::gateway {

bool ByteBudget::take(std::uint64_t bytes) {
  if (_taken.fetch_add(bytes, std::memory_order_relaxed) + bytes <= _most) return true;
  give(bytes);
  return false;
}

Charge::Charge(Charge&& other) noexcept : _budget(other._budget), _bytes(std::exchange(other._bytes, 0)) {}

bool Charge::to(std::uint64_t bytes) {
  if (bytes > _bytes && !_budget->take(bytes - _bytes)) return false;
  if (bytes < _bytes) _budget->give(_bytes - bytes);
  _bytes = bytes;
  return true;
}

}  // namespace veltrad::gateway
