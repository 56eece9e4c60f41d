// SPDX-License-Identifier: Apache-2.0
// Where the parts of a text stand that is read into a value.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/text.h"

namespace veltrad::formats {

// Of a value and all that is in it.
struct Places {
  struct Member;

  // Of the value's first character.
  TextPlace place;
  // Of a dictionary, in the order of the text; with each of equal keys, and with JSON keys whose value is
  // null.
  std::vector<Member> members;
  // Of an array.
  std::vector<Places> elements;

  // The member that counts: of equal keys the last. Null if there is none.
  const Member* find(std::string_view key) const;
  // Of the key or the element of an array that `path` leads to: keys, and numbers of elements from 0 in
  // decimal. Nothing: it is not there.
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
