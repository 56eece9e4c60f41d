// A message's payload as an adaptor sees it. A plain value; the thread that made it.
#pragma once

#include <veltra/adaptor.h>

#include <deque>
#include <vector>

#include "base/value.h"

namespace veltrad::backends {

// A tree of the plain structures of veltra/adaptor.h. Texts and data stay the dictionary's, which outlives
// it.
class AdaptorPayload {
 public:
  explicit AdaptorPayload(const Dictionary* payload);
  AdaptorPayload(const AdaptorPayload&) = delete;
  AdaptorPayload& operator=(const AdaptorPayload&) = delete;

  const veltra_adaptor_value* dictionary() const { return _present ? &_dictionary : nullptr; }

 private:
  veltra_adaptor_value valueOf(const Value& value);
  veltra_adaptor_value valueOf(const Array& array);
  veltra_adaptor_value valueOf(const Dictionary& dictionary);

  // What values point at: a deque does not move its elements.
  std::deque<std::vector<veltra_adaptor_value>> _items;
  std::deque<std::vector<veltra_adaptor_entry>> _entries;
  bool _present;
  veltra_adaptor_value _dictionary;
};

}  // namespace veltrad::backends
