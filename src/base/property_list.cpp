// Tells the two forms of property lists apart. Any thread.
#include "base/property_list.h"

namespace veltrad {

Result<Value, PropertyListError> parsePropertyList(std::string_view bytes, const PropertyListLimits& limits) {
  return bytes.starts_with("bplist") ? parseBinaryPropertyList(bytes, limits)
                                     : parseXMLPropertyList(bytes, limits);
}

std::size_t objectsIn(const Value& value) {
  std::size_t objects = 1;
  if (const Array* array = value.asArray()) {
    for (const Value& element : *array) objects += objectsIn(element);
  } else if (const Dictionary* dictionary = value.asDictionary()) {
    for (const auto& [key, held] : *dictionary) objects += 1 + objectsIn(held);
  }
  return objects;
}

}  // namespace veltrad
