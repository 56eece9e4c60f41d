// SPDX-License-Identifier: Apache-2.0
// Puts the envelope around events.
#include "backends/https/json_message.h"

#include <utility>

#include "backends/https/json_fields.h"
#include "formats/json.h"

namespace veltrad::backends {

PostText::PostText(double postTime, const std::string& clientID, std::vector<std::string> events)
    : _begin("{\"clientId\":" + formats::writeJSON(clientID) + ",\"events\":["),
      _events(std::move(events)),
      _end("],\"postTime\":" + formats::writeJSON(finiteOrMinusOne(postTime)) + "}"),
      _size(_begin.size() + _end.size()) {
  for (const std::string& event : _events) _size += event.size();
  if (!_events.empty()) _size += _events.size() - 1;
}

std::vector<std::string_view> PostText::pieces() const {
  std::vector<std::string_view> pieces{_begin};
  pieces.reserve(2 * _events.size() + 2);
  for (const std::string& event : _events) {
    if (pieces.size() > 1) pieces.emplace_back(",");
    pieces.emplace_back(event);
  }
  pieces.emplace_back(_end);
  return pieces;
}

std::string PostText::joined() const {
  std::string text;
  text.reserve(_size);
  for (const std::string_view piece : pieces()) text.append(piece);
  return text;
}

std::string PostText::readable() const {
  std::string text;
  text.reserve(_size + _size / 2);
  formats::JSONIndenter indenter(text);
  for (const std::string_view piece : pieces()) indenter.add(piece);
  return text;
}

}  // namespace veltrad::backends
