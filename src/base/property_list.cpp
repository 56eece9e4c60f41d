// SPDX-License-Identifier: Apache-2.0
// Parses the trailer of binary property lists, and counts the objects in a value.
#include "base/property_list.h"
#include "base/filled_text.h"

#include "base/property_list_binary.h"

namespace veltrad {

namespace binary_property_list {

namespace {
Failure<PropertyListError> malformed(std::string detail) {
  return Failure{PropertyListError{PropertyListError::Kind::malformed, std::move(detail)}};
}
}  // namespace

Result<Trailer, PropertyListError> parseTrailer(std::string_view bytes) {
  if (bytes.size() < kHeader.size() + 1 + 1 + kTrailerSize) {
    return malformed(filled("{} bytes are too few for a binary list", bytes.size()));
  }
  const std::uint64_t end = bytes.size() - kTrailerSize;
  const char* at = bytes.data() + end;
  const Trailer trailer{static_cast<std::uint8_t>(at[6]), static_cast<std::uint8_t>(at[7]),
                        bigEndian(at + 8, 8), bigEndian(at + 16, 8), bigEndian(at + 24, 8)};
  const auto& [offsetSize, referenceSize, count, top, table] = trailer;
  if (offsetSize < 1 || offsetSize > 8 || referenceSize < 1 || referenceSize > 8) {
    return malformed(filled("trailer: offsets of {} and references of {} bytes, 1 to 8 expected", offsetSize,
                            referenceSize));
  }
  if (table <= kHeader.size() || table >= end) {
    return malformed(filled("trailer: the table at {} lies outside the {} bytes before it", table, end));
  }
  if (count == 0 || count > (end - table) / offsetSize) {
    return malformed(filled("trailer: {} objects in a table of {} bytes", count, end - table));
  }
  if (top >= count) return malformed(filled("trailer: object {} is the top of {} objects", top, count));
  return trailer;
}

}  // namespace binary_property_list

std::string PropertyListError::description() const {
  return place ? "line " + std::to_string(place->line) + ": " + detail : detail;
}

std::optional<std::uint64_t> declaredObjects(std::string_view bytes) {
  using namespace binary_property_list;
  if (!bytes.starts_with(kHeader) || bytes.size() < kHeader.size() + kTrailerSize) return std::nullopt;
  return bigEndian(bytes.data() + bytes.size() - kTrailerSize + 8, 8);
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
