// SPDX-License-Identifier: Apache-2.0
// Compares the effect of two entries' filters on each field.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "base/value.h"
#include "config/client_entry.h"
#include "storebag/change.h"

namespace veltrad::storebag {

// The change for a field, in the events with the worst change.
struct FieldChange {
  // As it is written.
  std::string name;
  Effect effect;
  // "remove", "sha256" or "keep"; nothing: no filter decides.
  std::optional<Value> before;
  std::optional<Value> now;
  // "is no longer hashed"
  std::string phrase;
  // Which events: " in events of method 5"; empty: all.
  std::string events;
};

std::vector<FieldChange> changedFields(const config::Filters& before, const config::Filters& now);

}  // namespace veltrad::storebag
