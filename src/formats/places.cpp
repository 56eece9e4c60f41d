// SPDX-License-Identifier: Apache-2.0
// Finds the places of the keys and values of a JSON text. Any thread.
#include <algorithm>
#include <charconv>

#include "formats/json_tokens.h"
#include "formats/places.h"

namespace veltrad::formats {

namespace {

// Follows the tokens, whose places only grow.
class PlacesOfJSON {
 public:
  explicit PlacesOfJSON(std::string_view text) : _text(text), _tokens(text) {}

  Places read() {
    Places top = value(next());
    return top;
  }

 private:
  using Kind = JSONToken::Kind;

  JSONToken next() {
    JSONToken token = _tokens.next();
    while (token.kind == Kind::comment) token = _tokens.next();
    return token;
  }

  // Its depth is what the parser has accepted.
  Places value(const JSONToken& token) {
    Places places;
    places.place = placeOf(token.offset);
    if (token.kind == Kind::openObject) {
      for (JSONToken key = next(); key.kind == Kind::scalar; key = next()) {
        const TextPlace place = placeOf(key.offset);
        next();  // the colon
        places.members.push_back({textOfToken(key.text), place, value(next())});
        if (next().kind != Kind::comma) break;
      }
    } else if (token.kind == Kind::openArray) {
      for (JSONToken element = next(); element.kind != Kind::closeArray && element.kind != Kind::end;
           element = next()) {
        places.elements.push_back(value(element));
        if (next().kind != Kind::comma) break;
      }
    }
    return places;
  }

  TextPlace placeOf(std::size_t offset) {
    const TextPlace more = placeInText(_text.substr(_seen), offset - _seen);
    _place = more.line == 1 ? TextPlace{_place.line, _place.column + more.column - 1}
                            : TextPlace{_place.line + more.line - 1, more.column};
    _seen = offset;
    return _place;
  }

  const std::string_view _text;
  JSONTokens _tokens;
  // The place of the byte up to which lines and characters were counted.
  std::size_t _seen = 0;
  TextPlace _place;
};

}  // namespace

const Places::Member* Places::find(std::string_view key) const {
  const auto at = std::find_if(members.rbegin(), members.rend(),
                               [key](const Member& member) { return member.key == key; });
  return at == members.rend() ? nullptr : &*at;
}

std::optional<TextPlace> Places::at(const std::vector<std::string>& path) const {
  const Places* inside = this;
  TextPlace here = place;
  for (const std::string& step : path) {
    std::size_t number = 0;
    if (const Member* member = inside->find(step)) {
      here = member->place;
      inside = &member->value;
    } else if (std::from_chars(step.data(), step.data() + step.size(), number).ec == std::errc() &&
               number < inside->elements.size()) {
      inside = &inside->elements[number];
      here = inside->place;
    } else {
      return std::nullopt;
    }
  }
  return here;
}

Places placesInJSON(std::string_view text) {
  return PlacesOfJSON(text).read();
}

}  // namespace veltrad::formats
