// Which fields of an event may leave the device, and in which form. Its owner's thread.
#pragma once

#include <cstddef>

#include "base/value.h"
#include "config/client_entry.h"

namespace veltrad::backends {

// The first record that fits a field decides; records after it are not looked at.
class FilterTable {
 public:
  // Replaces the table; an empty array leaves the earlier one in force. `filters` outlive this.
  void createFiltersFromArray(const config::Filters& filters) {
    if (filters.elements > 0) _filters = &filters;
  }
  struct Outcome {
    std::size_t removed = 0;
    std::size_t hashed = 0;
  };
  // Applies the table in place, by the event's own "_method" and "_status" (0 when missing). Linear in the
  // fields and in the records of their keys.
  Outcome filterEvent(Dictionary& event) const;

 private:
  const config::Filters* _filters = nullptr;
};

}  // namespace veltrad::backends
