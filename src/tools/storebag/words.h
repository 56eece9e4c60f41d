// SPDX-License-Identifier: Apache-2.0
// Lists of names as people write them.
#pragma once

#include <cstddef>
#include <string>

namespace veltrad::storebag {

// "a, b, c"; with a last word "a, b and c".
template <typename Names>
std::string listed(const Names& names, const std::string& beforeLast = ", ") {
  std::string text;
  std::size_t left = names.size();
  for (const auto& name : names) {
    if (!text.empty()) text += left == 1 ? beforeLast : ", ";
    text += name;
    --left;
  }
  return text;
}

template <typename Names>
std::string listedWithAnd(const Names& names) {
  return listed(names, " and ");
}

}  // namespace veltrad::storebag
