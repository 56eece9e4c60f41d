// SPDX-License-Identifier: Apache-2.0
// The form of a value in a dashboard text: texts unchanged, numbers in decimal, anything else "null".
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

#include "base/value.h"

namespace veltrad::backends {

// Refers to the text of the value, which must outlive it.
class ValueDescription {
 public:
  std::string_view text() const { return _text ? std::string_view(*_text) : std::string_view(_made); }
  // The number of Unicode characters.
  std::size_t characters() const { return _characters; }

 private:
  friend ValueDescription descriptionForObject(const Value& value);

  const std::string* _text = nullptr;
  std::string _made;
  std::size_t _characters = 0;
};

// Reals have the shortest form that reads back the same, booleans are 1 and 0.
ValueDescription descriptionForObject(const Value& value);

}  // namespace veltrad::backends
