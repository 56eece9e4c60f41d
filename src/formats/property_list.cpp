// SPDX-License-Identifier: Apache-2.0
// Distinguishes the two forms of property lists.
#include "formats/property_list.h"

namespace veltrad::formats {

Result<Value, PropertyListError> parsePropertyList(std::string_view bytes, const PropertyListLimits& limits) {
  return bytes.starts_with("bplist") ? parseBinaryPropertyList(bytes, limits)
                                     : parseXMLPropertyList(bytes, limits);
}

}  // namespace veltrad::formats
