// SPDX-License-Identifier: Apache-2.0
// Rows of keys whose value is one of a few texts.
#pragma once

#include "config/key_table.h"

namespace veltrad::config {

// `choices`: as in Key.
template <auto Member>
constexpr auto choiceRow(const char* name, const char* choices, const char* byDefault, const char* meaning) {
  auto made = row<Member>({name, KeyType::choice, kUnbounded, Need::optional, byDefault, meaning});
  made.key.choices = choices;
  return made;
}

}  // namespace veltrad::config
