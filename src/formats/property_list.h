// SPDX-License-Identifier: Apache-2.0
// Reads and writes XML property lists (document type "plist", version 1.0), and reads lists of either form.
#pragma once

#include <string>
#include <string_view>

#include "base/property_list.h"

namespace veltrad::formats {

// Reads either form, which the first bytes tell.
Result<Value, PropertyListError> parsePropertyList(std::string_view bytes,
                                                   const PropertyListLimits& limits = {});
Result<Value, PropertyListError> parseXMLPropertyList(std::string_view bytes,
                                                      const PropertyListLimits& limits = {});
// Characters that XML cannot represent become U+FFFD. Dates are rounded down to whole seconds and limited to
// the years 0 to 9999.
std::string writeXMLPropertyList(const Value& value);

}  // namespace veltrad::formats
