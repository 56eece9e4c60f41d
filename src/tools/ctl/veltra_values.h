// Converts between values and the values of the C interface.
#pragma once

#include <memory>
#include <optional>

#include "base/value.h"
#include "veltra/veltra.h"

namespace veltrad::ctl {

struct VeltraValueRelease {
  void operator()(const veltra_value* value) const { veltra_release(value); }
};
using VeltraValue = std::unique_ptr<veltra_value, VeltraValueRelease>;

// Keys must not contain NUL.
VeltraValue toVeltraValue(const Value& value);
VeltraValue toVeltraValue(const std::optional<Dictionary>& dictionary);
// Nothing if it is not a dictionary.
std::optional<Dictionary> dictionaryOf(const veltra_value* value);

}  // namespace veltrad::ctl
