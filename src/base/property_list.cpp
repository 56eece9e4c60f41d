// Tells the two forms of property lists apart. Any thread.
#include "base/property_list.h"

namespace veltrad {

Result<Value, PropertyListError> parsePropertyList(std::string_view bytes, const PropertyListLimits& limits) {
  return bytes.starts_with("bplist") ? parseBinaryPropertyList(bytes, limits)
                                     : parseXMLPropertyList(bytes, limits);
}

}  // namespace veltrad
