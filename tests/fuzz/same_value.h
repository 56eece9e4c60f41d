// SPDX-License-Identifier: Apache-2.0
// Equality for round trips: as Value's, but not-a-number equals itself. Any thread.
#pragma once

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "base/value.h"

namespace veltrad::fuzz {

inline bool same(double a, double b) {
  return a == b || (std::isnan(a) && std::isnan(b));
}

inline bool same(const Value& a, const Value& b) {
  if (a.asReal() && b.asReal()) return same(*a.asReal(), *b.asReal());
  if (a.asDate() && b.asDate()) return same(a.asDate()->secondsSince1970, b.asDate()->secondsSince1970);
  const auto sameValues = [](const Value& x, const Value& y) { return same(x, y); };
  const auto sameEntries = [](const auto& x, const auto& y) {
    return x.first == y.first && same(x.second, y.second);
  };
  if (a.asArray() && b.asArray()) return std::ranges::equal(*a.asArray(), *b.asArray(), sameValues);
  if (a.asDictionary() && b.asDictionary())
    return std::ranges::equal(*a.asDictionary(), *b.asDictionary(), sameEntries);
  return a == b;
}

// Ends the program unless the written text is read back as the same value.
template <typename Read>
void mustBe(const Value& value, const Read& again) {
  if (!again.ok() || !same(value, again.value())) std::abort();
}

}  // namespace veltrad::fuzz
