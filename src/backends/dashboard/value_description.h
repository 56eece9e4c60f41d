// How a value looks in a dashboard text: texts as they are, numbers in decimal, anything else "null". Pure;
// any thread.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

#include "base/value.h"

namespace veltrad::backends {

// Of a text it keeps a pointer only: the value must outlive it.
class ValueDescription {
 public:
  std::string_view text() const { return _text ? std::string_view(*_text) : std::string_view(_made); }
  std::size_t characters() const { return _characters; }  // of Unicode

 private:
  friend ValueDescription descriptionForObject(const Value& value);

  const std::string* _text = nullptr;
  std::string _made;
  std::size_t _characters = 0;
};

// Integers in decimal, reals in the shortest form that reads back the same, booleans 1 and 0.
ValueDescription descriptionForObject(const Value& value);

}  // namespace veltrad::backends
