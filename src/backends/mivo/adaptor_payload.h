// SPDX-License-Identifier: Apache-2.0
// A message's payload in the form that adaptors take.
#pragma once

#include <veltra/adaptor.h>

#include <deque>
#include <vector>

#include "base/value.h"

namespace veltrad::backends {

// A tree of the structures of veltra/adaptor.h. It refers to the dictionary's texts and data, so the
// dictionary must outlive it.
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

  // The values point into these. A deque does not move its elements.
  std::deque<std::vector<veltra_adaptor_value>> _items;
  std::deque<std::vector<veltra_adaptor_entry>> _entries;
  bool _present;
  veltra_adaptor_value _dictionary;
};

}  // namespace veltrad::backends
