// SPDX-License-Identifier: Apache-2.0
// A value's place in a storebag, as a path and as line and column.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

#include "formats/places.h"

namespace veltrad::storebag {

struct Spot {
  // "release.httppost.clients[0]"; empty at the top.
  std::string path;
  // The place of the key, or of the element's first character; if unknown, that of the enclosing value.
  TextPlace place;
  // The places inside the value; null if unknown.
  const formats::Places* inside = nullptr;

  static Spot top(const formats::Places& places) { return {"", places.place, &places}; }
  Spot key(std::string_view name) const;
  Spot element(std::size_t number) const;
};

}  // namespace veltrad::storebag
