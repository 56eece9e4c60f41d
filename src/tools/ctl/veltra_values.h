// Between the system's values and those of the C interface. Pure; any thread.
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

// Keys end at their first NUL: the caller has refused those that hold one.
VeltraValue toVeltraValue(const Value& value);
// Null for nothing.
VeltraValue toVeltraValue(const std::optional<Dictionary>& dictionary);
// Nothing for NULL and for anything else than a dictionary.
std::optional<Dictionary> dictionaryOf(const veltra_value* value);

}  // namespace veltrad::ctl
