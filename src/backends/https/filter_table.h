// Which fields of an event may leave the device, and in which form. Its owner's thread.
#pragma once

#include <cstdint>
#include <string>
#include <unordered_map>
#include <vector>

#include "base/value.h"

namespace veltrad::backends {

// One element of a client entry's "filters".
struct filterTag {
  std::int32_t method = -1;  // negative: every method
  std::int32_t status = -1;  // negative: every status
  std::int32_t action = 0;   // 0 keep, 1 remove, 2 replace by the SHA-256 digest
  std::string key;           // letter case is ignored
};

// The first record that fits a field decides; records after it are not looked at.
class FilterTable {
 public:
  // Replaces the table; an empty array leaves the earlier one in force. An element without "key" fits
  // nothing.
  void createFiltersFromArray(const Array& filters);
  struct Outcome {
    std::size_t removed = 0;
    std::size_t hashed = 0;
  };
  // Applies the table in place, by the event's own "_method" and "_status" (0 when missing). Linear in the
  // fields and in the records of their keys.
  Outcome filterEvent(Dictionary& event) const;

  std::size_t numberOfFilters() const { return _filters.size(); }

 private:
  const filterTag* match(const std::string& key, std::int32_t method, std::int32_t status) const;

  std::vector<filterTag> _filters;
  // Lower-cased key to its records, in order.
  std::unordered_map<std::string, std::vector<std::size_t>> _recordsOfKey;
};

}  // namespace veltrad::backends
