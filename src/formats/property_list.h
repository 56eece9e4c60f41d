// XML property lists (document type "plist" version 1.0), both directions, and lists of either form. Pure
// functions from bytes to values and back.
#pragma once

#include <string>
#include <string_view>

#include "base/property_list.h"

namespace veltrad::formats {

// Either form, told apart by the first bytes.
Result<Value, PropertyListError> parsePropertyList(std::string_view bytes,
                                                   const PropertyListLimits& limits = {});
Result<Value, PropertyListError> parseXMLPropertyList(std::string_view bytes,
                                                      const PropertyListLimits& limits = {});
// Characters that XML cannot hold become U+FFFD; dates are rounded down to whole seconds and kept within the
// years 0 to 9999.
std::string writeXMLPropertyList(const Value& value);

}  // namespace veltrad::formats
