// SPDX-License-Identifier: Apache-2.0
// The line and column of each part of a parsed text.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/text.h"

namespace veltrad::formats {

// The places of a value and all its parts.
struct Places {
  struct Member;

  // The place of the value's first character.
  TextPlace place;
  // The members of a dictionary, in the order of the text; includes each of equal keys, and JSON keys with
  // the value null.
  std::vector<Member> members;
  // The elements of an array.
  std::vector<Places> elements;

  // The member with this key, the last of equal keys; null if there is none.
  const Member* find(std::string_view key) const;
  // The place of the key or array element at `path`: keys, and indices from 0 in decimal. Absent if it does
  // not exist.
  std::optional<TextPlace> at(const std::vector<std::string>& path) const;
};
struct Places::Member {
  std::string key;
  TextPlace place;
  Places value;
};

// `text` is one that parseJSONWithComments takes.
Places placesInJSON(std::string_view text);
// `bytes` are those of a list that parseXMLPropertyList takes.
Places placesInXMLPropertyList(std::string_view bytes);

}  // namespace veltrad::formats
