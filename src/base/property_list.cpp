// The number of objects in a property list, as declared and as counted.
#include "base/property_list.h"

#include "base/property_list_binary.h"

namespace veltrad {

std::string PropertyListError::description() const {
  return place ? "line " + std::to_string(place->line) + ": " + detail : detail;
}

std::optional<std::uint64_t> declaredObjects(std::string_view bytes) {
  using namespace binary_property_list;
  if (!bytes.starts_with(kHeader) || bytes.size() < kHeader.size() + kTrailerSize) return std::nullopt;
  std::uint64_t count = 0;
  for (const char c : bytes.substr(bytes.size() - kTrailerSize + 8, 8)) {
    count = count << 8 | static_cast<unsigned char>(c);
  }
  return count;
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
