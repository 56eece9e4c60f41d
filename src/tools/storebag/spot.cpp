// SPDX-License-Identifier: Apache-2.0
// Descends into dictionaries and arrays.
#include "storebag/spot.h"

#include <fmt/format.h>

namespace veltrad::storebag {

Spot Spot::key(std::string_view name) const {
  Spot spot{path.empty() ? std::string(name) : fmt::format("{}.{}", path, name), place};
  const formats::Places::Member* member = inside ? inside->find(name) : nullptr;
  if (member == nullptr) return spot;
  spot.place = member->place;
  spot.inside = &member->value;
  return spot;
}

Spot Spot::element(std::size_t number) const {
  Spot spot{fmt::format("{}[{}]", path, number), place};
  if (inside == nullptr || number >= inside->elements.size()) return spot;
  spot.inside = &inside->elements[number];
  spot.place = spot.inside->place;
  return spot;
}

}  // namespace veltrad::storebag
