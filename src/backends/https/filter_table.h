// SPDX-License-Identifier: Apache-2.0
// Decides which fields of an event may leave the device, and in which form.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/value.h"
#include "config/client_entry.h"
#include "config/field_changes.h"

namespace veltrad::backends {

// The first record that matches a field decides.
class FilterTable {
 public:
  // Replaces the filters, unless the array is empty. `filters` must outlive this object.
  void createFiltersFromArray(const config::Filters& filters) {
    if (filters.elements > 0) _filters = &filters;
  }
  struct Outcome {
    std::size_t removed = 0;
    std::size_t hashed = 0;
  };
  // Whether a filter names the field.
  bool concerns(const std::string& name) const;
  // Filters the event in place by its own "_method" and "_status" (0 if missing). Reports the names to
  // `changes`.
  Outcome filterEvent(Dictionary& event, config::FieldChanges& changes) const;
  // True if every field is kept.
  bool empty() const { return !_filters || _filters->ofKey.empty(); }
  // The action on a field of an event with this method and status. The table must not be empty.
  config::FilterAction actionOn(std::string_view key, std::int32_t method, std::int32_t status) const;
  // The digest of a text, or of the JSON text of a number or boolean. Nothing for other values, which are
  // then removed, because a field that is to be hashed must never leave in clear.
  static std::optional<std::string> digestOf(const Value& value);
  // The same filters.
  bool operator==(const FilterTable&) const = default;

 private:
  const config::Filters* _filters = nullptr;
};

}  // namespace veltrad::backends
